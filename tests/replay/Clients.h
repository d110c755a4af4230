// The client programs of a simulated day, each with its connection to the agent.
#pragma once

#include <map>
#include <memory>
#include <string>
#include <vector>

#include "daemon/TallydAgent.h"
#include "fakes/FakeIPC.h"
#include "replay/PostModel.h"
#include "replay/Scenario.h"
#include "replay/World.h"

namespace tallyd::replay {

/// Makes the calls and reads the answers: each call that wants one gets just one.
class Clients {
 public:
  /// Borrows them all. The model hears of each call that the daemon has carried out.
  Clients(TallydAgent& agent, World& world, PostModel& model) : _agent(agent), _world(world), _model(model) {}

  void connect(int client);
  void disconnect(int client, Ending ending);
  void disconnectAll();
  /// Those whose connections the daemon has ended.
  void disconnectEnded();

  void make(const Step& step, const Configure& call);
  void make(const Step& step, const Start& call);
  void make(const Step& step, const FetchStates& call);
  void make(const Step& step, const FetchDisplayURL& call);
  void make(const Step& step, const Send& call);
  void make(const Step& step, const SendOnce& call);
  void make(const Step& step, const Flush& call);
  void make(const Step& step, const UploadFile& call);
  void make(const Step& step, const UploadLogData& call);

  [[nodiscard]] std::size_t connections() const { return _connected; }  ///< Ever made.
  [[nodiscard]] std::size_t open() const { return _connections.size(); }
  [[nodiscard]] std::size_t calls() const { return _calls; }

 private:
  enum class Answers { One, MayBeMissing };
  class Connection;
  using Arguments = std::vector<platform::Value>;

  std::shared_ptr<fakes::FakeIncomingCall> call(const Step& step, std::string_view method,
                                                Arguments arguments, Answers answers = Answers::One);

  TallydAgent& _agent;
  World& _world;
  PostModel& _model;
  std::map<int, std::shared_ptr<Connection>> _connections;
  std::size_t _connected = 0;
  std::size_t _calls = 0;
};

}  // namespace tallyd::replay
