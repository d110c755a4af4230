#include "platform/http/CurlHTTPClient.h"

#include <new>
#include <utility>

#include "platform/http/CurlHandles.h"
#include "platform/http/CurlTransfer.h"
#include "platform/http/TransferEngine.h"
#include "platform/http/TrustAnchors.h"

namespace tallyd::platform {

namespace {

constexpr const char* kAdditionalAuthorities = "/etc/tally/ca.pem";

}  // namespace

class CurlHTTPClient::Implementation {
 public:
  Implementation(const Root& root, Queues& queues, Log& log, const Limits& limits)
      : _queues(queues),
        _limits(limits),
        _anchors(root.under(kAdditionalAuthorities), log),
        _environment{_share, _anchors, _limits},
        _handles(limits.maximumIdleHandles,
                 [this](CURL* handle) { return CurlTransfer::configure(handle, _environment); }),
        _engine(_environment) {}

  HTTPResult sendSynchronousRequest(const HTTPRequest& request) {
    try {
      return perform(request);
    } catch (const std::bad_alloc&) {
      return outOfMemory(request);
    }
  }

  TransferEngine& engine() { return _engine; }

 private:
  HTTPResult perform(const HTTPRequest& request) {
    CurlTransfer transfer(_handles.take(), request, CurlTransfer::ResponseBody::Keep, _environment);
    if (const auto problem = transfer.prepare()) {
      _handles.giveBack(transfer.releaseHandle());
      return failedRequest(request, *problem, HTTPFailure::Permanent);
    }
    const auto blocking = _queues.blockingCall();
    CURLcode code = curl_easy_perform(transfer.handle());
    if (transfer.prepareSecondAttempt(code)) code = curl_easy_perform(transfer.handle());
    HTTPResult result = transfer.result(code);
    if (transfer.mayReuseHandle()) _handles.giveBack(transfer.releaseHandle());
    return result;
  }

  Queues& _queues;
  const Limits _limits;
  TrustAnchors _anchors;
  CurlShare _share;  // Before the handles: it must outlive them.
  CurlEnvironment _environment;
  CurlHandlePool _handles;
  TransferEngine _engine;
};

CurlHTTPClient::CurlHTTPClient(const Root& root, Queues& queues, Log& log, Limits limits) {
  initialiseCurl();
  _implementation = std::make_unique<Implementation>(root, queues, log, limits);
}

CurlHTTPClient::~CurlHTTPClient() = default;

HTTPResult CurlHTTPClient::sendSynchronousRequest(const HTTPRequest& request) {
  return _implementation->sendSynchronousRequest(request);
}

void CurlHTTPClient::sendAsynchronousRequest(HTTPRequest request, std::shared_ptr<SerialQueue> queue,
                                             Completion completion) {
  _implementation->engine().submit(std::move(request), std::move(queue), std::move(completion));
}

}  // namespace tallyd::platform
