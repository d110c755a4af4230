// The commands that bags are written, read and compared with.

#include <fmt/format.h>

#include <algorithm>
#include <stdexcept>

#include "platform/JSON.h"
#include "platform/property-list/PropertyList.h"
#include "tally-storebag/BagDiff.h"
#include "tally-storebag/BagFile.h"
#include "tally-storebag/Documents.h"
#include "tally-storebag/Files.h"
#include "tally-storebag/KnownKeys.h"
#include "tally-storebag/Linter.h"
#include "tally-storebag/StartingBag.h"
#include "tally-storebag/Tool.h"

namespace tallyd::storebagtool {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

constexpr mode_t kReadableByAll = 0644;

/// `list` as JSON that people can read, one line feed at its end.
std::string jsonText(const Value& value, const std::string& name) {
  const auto json = platform::jsonFromValue(value);
  if (!json) throw std::runtime_error(name + ": JSON can't express a date, data or a number that it holds");
  return indentedJSON(*json) + "\n";
}

Value jsonOf(const Finding& finding) {
  return Dictionary{{"severity", nameOf(finding.severity)},
                    {"path", finding.path},
                    {"text", finding.text},
                    {"effect", finding.effect}};
}

Value jsonOf(const KnownKey& key) {
  return Dictionary{{"place", nameOf(key.place)},      {"key", key.key},
                    {"type", nameOf(key.kind)},        {"presence", nameOf(key.presence)},
                    {"when_missing", key.whenMissing}, {"effect", key.effect}};
}

template <class Elements>
Value jsonListOf(const Elements& elements) {
  Array list;
  for (const auto& element : elements) list.append(jsonOf(element));
  return list;
}

char signOf(Exposure exposure) {
  switch (exposure) {
    case Exposure::Grows:
      return '+';
    case Exposure::Shrinks:
      return '-';
    case Exposure::Same:
      return '=';
  }
  return ' ';
}

std::string_view verdict(const Changes& changes) {
  if (changes.empty()) return "no change in what leaves devices";
  if (exposureGrows(changes)) return "exposure grows";
  const bool shrinks =
      std::ranges::any_of(changes, [](const Change& change) { return change.exposure == Exposure::Shrinks; });
  return shrinks ? "exposure only shrinks" : "exposure stays";
}

}  // namespace

std::string textOf(const Finding& finding) {
  return fmt::format("{} {}: {}; {}", nameOf(finding.severity), finding.path.empty() ? "/" : finding.path,
                     finding.text, finding.effect);
}

int runCommand(const NewOptions& options, const Surroundings& surroundings) {
  if (options.file)
    writeFile(*options.file, startingBag(), kReadableByAll, Existing::Keep);
  else
    surroundings.out << startingBag();
  return kSucceeded;
}

int runCommand(const ShowOptions& options, const Surroundings& surroundings) {
  const BagFile file = readBagFile(options.file);
  if (file.inEnvelope)
    complain(surroundings, options.file.string() + ": in an envelope; its signature is not checked here");
  if (options.json) {
    surroundings.out << jsonText(file.bag, options.file.string());
    return kSucceeded;
  }
  const auto xml = platform::dataWithPropertyList(file.bag, platform::PropertyListFormat::XML);
  if (!xml) throw std::runtime_error(options.file.string() + ": can't be written as XML");
  surroundings.out << *xml;
  return kSucceeded;
}

int runCommand(const LintOptions& options, const Surroundings& surroundings) {
  const Findings findings = lintBag(readBagFile(options.file).bag);
  if (options.json) {
    surroundings.out << jsonText(jsonListOf(findings), options.file.string());
  } else {
    for (const Finding& finding : findings) surroundings.out << textOf(finding) << '\n';
  }
  const bool isClean = std::ranges::all_of(
      findings, [](const Finding& finding) { return finding.severity == Severity::Note; });
  return isClean ? kSucceeded : kFailed;
}

int runCommand(const KeysOptions& options, const Surroundings& surroundings) {
  if (options.json) {
    surroundings.out << jsonText(jsonListOf(knownKeys()), "keys");
    return kSucceeded;
  }
  constexpr const char* kRow = "{:<19}{:<20}{:<23}{:<10}{}; {}{}\n";
  for (const KnownKey& key : knownKeys()) {
    surroundings.out << fmt::format(kRow, nameOf(key.place), key.key, nameOf(key.kind), nameOf(key.presence),
                                    key.effect, "missing: ", key.whenMissing);
  }
  return kSucceeded;
}

int runCommand(const ExplainOptions& options, const Surroundings& surroundings) {
  const BagFile file = readBagFile(options.bag);
  Explanation explanation;
  try {
    explanation = explain(file.bag, options.occasion);
  } catch (const std::runtime_error& error) {
    throw std::runtime_error(fmt::format("{}: {}", options.bag.string(), error.what()));
  }
  surroundings.out << explanationText(explanation, options.occasion, options.acts);
  if (options.rawFolder) writeRawFiles(explanation, *options.rawFolder);
  return kSucceeded;
}

int runCommand(const DiffOptions& options, const Surroundings& surroundings) {
  const Dictionary before = readBagFile(options.before).bag;
  const Dictionary after = readBagFile(options.after).bag;
  const Changes changes = diffBags(before, after);
  for (const Change& change : changes)
    surroundings.out << fmt::format("{} {}: {}\n", signOf(change.exposure), change.path, change.text);
  surroundings.out << verdict(changes) << '\n';
  return exposureGrows(changes) ? kFailed : kSucceeded;
}

}  // namespace tallyd::storebagtool
