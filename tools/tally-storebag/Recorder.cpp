#include "tally-storebag/Recorder.h"

#include "framework/PithAdaptor.h"

namespace tallyd::storebagtool {

using platform::HTTPRequest;
using platform::HTTPResponse;
using platform::HTTPResult;

namespace {

HTTPResult emptyAnswer() { return {std::nullopt, HTTPResponse{200, {}}, {}}; }

using AdaptorCalls = std::vector<AdaptorCall>;

/// What the next instance writes to: the structure's create function takes no argument.
thread_local AdaptorCalls* callsOfNextInstance = nullptr;

void* createAdaptor() { return callsOfNextInstance; }

void keepCall(void* self, std::uint16_t method, std::uint16_t respCode, const void* plist,
              std::size_t length) {
  static_cast<AdaptorCalls*>(self)->push_back(
      {method, respCode, plist ? std::string(static_cast<const char*>(plist), length) : std::string()});
}

constexpr PithAdaptorClass kRecordingAdaptor{PITH_ADAPTOR_STRUCTURE_VERSION, createAdaptor, nullptr,
                                             keepCall};

class RecordingBundle final : public platform::CodeBundle {
 public:
  explicit RecordingBundle(AdaptorCalls& calls) : _calls(calls) {}
  [[nodiscard]] const void* symbol(const char* name) const override {
    callsOfNextInstance = &_calls;
    return std::string_view(name) == "PithAdaptor" ? &kRecordingAdaptor : nullptr;
  }

 private:
  AdaptorCalls& _calls;
};

}  // namespace

HTTPResult RecordingHTTPClient::sendSynchronousRequest(const HTTPRequest& request) {
  _posts.push_back(request);
  return emptyAnswer();
}

void RecordingHTTPClient::sendAsynchronousRequest(HTTPRequest request,
                                                  std::shared_ptr<platform::SerialQueue> queue,
                                                  Completion completion) {
  _posts.push_back(std::move(request));
  queue->async([completion = std::move(completion)] { completion(emptyAnswer()); });
}

HTTPResult AnsweringHTTPClient::sendSynchronousRequest(const HTTPRequest& /*request*/) {
  return {std::nullopt, HTTPResponse{200, {}}, _body};
}

void AnsweringHTTPClient::sendAsynchronousRequest(HTTPRequest /*request*/,
                                                  std::shared_ptr<platform::SerialQueue> queue,
                                                  Completion completion) {
  queue->async([completion = std::move(completion)] { completion(emptyAnswer()); });
}

std::shared_ptr<platform::CodeBundle> RecordingCodeBundles::load(const std::filesystem::path& /*path*/) {
  return std::make_shared<RecordingBundle>(_calls);
}

}  // namespace tallyd::storebagtool
