#include "tally-storebag/ValueLint.h"

#include <arpa/inet.h>
#include <curl/curl.h>
#include <fmt/format.h>

#include <charconv>
#include <cmath>
#include <limits>
#include <memory>

namespace tallyd::storebagtool {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::string_view kBlanks = " \t\r\n";

std::string_view trimmed(std::string_view text) {
  const auto first = text.find_first_not_of(kBlanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

std::string_view kindOf(const Value& value) {
  if (value.isString()) return "string";
  if (value.isBoolean()) return "boolean";
  if (value.isNumber()) return "number";
  if (value.array()) return "array";
  if (value.dictionary()) return "dictionary";
  if (value.date()) return "date";
  return value.data() ? "data" : "null";
}

std::string withArticle(std::string_view noun) {
  constexpr std::string_view kVowels = "aeiou";
  return fmt::format("{} {}", kVowels.find(noun.front()) == std::string_view::npos ? "a" : "an", noun);
}

bool isOfKind(const Value& value, KeyKind kind) {
  switch (kind) {
    case KeyKind::Text:
      return value.isString();
    case KeyKind::Integer:
    case KeyKind::Real:
      return value.isNumber() || value.isString();  // Numbers are strings in ASCII property lists.
    case KeyKind::TextList:
    case KeyKind::DictionaryList:
      return value.array() != nullptr;
    case KeyKind::Dictionary:
      return value.dictionary() != nullptr;
  }
  return false;
}

bool isNumberText(std::string_view text) {
  double number = 0;
  const auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number);
  return error == std::errc() && end == text.data() + text.size() && std::isfinite(number);
}

void lintNumber(const Value& value, KeyKind kind, const std::string& path, Findings& findings) {
  const double number = value.realValue().value_or(0);
  if (const auto text = value.string(); text && !isNumberText(*text)) {
    findings.push_back({Severity::Error, path, fmt::format("\"{}\" is not a number", *text),
                        fmt::format("reads as {}", number)});
    return;
  }
  if (!std::isfinite(number)) {
    findings.push_back({Severity::Error, path, "is not a finite number", "compares with no other number"});
    return;
  }
  if (kind != KeyKind::Integer) return;
  const std::int64_t whole = value.integerValue().value_or(0);
  const auto cut = static_cast<std::int32_t>(whole);
  if (cut != whole) {
    findings.push_back({Severity::Error, path, fmt::format("{} does not fit 32 bits", whole),
                        fmt::format("reads as {}", cut)});
  } else if (number != std::trunc(number)) {
    findings.push_back({Severity::Warning, path, fmt::format("{} is not an integer", number),
                        fmt::format("reads as {}", whole)});
  }
}

void lintUnknownKey(std::string_view key, Place place, const std::string& path, Findings& findings) {
  std::string text = fmt::format("nobody reads the key \"{}\" here", key);
  if (hasBlanksAround(key) && knownKey(place, trimmed(key))) {
    text += fmt::format("; there are blanks around \"{}\"", trimmed(key));
  } else if (const auto near = nearestName(key, keysOf(place)); !near.empty()) {
    text += fmt::format("; did you mean \"{}\"?", near);
  }
  const bool makesBackend = place == Place::Section;
  findings.push_back({makesBackend ? Severity::Error : Severity::Warning, pathOf(path, key), std::move(text),
                      makesBackend ? "no backend is made of it, and each session logs an error" : "ignored"});
}

void lintKnownValue(const KnownKey& row, const Value& value, const std::string& path, Findings& findings) {
  if (isOfKind(value, row.kind)) {
    if (row.kind == KeyKind::Integer || row.kind == KeyKind::Real)
      lintNumber(value, row.kind, path, findings);
    return;
  }
  findings.push_back({Severity::Error, path,
                      fmt::format("is {}, not {}", withArticle(kindOf(value)), withArticle(nameOf(row.kind))),
                      fmt::format("as if it were missing: {}", row.whenMissing)});
}

bool isWebScheme(std::string_view scheme) { return scheme == "https" || scheme == "http"; }

struct URLParts {
  std::string error;
  std::string scheme;
};

URLParts urlParts(const std::string& text) {
  const std::unique_ptr<CURLU, decltype(&curl_url_cleanup)> url(curl_url(), curl_url_cleanup);
  if (!url) return {"can't be looked at", ""};
  const CURLUcode code = curl_url_set(url.get(), CURLUPART_URL, text.c_str(), CURLU_NON_SUPPORT_SCHEME);
  if (code != CURLUE_OK) return {curl_url_strerror(code), ""};
  char* scheme = nullptr;
  if (curl_url_get(url.get(), CURLUPART_SCHEME, &scheme, 0) != CURLUE_OK) return {"has no scheme", ""};
  const std::unique_ptr<char, decltype(&curl_free)> owner(scheme, curl_free);
  return {"", scheme};
}

}  // namespace

void lintKeys(const Dictionary& dictionary, Place place, const std::string& path, Findings& findings) {
  for (const auto& [key, value] : dictionary) {
    if (const KnownKey* row = knownKey(place, key)) {
      lintKnownValue(*row, value, pathOf(path, key), findings);
    } else {
      lintUnknownKey(key, place, path, findings);
    }
  }
  for (const KnownKey& row : knownKeys()) {
    if (row.place != place || row.presence == Presence::Optional || dictionary.contains(row.key)) continue;
    findings.push_back({row.presence == Presence::Required ? Severity::Error : Severity::Warning,
                        pathOf(path, row.key), "is missing", std::string(row.whenMissing)});
  }
}

void lintURL(const Dictionary& dictionary, std::string_view key, const std::string& path,
             Findings& findings) {
  const auto text = dictionary.string(key);
  if (!text) return;
  const std::string place = pathOf(path, key);
  const auto [error, scheme] = urlParts(std::string(*text));
  if (!error.empty()) {
    findings.push_back({Severity::Error, place, fmt::format("\"{}\" is no URL: {}", *text, error),
                        "every request to it fails"});
  } else if (!isWebScheme(scheme)) {
    findings.push_back({Severity::Error, place, fmt::format("the scheme is {}, not https", scheme),
                        "every request to it fails"});
  } else if (scheme == "http") {
    findings.push_back({Severity::Warning, place, "the scheme is http, not https",
                        "everything can be read and changed on its way"});
  }
}

void lintAddress(std::string_view address, const std::string& path, Findings& findings) {
  const std::string text(address);
  in_addr parsed{};
  if (::inet_pton(AF_INET, text.c_str(), &parsed) != 1) {
    const in_addr_t loose = ::inet_addr(text.c_str());
    const bool isRead = loose != INADDR_NONE;
    findings.push_back(
        {isRead ? Severity::Warning : Severity::Error, path,
         fmt::format("\"{}\" is not four decimal numbers with points", text),
         isRead ? fmt::format("reads as {}", ::inet_ntoa({loose})) : "no dashboard backend is made"});
    return;
  }
  const std::uint32_t number = ntohl(parsed.s_addr);
  if (number == INADDR_BROADCAST) {
    findings.push_back({Severity::Error, path, "is the broadcast address", "no dashboard backend is made"});
  } else if (number == INADDR_ANY || number >> 24 == IN_LOOPBACKNET) {
    findings.push_back({Severity::Warning, path, "is the device itself", "no datagram leaves the device"});
  }
}

void lintTexts(const std::vector<std::string>& texts, Matching matching, const std::string& path,
               Findings& findings) {
  for (const std::string& text : texts) {
    if (text.empty()) {
      findings.push_back({Severity::Warning, path, "holds an empty text", "matches nothing"});
    } else if (hasBlanksAround(text)) {
      findings.push_back({Severity::Warning, path, fmt::format("blanks around \"{}\"", text),
                          matching == Matching::Whole ? "the blanks count: the bare name does not match"
                                                      : "the blanks count: found only where they are, too"});
    }
  }
}

std::vector<std::string> textsOf(const platform::Array& list) {
  std::vector<std::string> texts;
  for (const Value& element : list) texts.emplace_back(element.string().value_or(""));
  return texts;
}

std::vector<std::string> partsOf(std::string_view text) {
  std::vector<std::string> parts;
  while (true) {
    const auto comma = text.find(',');
    parts.emplace_back(text.substr(0, comma));
    if (comma == std::string_view::npos) return parts;
    text.remove_prefix(comma + 1);
  }
}

bool hasBlanksAround(std::string_view text) { return trimmed(text) != text; }

std::string pathOf(const std::string& parent, std::string_view key) {
  return parent.empty() ? std::string(key) : fmt::format("{}/{}", parent, key);
}

std::string pathOf(const std::string& parent, std::string_view key, std::size_t index) {
  return fmt::format("{}[{}]", pathOf(parent, key), index);
}

}  // namespace tallyd::storebagtool
