#include "framework/TallyInspection.h"

#include <future>
#include <utility>

#include "framework/InspectionInterface.h"
#include "platform/ipc/DBusClientConnection.h"
#include "platform/queues/AsioQueues.h"

namespace tallyd {

using platform::DBusClientConnection;
using platform::Value;

namespace {

constexpr std::chrono::seconds kPatienceAtTheEnd{5};
constexpr std::chrono::milliseconds kGrace{
    500};  ///< The call itself gives up earlier, unless it is not taken.

}  // namespace

/// The connection and the thread that serves it.
class TallyInspection::Channel {
 public:
  Channel(const std::filesystem::path& socketPath, std::chrono::milliseconds timeout)
      : connection(DBusClientConnection::connect(socketPath, inspectionInterface(), _queues)),
        _timeout(timeout) {}
  ~Channel() { connection->close(kPatienceAtTheEnd); }
  Channel(const Channel&) = delete;
  Channel& operator=(const Channel&) = delete;

  DBusClientConnection::Reply wait(InspectionMethod method,
                                    std::vector<platform::FileDescriptor> descriptors = {}) const {
    const auto promise = std::make_shared<std::promise<DBusClientConnection::Reply>>();
    auto answer = promise->get_future();
    const std::vector<Value> placeholders(descriptors.size());
    connection->call({static_cast<std::size_t>(method), placeholders, std::move(descriptors)}, _timeout,
                     [promise](DBusClientConnection::Reply reply) { promise->set_value(std::move(reply)); });
    if (answer.wait_for(_timeout + kGrace) != std::future_status::ready)
      return {"the service does not answer", {}};
    return answer.get();
  }

 private:
  platform::AsioQueues _queues{1};

 public:
  const std::shared_ptr<DBusClientConnection> connection;

 private:
  const std::chrono::milliseconds _timeout;
};

TallyInspection::TallyInspection(const std::filesystem::path& socketPath, std::chrono::milliseconds timeout)
    : _channel(std::make_unique<Channel>(socketPath, timeout)) {}

TallyInspection::~TallyInspection() = default;

void TallyInspection::setInvalidationHandler(std::function<void()> handler) {
  _channel->connection->setInvalidationHandler(std::move(handler));
}

StatsReply TallyInspection::statsSync() {
  auto reply = _channel->wait(InspectionMethod::Stats);
  if (reply.error) return {std::move(reply.error), {}};
  const auto* stats = reply.results[0].dictionary();
  return {std::nullopt, stats ? *stats : platform::Dictionary()};
}

std::optional<std::string> TallyInspection::tapSync(platform::FileDescriptor output) {
  std::vector<platform::FileDescriptor> descriptors;
  descriptors.push_back(std::move(output));
  return _channel->wait(InspectionMethod::Tap, std::move(descriptors)).error;
}

}  // namespace tallyd
