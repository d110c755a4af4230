// The command line of "tally-storebag explain".
#pragma once

#include <map>
#include <string>
#include <vector>

#include "tally-storebag/Options.h"
#include "tallyctl/SessionArguments.h"

namespace CLI {
class App;
}

namespace tallyd::storebagtool {

/// Declared with addTo(), read after the command line was parsed with result(), which throws CLI::ParseError.
/// Stays where it is from addTo() on. Session and message are given as to tallyctl.
class ExplainArguments {
 public:
  explicit ExplainArguments(platform::TimePoint now);

  void addTo(CLI::App& command);
  [[nodiscard]] ExplainOptions result() const;

 private:
  void addDeviceOptions(CLI::App& command);
  void addTimeOptions(CLI::App& command);

  ExplainOptions _options;
  const platform::TimePoint _now;
  tallyctl::SessionArguments _session;
  tallyctl::MessageArguments _message;
  std::string _raw;
  std::map<std::string, std::string> _texts;  ///< What is read once all is there, by option.
  std::string _consent = "no";
  bool _all = false;
};

/// "SECONDS" or "SECONDS.FRACTION" since 1970, exact to the microsecond, from 0 on; nothing for another text.
[[nodiscard]] std::optional<platform::TimePoint> timeFromText(std::string_view text);

/// The bytes of a UUID's text (RFC 4122, section 3); nothing for another text.
[[nodiscard]] std::optional<platform::UUIDBytes> uuidFromText(std::string_view text);

}  // namespace tallyd::storebagtool
