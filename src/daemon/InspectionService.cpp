#include "daemon/InspectionService.h"

#include <vector>

#include "framework/InspectionInterface.h"
#include "platform/Log.h"
#include "support/Ledger.h"
#include "support/Tap.h"

namespace tallyd {

using platform::asl_log;
using platform::LogLevel;

namespace {

constexpr uid_t kRoot = 0;

/// One connection's view. Threading: the connection's queue.
class InspectionExport final : public platform::ExportedObject {
 public:
  InspectionExport(Ledger& ledger, Tap& tap) : _ledger(ledger), _tap(tap) {}

  void handleCall(const std::shared_ptr<platform::IncomingCall>& call) override {
    switch (static_cast<InspectionMethod>(call->methodIndex())) {
      case InspectionMethod::Stats:
        return call->reply({_ledger.snapshot()});
      case InspectionMethod::Tap:
        return startTap(*call);
    }
  }

 private:
  void startTap(platform::IncomingCall& call) {
    auto& descriptors = call.descriptors();
    auto subscription = descriptors.empty() ? nullptr : _tap.listen(std::move(descriptors.front()));
    if (!subscription) {
      return call.rejectArguments("the output must be a pipe or a socket, and not one tap too many");
    }
    _subscriptions.push_back(std::move(subscription));
    call.reply({});
  }

  Ledger& _ledger;
  Tap& _tap;
  std::vector<std::unique_ptr<Tap::Subscription>> _subscriptions;
};

}  // namespace

bool InspectionService::shouldAcceptNewConnection(
    const std::shared_ptr<platform::ServiceConnection>& connection) {
  const auto user = connection->peerUser();
  if (!user || (*user != kRoot && *user != _ownUser)) {
    asl_log(_log, LogLevel::Warning, "Inspection is not for this {}.", connection->description());
    return false;
  }
  connection->setExportedInterface(inspectionInterface());
  connection->setExportedObject(std::make_shared<InspectionExport>(_ledger, _tap));
  connection->resume();
  return true;
}

}  // namespace tallyd
