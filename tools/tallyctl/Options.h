// The command line of tallyctl.
#pragma once

#include <chrono>
#include <csignal>
#include <cstdint>
#include <filesystem>
#include <optional>
#include <ostream>
#include <string>
#include <variant>
#include <vector>

#include "tallyctl/Console.h"
#include "tallyctl/Message.h"
#include "tallyctl/SessionInfo.h"

namespace tallyd::tallyctl {

inline constexpr int kSucceeded = 0;   ///< Exit status.
inline constexpr int kFailed = 1;      ///< Exit status: what was asked for could not be done, or not wholly.
inline constexpr int kWrongUsage = 2;  ///< Exit status: the command line is wrong, nothing was done.
/// Exit status: nobody reads the output any more; what a shell makes of an end by SIGPIPE.
inline constexpr int kClosedPipe = 128 + SIGPIPE;

struct ConnectionOptions {
  std::filesystem::path socket;
  std::chrono::milliseconds timeout{60'000};  ///< For each call's answer.
  std::filesystem::path inspectionSocket{};
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
};

struct DisplayURLOptions {
  SessionOptions session;
};

struct UploadOptions {
  SessionOptions session;
  std::string file;
};

struct UploadLogOptions {
  SessionOptions session;
  std::vector<std::string> files;  ///< "-" is the standard input.
};

/// The books of the daemon.
struct StatsOptions {};

/// What leaves the daemon, as it happens.
struct TapOptions {};

using CommandOptions =
    std::variant<ReportOptions, OnceOptions, StatesOptions, FlushOptions, WatchOptions, DisplayURLOptions,
                 UploadOptions, UploadLogOptions, StatsOptions, TapOptions>;

struct Options {
  ConnectionOptions connection;
  OutputForm form = OutputForm::Text;
  CommandOptions command;
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
