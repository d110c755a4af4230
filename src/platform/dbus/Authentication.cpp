#include "platform/dbus/Authentication.h"

#include <charconv>

namespace tallyd::platform::dbus {

namespace {

constexpr std::string_view kLineEnd = "\r\n";

/// `text`'s first word; the rest stays in `text`.
std::string_view takeWord(std::string_view& text) {
  const auto end = text.find(' ');
  const auto word = text.substr(0, end);
  text.remove_prefix(end == std::string_view::npos ? text.size() : end + 1);
  return word;
}

int digitValue(char digit) {
  if (digit >= '0' && digit <= '9') return digit - '0';
  if (digit >= 'a' && digit <= 'f') return digit - 'a' + 10;
  if (digit >= 'A' && digit <= 'F') return digit - 'A' + 10;
  return -1;
}

std::optional<std::string> fromHexadecimal(std::string_view digits) {
  if (digits.size() % 2 != 0) return std::nullopt;
  std::string bytes;
  for (std::size_t i = 0; i < digits.size(); i += 2) {
    const int high = digitValue(digits[i]);
    const int low = digitValue(digits[i + 1]);
    if (high < 0 || low < 0) return std::nullopt;
    bytes += static_cast<char>(high << 4 | low);
  }
  return bytes;
}

std::optional<uid_t> userNamed(std::string_view hexadecimal) {
  const auto text = fromHexadecimal(hexadecimal);
  uid_t user = 0;
  if (!text || text->empty()) return std::nullopt;
  const auto [end, error] = std::from_chars(text->data(), text->data() + text->size(), user);
  if (error != std::errc() || end != text->data() + text->size()) return std::nullopt;
  return user;
}

}  // namespace

Authentication::Progress Authentication::take(std::string_view bytes, std::size_t& taken,
                                              std::string& answers) {
  taken = 0;
  if (prefixBytes() > bytes.size()) return Progress::More;
  if (const std::size_t prefix = prefixBytes(); prefix > 0) {
    if (!takePrefix(bytes.substr(0, prefix))) return Progress::Failed;
    taken = prefix;
  }
  while (true) {
    const std::string_view rest = bytes.substr(taken);
    const auto end = rest.find(kLineEnd);
    if (end == std::string_view::npos)
      return rest.size() > kMaximumLineBytes ? Progress::Failed : Progress::More;
    if (end > kMaximumLineBytes || ++_lines > kMaximumLines) return Progress::Failed;
    taken += end + kLineEnd.size();
    if (const Progress progress = takeLine(rest.substr(0, end), answers); progress != Progress::More)
      return progress;
  }
}

bool ServerAuthentication::takePrefix(std::string_view prefix) {
  _state = State::Mechanism;
  return prefix[0] == '\0';
}

Authentication::Progress ServerAuthentication::takeLine(std::string_view line, std::string& answers) {
  const std::string_view command = takeWord(line);
  if (command == "BEGIN") return _state == State::Accepted ? Progress::Over : Progress::Failed;
  if (command == "AUTH" && _state == State::Mechanism) {
    chooseMechanism(line, answers);
  } else if (command == "DATA" && _state == State::ExternalData) {
    external(line, answers);
  } else if (command == "DATA" && _state == State::AnonymousData) {
    accept(answers);
  } else if (command == "NEGOTIATE_UNIX_FD" && _state == State::Accepted) {
    answers += "AGREE_UNIX_FD\r\n";
  } else if (command == "CANCEL" || command == "ERROR") {
    reject(answers);
  } else {
    answers += "ERROR\r\n";
  }
  return Progress::More;
}

void ServerAuthentication::chooseMechanism(std::string_view words, std::string& answers) {
  const std::string_view mechanism = takeWord(words);
  const bool isExternal = mechanism == "EXTERNAL";
  if (!isExternal && mechanism != "ANONYMOUS") return reject(answers);
  if (words.empty()) {
    _state = isExternal ? State::ExternalData : State::AnonymousData;
    answers += "DATA\r\n";
  } else if (isExternal) {
    external(words, answers);
  } else {
    accept(answers);
  }
}

/// Without an identity it is whoever the socket says.
void ServerAuthentication::external(std::string_view identity, std::string& answers) {
  if (identity.empty() || userNamed(identity) == _peer) return accept(answers);
  reject(answers);
}

void ServerAuthentication::accept(std::string& answers) {
  _state = State::Accepted;
  answers += "OK " + _identifier + "\r\n";
}

void ServerAuthentication::reject(std::string& answers) {
  _state = State::Mechanism;
  answers += "REJECTED EXTERNAL ANONYMOUS\r\n";
}

std::string ClientAuthentication::opening() const {
  return std::string(1, '\0') + "AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n";
}

Authentication::Progress ClientAuthentication::takeLine(std::string_view line, std::string& /*answers*/) {
  const std::string_view command = takeWord(line);
  switch (_awaited) {
    case Awaited::Data:
      _awaited = Awaited::Acceptance;
      return command == "DATA" ? Progress::More : Progress::Failed;
    case Awaited::Acceptance:
      _awaited = Awaited::Descriptors;
      return command == "OK" ? Progress::More : Progress::Failed;
    case Awaited::Descriptors:
      return command == "AGREE_UNIX_FD" ? Progress::Over : Progress::Failed;
  }
  return Progress::Failed;
}

}  // namespace tallyd::platform::dbus
