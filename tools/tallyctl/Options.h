// The command line of tallyctl.
#pragma once

#include <chrono>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <ostream>
#include <string>
#include <variant>

#include "tallyctl/Message.h"
#include "tallyctl/SessionInfo.h"

namespace tallyd::tallyctl {

inline constexpr int kSucceeded = 0;   ///< Exit status.
inline constexpr int kFailed = 1;      ///< Exit status: what was asked for could not be done, or not wholly.
inline constexpr int kWrongUsage = 2;  ///< Exit status: the command line is wrong, nothing was done.

struct ConnectionOptions {
  std::filesystem::path socket;
  std::chrono::milliseconds timeout{60'000};  ///< For each call's answer.
};

enum class AtFault { GoOn, Stop };

struct ReportOptions {
  SessionOptions session;
  std::optional<std::string> messagesFile;  ///< "-" is the standard input. Either this or `message` is there.
  std::optional<Message> message;
  std::uint64_t flushEvery = 0;  ///< Messages between two flushes; 0 flushes at the end only.
  AtFault atFault = AtFault::GoOn;
};

struct OnceOptions {
  SessionOptions session;
  Message message;
};

struct StatesOptions {
  SessionOptions session;
  bool waitForUserInfo = false;
};

struct FlushOptions {
  SessionOptions session;
};

struct WatchOptions {
  SessionOptions session;
  std::chrono::milliseconds interval{1'000};
  std::uint64_t count = 0;  ///< Samples to take; 0 goes on until a signal.
  bool json = false;
};

struct Options {
  ConnectionOptions connection;
  std::variant<ReportOptions, OnceOptions, StatesOptions, FlushOptions, WatchOptions> command;
};

/// The options, or the status to exit with when the command line asked for help or is wrong, which has then
/// been said.
struct ParsedOptions {
  std::optional<Options> options;
  int exitStatus = kSucceeded;
};

/// Reads the command line and the environment variable TALLY_ROOT, which --root overrides. Help goes to
/// `out`, what is wrong to `err`.
[[nodiscard]] ParsedOptions parseOptions(int argumentCount, const char* const* arguments,
                                         const std::string& version, std::ostream& out, std::ostream& err);

}  // namespace tallyd::tallyctl
