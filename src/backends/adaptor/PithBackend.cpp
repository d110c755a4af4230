#include "backends/adaptor/PithBackend.h"

#include <fmt/format.h>

#include <exception>

#include "backends/adaptor/AdaptorPayload.h"
#include "framework/PithAdaptor.h"
#include "platform/CodeBundle.h"
#include "platform/Log.h"
#include "platform/Platform.h"

namespace tallyd {

using platform::asl_log;
using platform::LogLevel;

namespace {

constexpr const char* kClassSymbol = "PithAdaptor";
constexpr std::string_view kForwardingSelector = "sendMessageWithMethod:respCode:dict:";

std::optional<std::string_view> bundlePathForClientType(std::int32_t clientType) {
  switch (clientType) {
    case 7:
      return "/System/Library/PrivateFrameworks/PlayhallServices.framework/Frameworks/"
             "PHSPerformance.framework";
    case 11:
      return "/System/Library/PrivateFrameworks/Fennel.framework";
    default:
      return std::nullopt;
  }
}

/// Calls into the adaptor's code and stops what it throws; false when it threw.
template <class Call>
bool callAdaptor(platform::Log& log, std::string_view what, Call&& call) {
  try {
    call();
    return true;
  } catch (const std::exception& error) {
    asl_log(log, LogLevel::Error, "PithBackend: Pith adaptor threw in {}: {}", what, error.what());
  } catch (...) {
    asl_log(log, LogLevel::Error, "PithBackend: Pith adaptor threw in {}", what);
  }
  return false;
}

}  // namespace

std::shared_ptr<PithBackend> PithBackend::initWithName(const platform::Platform& platform,
                                                       std::string_view name, const Payload& profile,
                                                       const std::optional<std::string>& productFamily,
                                                       std::int32_t clientType) {
  const std::shared_ptr<PithBackend> backend(new PithBackend(platform, name, profile, productFamily));
  return backend->loadAdaptor(clientType) ? backend : nullptr;
}

std::shared_ptr<PithBackend> PithBackend::initWithName(const platform::Platform& platform,
                                                       std::string_view name, const Payload& profile,
                                                       const std::optional<std::string>& productFamily) {
  return initWithName(platform, name, profile, productFamily, 0);
}

PithBackend::~PithBackend() {
  if (!_pithAdaptor || !_pithAdaptorClass->destroy) return;
  callAdaptor(_platform.log, "destroy", [this] { _pithAdaptorClass->destroy(_pithAdaptor); });
}

bool PithBackend::loadAdaptor(std::int32_t clientType) {
  asl_log(_platform.log, LogLevel::Info,
          "PithBackend(initWithName): Loading Pith adaptor class for client type {}", clientType);
  const auto path = bundlePathForClientType(clientType);
  if (!path) {
    asl_log(_platform.log, LogLevel::Error,
            "PithBackend(initWithName): No matching bundle found for client type {}", clientType);
    return false;
  }
  _clientBundle = _platform.codeBundles.load(_platform.root.under(*path));
  makeAdaptor();
  return true;
}

void PithBackend::makeAdaptor() {
  const auto* adaptorClass = static_cast<const PithAdaptorClass*>(_clientBundle->symbol(kClassSymbol));
  if (!adaptorClass) return;
  if (adaptorClass->structureVersion != PITH_ADAPTOR_STRUCTURE_VERSION) {
    asl_log(_platform.log, LogLevel::Warning,
            "PithBackend(initWithName): Pith adaptor class has the unknown version {}",
            adaptorClass->structureVersion);
    return;
  }
  _pithAdaptorClass = adaptorClass;
  if (!adaptorClass->create) return;
  callAdaptor(_platform.log, "create", [this] { _pithAdaptor = _pithAdaptorClass->create(); });
}

TallyBackend::Result PithBackend::sendMessage(const Payload& payload, const timeval& /*timestamp*/,
                                              std::uint16_t method, std::uint16_t respCode,
                                              std::uint16_t eventID) {
  if (_pithAdaptor && _pithAdaptorClass->sendMessageWithMethod_respCode_dict) {
    forward(payload, method, respCode, eventID);
  } else {
    _account->dropNew(DropReason::AdaptorUnavailable, 1, {{method, eventID}});
    asl_log(_platform.log, LogLevel::Error,
            "PithBackend(sendMessage): Pith adaptor {} does not respond to forwarding selector {}",
            adaptorDescription(), kForwardingSelector);
  }
  return std::nullopt;
}

void PithBackend::forward(const Payload& payload, std::uint16_t method, std::uint16_t respCode,
                          std::uint16_t eventID) const {
  const auto list = payload ? adaptorPayload(*payload, _platform.log) : std::nullopt;
  if (payload && !list) return _account->dropNew(DropReason::NotPostable, 1, {{method, eventID}});
  _account->start();
  const void* bytes = list ? list->data() : nullptr;
  const std::size_t length = list ? list->size() : 0;
  const bool returned = callAdaptor(_platform.log, kForwardingSelector, [&] {
    _pithAdaptorClass->sendMessageWithMethod_respCode_dict(_pithAdaptor, method, respCode, bytes, length);
  });
  if (!returned) return _account->drop(DropReason::AdaptorThrew, 1, {{method, eventID}});
  _account->finish();
  _account->show("adaptor", [&](TapLine& line) {
    line.add("method", unsigned{method}).add("respCode", unsigned{respCode}).add("event", unsigned{eventID});
    if (payload) line.add("payload", *payload);
  });
}

std::string PithBackend::adaptorDescription() const {
  return _pithAdaptor ? fmt::format("<PithAdaptor: {}>", fmt::ptr(_pithAdaptor)) : "(null)";
}

}  // namespace tallyd
