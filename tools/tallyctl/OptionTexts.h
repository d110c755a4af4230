// The longer texts of tallyctl's --help.
#pragma once

namespace tallyd::tallyctl {

inline constexpr const char* kAppText =
    "Talks to the reporting daemon tallyd: reports messages, uploads files, shows states.";
inline constexpr const char* kAppFooter = R"(
Example, two messages from a file:
  tallyctl report --client-name demo --service-name calls --messages messages.jsonl

Exit status: 0 everything worked; 1 something failed; 2 wrong usage; 141 nobody reads the output.
"tallyctl COMMAND --help" shows an example of each command. See tallyctl(1).)";

inline constexpr const char* kClientTypeText =
    "Client type; 5 to 11 have storebags, and the daemon ends itself at any other";
inline constexpr const char* kPayloadText =
    "The message's payload: KEY=VALUE, where true, false and numbers\n"
    "become just that and all else a string, or KEY:=JSON";

inline constexpr const char* kReportText = "Reports messages through one session";
inline constexpr const char* kReportFooter = R"(
Each line of FILE is {"category": N, "type": N, "payload": {...}}; blank lines are passed over. Lines that
cannot be read are named and left out. The session is flushed at the end.

Examples:
  tallyctl report --category 1 --type 0 rtt=12.5 codec=opus 'layers:=[1, 2]'
  tallyctl report --batch --flush-every 50 --messages messages.jsonl)";

inline constexpr const char* kOnceText = "Sends one message without setting up a session";
inline constexpr const char* kOnceFooter = R"(
Prints the daemon's reply: "finished", or "storebag not available", which is a failure.

Example:
  tallyctl once --client-type 7 --category 2 --type 4 reason=dropped)";

inline constexpr const char* kStatesText = "Starts a session and prints the backends that report";
inline constexpr const char* kStatesFooter = R"(
Prints one name a line, or "no storebag".

Examples:
  tallyctl states --client-type 6
  echo ClientName=demo | tallyctl states --require-user-info --wait-for-user-info)";
inline constexpr const char* kWaitForUserInfoText =
    "Start without user info, then read further KEY=VALUE lines from\n"
    "the standard input up to its end, hand the user info over and\n"
    "print the states again";

inline constexpr const char* kFlushText = "Starts a session, flushes it and prints the result";
inline constexpr const char* kFlushFooter = R"(
Batches belong to a session: this shows how the backends answer a flush, and sends nothing of what other
sessions have batched. Use "report --flush-every" to flush what is being reported.

Example:
  tallyctl flush --client-type 5 --batch)";

inline constexpr const char* kDisplayURLText = "Starts a session and prints the URL that shows its reports";
inline constexpr const char* kDisplayURLFooter = R"(
Fails when there is none. The URL names the session, so that --session-id asks for that of another one.

Example:
  tallyctl display-url --session-id 42)";

inline constexpr const char* kUploadText = "Uploads a file";
inline constexpr const char* kUploadFooter = R"(
Waits until the daemon has sent the file, which need not mean that the server took it: a file that the server
confirms is removed where the daemon may do so. A large file may need a longer --timeout.

Example:
  tallyctl --timeout 600 upload --session-id 42 /var/mobile/call.log)";

inline constexpr const char* kUploadLogText = "Uploads log data";
inline constexpr const char* kLogFilesText =
    "Files with log data: a property list or JSON (one element of the\n"
    "data each), or JSON lines (one element a line); - is the standard input";
inline constexpr const char* kUploadLogFooter = R"(
Example:
  tallyctl upload-log states.plist events.jsonl)";

inline constexpr const char* kWatchText = "Samples this machine and reports each sample, until stopped";
inline constexpr const char* kWatchFooter = R"(
Reports the use of processors, memory, disks and network as quality samples (category 1, type 0) through one
session of client type 5. SIGINT and SIGTERM flush the session and end it in order.

Examples:
  tallyctl watch
  tallyctl watch --interval 5 --count 12 --json)";

inline constexpr const char* kInspectionSocketText =
    "The socket that stats and tap use, in place of the one below the root";

inline constexpr const char* kStatsText = "Shows what the daemon took and what became of it";
inline constexpr const char* kStatsFooter = R"(
For each session and backend, for the sessions that have ended and in total: what was accepted is what was sent,
is held or under way, or was dropped for one of the reasons that follow. Of what was sent, the servers refused
some. Fails when something does not balance. For root and the daemon's own user.

Examples:
  tallyctl stats
  tallyctl stats --json)";

inline constexpr const char* kTapText = "Shows what leaves the daemon, until stopped";
inline constexpr const char* kTapFooter = R"(
Posts with their documents and results, datagrams, uploads, records, and whatever is dropped, of all sessions.
Who reads too slowly misses lines and is told how many; the daemon does not wait. For root and the daemon's own
user.

Examples:
  tallyctl tap
  tallyctl tap --json | grep '"kind":"drop"')";

}  // namespace tallyd::tallyctl
