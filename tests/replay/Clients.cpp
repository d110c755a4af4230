#include "replay/Clients.h"

#include "framework/TallyKeys.h"

namespace tallyd::replay {

using platform::Array;
using platform::Value;

namespace {

/// "aa{sv}": nothing, or one dictionary.
Value optional(const OptionalDictionary& dictionary) {
  Array list;
  if (dictionary) list.append(*dictionary);
  return list;
}

}  // namespace

/// Ends when the client hears of it, as a real one does, and not within the daemon's call.
class Clients::Connection : public fakes::FakeServiceConnection {
 public:
  using FakeServiceConnection::FakeServiceConnection;
  void finish() override { ++finished; }
};

void Clients::connect(int client) {
  auto& connection = _connections[client];
  connection = std::make_shared<Connection>(fmt::format("client {} of user 0", client));
  _agent.shouldAcceptNewConnection(connection);
  ++_connected;
}

void Clients::disconnect(int client, Ending ending) {
  const auto found = _connections.find(client);
  if (found == _connections.end()) return;
  _world.surroundings().trace.write("client", "{} disconnects", client);
  if (ending == Ending::Broken) found->second->interrupt();
  found->second->invalidate();
  _model.end(client);
  _connections.erase(found);
  _world.surroundings().isSessionEnding = true;
  _world.settle();
  _world.surroundings().isSessionEnding = false;
}

void Clients::disconnectAll() {
  while (!_connections.empty()) disconnect(_connections.begin()->first, Ending::Clean);
}

void Clients::disconnectEnded() {
  std::vector<int> ended;
  for (const auto& [client, connection] : _connections) {
    if (connection->finished > 0) ended.push_back(client);
  }
  for (const int client : ended) disconnect(client, Ending::Clean);
}

std::shared_ptr<fakes::FakeIncomingCall> Clients::call(const Step& step, std::string_view method,
                                                       Arguments arguments, Answers answers) {
  using Answer = fakes::FakeServiceConnection::Answer;
  Surroundings& world = _world.surroundings();
  world.trace.write("call", "{} {}", step.client, method);
  ++_calls;
  world.samplingFactor = world.draws.unit();
  const auto made =
      _connections.at(step.client)
          ->call(method, std::move(arguments), step.wantsAnswer ? Answer::Wanted : Answer::NotWanted);
  for (const auto& reply : made->replies)
    world.trace.write("reply", "{} {}", step.client, Value(Array(reply)).description());
  const std::size_t least = step.wantsAnswer && answers == Answers::One ? 1 : 0;
  const std::size_t most = step.wantsAnswer ? 1 : 0;
  if (made->replies.size() < least || made->replies.size() > most || !made->rejections.empty()) {
    world.violated(fmt::format("{} got {} answers and {} rejections", method, made->replies.size(),
                               made->rejections.size()));
  }
  return made;
}

void Clients::make(const Step& step, const Configure& configure) {
  call(step, "SetSessionInfo", {Array{configure.sessionInfo}, optional(configure.userInfo), Array()});
  _model.configure(step.client, configure);
}
void Clients::make(const Step& step, const Start&) {
  call(step, "StartConfig", {});
  _model.start(step.client);
}
void Clients::make(const Step& step, const FetchStates& fetch) {
  call(step, "FetchStates", {optional(fetch.userInfo)});
  _model.fetchStates(step.client, fetch);
}
void Clients::make(const Step& step, const FetchDisplayURL&) { call(step, "FetchDisplayURL", {}); }
void Clients::make(const Step& step, const Send& send) {
  ++_world.surroundings().received.messagesOffered;
  call(step, "SendMessageWithCategory",
       {unsigned{send.category}, unsigned{send.type}, optional(send.payload)});
  _model.send(step.client, send.category);
}
void Clients::make(const Step& step, const SendOnce& once) {
  ++_world.surroundings().received.messagesOffered;
  _world.surroundings().isOneShotCall = true;
  const bool isIdentified = once.sessionInfo && once.sessionInfo->contains(kTallySessionInfoSessionID);
  call(step, "SendMessageWithSessionInfo",
       {optional(once.sessionInfo), optional(once.userInfo), unsigned{once.message.category},
        unsigned{once.message.type}, optional(once.message.payload)},
       isIdentified ? Answers::One : Answers::MayBeMissing);
  _world.surroundings().isOneShotCall = false;
  _model.sendOnce(step.client, once);
}
void Clients::make(const Step& step, const Flush&) {
  call(step, "FlushMessages", {});
  _model.flush(step.client);
}

void Clients::make(const Step& step, const UploadFile& upload) {
  const auto path = _world.makeFile(upload);
  Received& received = _world.surroundings().received;
  ++received.uploadsOffered;
  const auto takenBefore = received.uploads - received.uploadsRefused;
  call(step, "UploadFileAtPath", {"file://" + path.string(), "", Array()});
  // The server's success is what deletes a file.
  const bool isTaken = received.uploads - received.uploadsRefused > takenBefore;
  if (isTaken == std::filesystem::exists(path) && upload.bytes) {
    _world.surroundings().violated("an uploaded file was not treated as the server's answer asks for");
  }
}

void Clients::make(const Step& step, const UploadLogData& upload) {
  ++_world.surroundings().received.uploadsOffered;
  call(step, "UploadLogData", {upload.data});
}

}  // namespace tallyd::replay
