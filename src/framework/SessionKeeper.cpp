#include "framework/SessionKeeper.h"

namespace tallyd {

void SessionKeeper::leaves(const ServiceRequest& request) {
  switch (request.method) {
    case ClientSessionMethod::SetSessionInfo:
      _sessionInfo = request.arguments;
      return keepUserInfo(request.arguments.at(1));
    case ClientSessionMethod::FetchStates:
      return keepUserInfo(request.arguments.at(0));
    case ClientSessionMethod::StartConfig:
      _started = true;
      return;
    default:
      return;
  }
}

/// A session that is given none keeps what it has.
void SessionKeeper::keepUserInfo(const platform::Value& wrapped) {
  if (wrapped.array() && !wrapped.array()->empty()) _userInfo = wrapped;
}

std::vector<ServiceRequest> SessionKeeper::configuration() const {
  std::vector<ServiceRequest> calls;
  if (_sessionInfo) {
    auto arguments = *_sessionInfo;
    if (_userInfo) arguments.at(1) = *_userInfo;
    calls.push_back({.method = ClientSessionMethod::SetSessionInfo, .arguments = std::move(arguments)});
  } else if (_userInfo) {
    calls.push_back({.method = ClientSessionMethod::FetchStates, .arguments = {*_userInfo}});
  }
  if (_started) calls.push_back({.method = ClientSessionMethod::StartConfig});
  return calls;
}

}  // namespace tallyd
