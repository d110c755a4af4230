// What post backends make of their messages, told a second time and without the daemon's code.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "replay/Scenario.h"
#include "replay/Surroundings.h"

namespace tallyd::replay {

/// Events by where they must be in the books, but for those that were handed over to be posted.
struct PostForecast {
  std::uint64_t accepted = 0;
  std::uint64_t held = 0;
  std::uint64_t stateOff = 0;
  std::uint64_t methodLimit = 0;
  std::uint64_t consentWithdrawn = 0;
  std::uint64_t cleanUp = 0;
};

/// Follows each client's session: which post backends it has, whether they report, what their batches hold.
///
/// It is told of a call when the daemon has carried it out. It knows no more than the world does: the calls,
/// the storebags that were given out, the preferences, the country, and the sampling factor that a call drew.
class PostModel {
 public:
  explicit PostModel(const Surroundings& world);
  ~PostModel();

  void configure(int client, const Configure& call);
  void start(int client);
  void fetchStates(int client, const FetchStates& call);
  void send(int client, std::uint16_t method);
  void sendOnce(int client, const SendOnce& call);
  void flush(int client);
  void end(int client);

  [[nodiscard]] const PostForecast& forecast() const { return _forecast; }

 private:
  class Backend;
  using Backends = std::vector<std::unique_ptr<Backend>>;
  struct Session {
    OptionalDictionary sessionInfo;
    OptionalDictionary userInfo;
    Backends backends;
  };

  void takeUserInfo(Session& session, const OptionalDictionary& userInfo);
  [[nodiscard]] std::optional<Backends> makeBackends(const platform::Dictionary& sessionInfo);
  static void finish(Backends& backends);

  const Surroundings& _world;
  PostForecast _forecast;
  std::map<int, Session> _sessions;
};

}  // namespace tallyd::replay
