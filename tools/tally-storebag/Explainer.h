// What a session on a device would send under a bag: the daemon's own session and backends, on a device that
// lets nothing go.
#pragma once

#include <map>
#include <optional>
#include <string>
#include <vector>

#include "backends/https-post/ReportingRules.h"
#include "platform/Clock.h"
#include "platform/Value.h"
#include "tally-storebag/DescribedDevice.h"
#include "tally-storebag/Recorder.h"
#include "tallyctl/Message.h"
#include "tallyctl/SessionInfo.h"

namespace tallyd::storebagtool {

/// A session with one message.
struct Occasion {
  DeviceDescription device;
  tallyctl::SessionOptions session;
  tallyctl::Message message;
  std::optional<std::string> sessionKey;  ///< The combined session ID; a stand-in when not given.
  platform::TimePoint sessionStart;
  platform::TimePoint messageTime;
  platform::TimePoint postTime;  ///< When the message, or its batch, is made a document.
};

/// One backend that the bag asks for.
struct ExplainedBackend {
  std::string name;
  platform::Dictionary profile;
  bool isMade = false;
  std::int32_t state = 0;                     ///< A ReportingState.
  std::optional<ReportingDecision> decision;  ///< Of the backends that follow the client rules.
  ReportingTrace trace;
  std::vector<LogLine> refusal;  ///< What the daemon logs when it is not made.
};

/// What the backends let go at one point of the session, by their names.
struct Act {
  std::string name;
  std::map<std::string, Recorded> sent;
  std::optional<std::string> reply;  ///< What the client hears of its message or flush.
};

struct Explanation {
  std::string storebagName;
  std::string environment;  ///< That the device asks for.
  std::string version;
  std::vector<ExplainedBackend> backends;
  std::vector<Act> acts;       ///< "start", "message", "flush" with a batching session, "end".
  std::vector<LogLine> lines;  ///< What the daemon logs beside its backends.
};

/// Signs the bag for the occasion, has it fetched, verified and cut by the daemon's code, and runs the
/// session. Datagrams go to a receiver on the loopback interface, nothing else leaves the process. Throws
/// std::runtime_error when the device gets no storebag, and says why.
[[nodiscard]] Explanation explain(const platform::Dictionary& bag, const Occasion& occasion);

}  // namespace tallyd::storebagtool
