#include "tallyctl/Session.h"

#include <fmt/format.h>

namespace tallyd::tallyctl {

Session::Session(const ConnectionOptions& options)
    : _socket(options.socket.string()), _connection(options.socket, options.timeout) {
  _connection.setInvalidationHandler([this] { _lost = true; });
}

std::optional<Strings> Session::start(const SessionOptions& options, std::uint32_t sessionID,
                                      std::optional<platform::Dictionary> userInfo) {
  answer("configuring the session", _connection.setSessionInfoSync(sessionInfo(options, sessionID),
                                                                   std::move(userInfo), options.frameworks));
  return answer("starting the session", _connection.startConfigSync());
}

std::string Session::lostText() const { return fmt::format("{}: the daemon closed the connection", _socket); }

void Session::fail(std::string_view operation, std::string_view error) const {
  throw Failure(fmt::format("{}: {} failed: {}", _socket, operation, error));
}

}  // namespace tallyd::tallyctl
