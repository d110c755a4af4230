#include <fcntl.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>

#include <fstream>
#include <future>

#include "IPCTest.h"
#include "support/FewDescriptors.h"

extern char** environ;

namespace tallyd::platform {
namespace {

class ListenerTest : public testing::Test {
 protected:
  void expectServed(const std::filesystem::path& path) {
    AsioQueues queues(1);
    const auto client = DBusClientConnection::connect(path, testInterface(), queues);
    std::promise<bool> answered;
    client->call({kNothing, {}, {}}, std::chrono::seconds(60),
                 [&](DBusClientConnection::Reply reply) { answered.set_value(!reply.error); });
    EXPECT_TRUE(answered.get_future().get());
    client->close(std::chrono::seconds(5));
  }

  fakes::TemporaryFolder _folder;
  const std::filesystem::path _path = _folder.path() / "run/tallyd/service";
  fakes::FakeLog _log;
};

TEST_F(ListenerTest, MakesTheFolderAndASocketThatEverybodyMayUse) {
  const TestService service(_path, _log);
  struct stat status {};
  ASSERT_EQ(::stat(_path.c_str(), &status), 0);
  EXPECT_TRUE(S_ISSOCK(status.st_mode));
  EXPECT_EQ(status.st_mode & 07777U, 0666U);
}

TEST_F(ListenerTest, ASecondOneOnTheSamePathIsRefusedAndTheFirstGoesOn) {
  TestService service(_path, _log);
  service.resume();
  try {
    const TestService second(_path, _log);
    FAIL() << "two daemons on one root";
  } catch (const std::runtime_error& error) {
    EXPECT_EQ(error.what(), "another tallyd is running on this root: " + _path.string());
  }
  expectServed(_path);
}

TEST_F(ListenerTest, TakesThePlaceOfADeadProcessesSocket) {
  std::filesystem::create_directories(_path.parent_path());
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, _path.c_str(), sizeof address.sun_path - 1);
  {
    const FileDescriptor stale(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    ASSERT_EQ(::bind(stale.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  }
  std::ofstream(_path.string() + ".lock") << "left behind";
  TestService service(_path, _log);
  service.resume();
  expectServed(_path);
}

TEST_F(ListenerTest, MayBeFollowedByAnotherOne) {
  { const TestService service(_path, _log); }
  EXPECT_FALSE(std::filesystem::exists(_path));
  TestService service(_path, _log);
  service.resume();
  expectServed(_path);
}

TEST_F(ListenerTest, NamesThePathThatIsTooLong) {
  const auto path = _folder.path() / std::string(120, 'x');
  try {
    const TestService service(path, _log);
    FAIL();
  } catch (const std::system_error& error) {
    EXPECT_NE(std::string(error.what()).find(path.string()), std::string::npos);
  }
}

TEST_F(ListenerTest, AConnectionThatTheDelegateRefusesIsClosed) {
  TestService service(_path, _log);
  service.refuse = true;
  service.resume();
  const RawClient client(_path);
  EXPECT_TRUE(client.isClosedByPeer());
  EXPECT_TRUE(service.events.all().empty());
}

TEST_F(ListenerTest, ClientsThatCameBeforeItWasResumedAreServed) {
  TestService service(_path, _log);
  RawClient client(_path);
  client.send(RawClient::authentication() + rawCall(1, "Nothing"));
  service.resume();
  EXPECT_TRUE(service.events.waitFor("Nothing"));
}

TEST_F(ListenerTest, WithoutDescriptorsItSaysSoOnceAndServesTheRestLater) {
  constexpr std::size_t kClients = 40;
  constexpr std::size_t kBatch = 5;
  constexpr int kSpare = kBatch + 8;  // The event loop's own come out of it.
  TestService service(_path, _log);
  std::vector<std::unique_ptr<RawClient>> clients;
  for (std::size_t i = 0; i < kClients; ++i) {
    clients.push_back(std::make_unique<RawClient>(_path));
    clients.back()->send(RawClient::authentication() + rawCall(1, "Nothing"));
  }
  // UndefinedBehaviorSanitizer needs descriptors of its own when it first sees a class, here the line's
  // buffer.
  asl_log(_log, LogLevel::Debug, "{}", "first");
  _log.clear();
  const test::FewDescriptors few(kSpare);
  service.resume();
  ASSERT_TRUE(service.events.waitFor("Nothing", kBatch));
  EXPECT_LT(service.events.count("accepted"), kClients);
  // Each client that leaves makes room for another one.
  for (auto& client : clients) {
    ASSERT_TRUE(client->awaitAuthentication().receiveMessage());
    client->close();
  }
  ASSERT_TRUE(service.events.waitFor("invalidated", kClients));
  EXPECT_EQ(service.events.count("interrupted"), 0U);
  const auto lines = _log.lines();
  ASSERT_EQ(lines.size(), 1U);
  EXPECT_EQ(lines[0].level, LogLevel::Critical);
  EXPECT_EQ(lines[0].text, "Cannot accept connections at present: Too many open files");
}

TEST_F(ListenerTest, UsesASocketThatTheServiceManagerPassed) {
  std::filesystem::create_directories(_path.parent_path());
  const auto passed = _folder.path() / "passed";
  std::array<int, 2> input{};
  std::array<int, 2> output{};
  ASSERT_EQ(::pipe2(input.data(), O_CLOEXEC), 0);
  ASSERT_EQ(::pipe2(output.data(), O_CLOEXEC), 0);
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, input[0], STDIN_FILENO);
  posix_spawn_file_actions_adddup2(&actions, output[1], STDOUT_FILENO);
  std::string program = TALLYD_TEST_SERVICE;
  std::string passedText = passed.string();
  std::string ownText = _path.string();
  const std::array<char*, 4> arguments{program.data(), passedText.data(), ownText.data(), nullptr};
  pid_t child = 0;
  ASSERT_EQ(::posix_spawn(&child, program.c_str(), &actions, nullptr, arguments.data(), environ), 0);
  posix_spawn_file_actions_destroy(&actions);
  FileDescriptor toChild(input[1]);
  ::close(input[0]);
  const FileDescriptor fromChild(output[0]);
  ::close(output[1]);

  std::array<char, 6> ready{};
  ASSERT_EQ(::read(fromChild.get(), ready.data(), ready.size()), 6);
  expectServed(passed);
  EXPECT_FALSE(std::filesystem::exists(_path));
  EXPECT_THROW(TestService(_path, _log), std::runtime_error);  // The lock is held all the same.
  toChild.reset();
  int status = 1;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  EXPECT_EQ(status, 0);
  EXPECT_TRUE(std::filesystem::exists(passed));
}

}  // namespace
}  // namespace tallyd::platform
