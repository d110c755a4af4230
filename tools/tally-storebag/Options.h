// The command line of tally-storebag.
#pragma once

#include <filesystem>
#include <optional>
#include <ostream>
#include <string>
#include <variant>

#include "platform/Clock.h"
#include "platform/property-list/PropertyList.h"
#include "tally-storebag/Explainer.h"
#include "tally-storebag/ExplanationText.h"

namespace tallyd::storebagtool {

inline constexpr int kSucceeded = 0;   ///< Exit status.
inline constexpr int kFailed = 1;      ///< Exit status: it could not be done, or something was found.
inline constexpr int kWrongUsage = 2;  ///< Exit status: the command line is wrong, nothing was done.

struct NewOptions {
  std::optional<std::filesystem::path> file;  ///< The standard output when not given.
};

struct KeygenOptions {
  std::filesystem::path privateKey;
  std::filesystem::path publicKey;
  unsigned bits = 2048;
  bool force = false;
};

struct SignOptions {
  std::filesystem::path bag;
  std::filesystem::path key;
  std::filesystem::path out;
  platform::PropertyListFormat format = platform::PropertyListFormat::XML;
};

struct VerifyOptions {
  std::filesystem::path envelope;
  std::filesystem::path publicKey;
};

struct ShowOptions {
  std::filesystem::path file;
  bool json = false;
};

struct LintOptions {
  std::filesystem::path file;
  bool json = false;
};

struct KeysOptions {
  bool json = false;
};

struct ExplainOptions {
  std::filesystem::path bag;
  Occasion occasion;
  std::optional<std::filesystem::path> rawFolder;
  Acts acts = Acts::Message;
};

struct DiffOptions {
  std::filesystem::path before;
  std::filesystem::path after;
};

using Options = std::variant<NewOptions, KeygenOptions, SignOptions, VerifyOptions, ShowOptions, LintOptions,
                             KeysOptions, ExplainOptions, DiffOptions>;

/// The options, or the status to exit with when the command line asked for help or is wrong, which has then
/// been said.
struct ParsedOptions {
  std::optional<Options> options;
  int exitStatus = kSucceeded;
};

/// Reads the command line. Help goes to `out`, what is wrong to `err`. `now` stands in for times that are not
/// given.
[[nodiscard]] ParsedOptions parseOptions(int argumentCount, const char* const* arguments,
                                         const std::string& version, platform::TimePoint now,
                                         std::ostream& out, std::ostream& err);

}  // namespace tallyd::storebagtool
