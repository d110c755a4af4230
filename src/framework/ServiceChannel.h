// One connection to the service, from its first byte to its end.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "framework/ClientSessionInterface.h"
#include "framework/TallyReply.h"
#include "platform/FileDescriptor.h"
#include "platform/SerialQueue.h"
#include "platform/Value.h"

namespace tallyd {

/// An answer's results, or why there are none.
struct ServiceReply {
  TallyError kind = TallyError::None;
  std::string error{};
  std::vector<platform::Value> results{};  ///< Of the types that the interface's table states.
};

using ServiceCompletion = std::function<void(ServiceReply reply)>;

struct ServiceRequest {
  ClientSessionMethod method{};
  std::vector<platform::Value> arguments{};
  std::vector<platform::FileDescriptor> descriptors{};
};

/// Takes calls and completes each once. It never waits: what it cannot send at once it does not take.
///
/// Threading: everything on one queue, which is the owner's.
class ServiceChannel {
 public:
  struct Events {
    /// Whenever calls are taken, first when the service has accepted the connection; returns whether one was
    /// made.
    std::function<bool()> ready;
    /// Once, after every call was completed.
    std::function<void(bool withinMessage)> ended;
  };

  virtual ~ServiceChannel() = default;
  [[nodiscard]] virtual bool isReady() const = 0;
  /// An empty completion asks for no answer. The call must not be made before the first `ready`.
  virtual void call(ServiceRequest request, std::chrono::milliseconds timeout,
                    ServiceCompletion completion) = 0;
  /// Ends once everything is answered. No further call.
  virtual void finish() = 0;
  /// Ends at once: calls under way fail.
  virtual void abort() = 0;
};

/// Makes a channel whose events come on the given queue, later. Throws std::system_error that says why not.
using ServiceConnector = std::function<std::shared_ptr<ServiceChannel>(ServiceChannel::Events events)>;

}  // namespace tallyd
