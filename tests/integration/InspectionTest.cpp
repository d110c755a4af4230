// The real daemon's books and its tap, against what real servers received.

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fmt/format.h>

#include <algorithm>
#include <future>

#include "backends/dashboard/Datagram.h"
#include "framework/ClientSessionInterface.h"
#include "integration/InspectionFixture.h"
#include "platform/ipc/DBusClientConnection.h"
#include "platform/queues/AsioQueues.h"
#include "unit/backends/dashboard/LoopbackDashboard.h"

namespace tallyd::test {
namespace {

namespace fs = std::filesystem;
using platform::Dictionary;
using platform::FileDescriptor;
using platform::Value;

sockaddr_un addressOf(const fs::path& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  path.string().copy(address.sun_path, sizeof address.sun_path - 1);
  return address;
}

/// In a child process as another user: 0 when the connection is made and closed by the other side without a
/// word.
int turnedAwayAs(uid_t user, const fs::path& socketPath) {
  const sockaddr_un address = addressOf(socketPath);
  const pid_t child = ::fork();
  if (child == 0) {
    const int socket = ::socket(AF_UNIX, SOCK_STREAM, 0);
    if (::setuid(user) != 0) ::_exit(2);
    if (::connect(socket, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) ::_exit(3);
    char byte = 0;
    ::_exit(::read(socket, &byte, 1) <= 0 ? 0 : 4);
  }
  int status = -1;
  ::waitpid(child, &status, 0);
  return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
}

using InspectionTest = InspectionFixture;

TEST_F(InspectionTest, TheBooksOfASessionAgreeWithItsCollector) {
  TestDaemon daemon(root);
  TallyInspection inspection(inspectionSocket());
  auto session = startedSession(daemon, sessionInfo(42));
  for (int i = 0; i < 20; ++i) session->sendMessageSync(4, 0, Dictionary{{"refuse", i % 4 == 0}});
  const Dictionary during = statsWhen(inspection, [](const Dictionary& stats) {
    return number(rowOf(*stats.dictionary("total"), "splunk"), "sent") == 21;
  });
  const Dictionary live = *(*during.array("sessions"))[0].dictionary();
  EXPECT_EQ(number(live, "sessionID"), 42);
  EXPECT_EQ(number(live, "clientType"), 5);
  EXPECT_EQ(live.string("clientName"), "demo");
  EXPECT_EQ(number(*live.dictionary("messages"), "accepted"), 20);
  EXPECT_EQ(number(*live.dictionary("messages"), "sent"), 20);
  EXPECT_EQ(*during.dictionary("connections"), (Dictionary{{"accepted", 1}, {"open", 1}}));

  session = nullptr;  // Sends the stop record.
  const Dictionary stats = statsWhen(inspection, nothingUnderWay);
  const Dictionary& ended = *stats.dictionary("ended");
  const Dictionary row = rowOf(ended, "splunk");
  EXPECT_EQ(number(ended, "sessions"), 1);
  EXPECT_EQ(number(row, "accepted"), 22);
  EXPECT_EQ(number(row, "sent"), 22);
  EXPECT_EQ(number(row, "refused"), 5);
  EXPECT_EQ(receivedEvents(collector).size(), 22U);
  EXPECT_EQ(*stats.dictionary("total")->dictionary("messages"), *ended.dictionary("messages"));
}

TEST_F(InspectionTest, PostsThatReachNoServerAreDropped) {
  std::string nowhere;
  {
    const LoopbackServer gone;
    nowhere = gone.url("/events");
  }
  postTo(nowhere);
  TestDaemon daemon(root);
  TallyInspection inspection(inspectionSocket());
  auto session = startedSession(daemon, sessionInfo(1, 5, {{"BatchEvent", true}}));
  for (int i = 0; i < 60; ++i) session->sendMessageSync(4, 0, Dictionary{{"i", i}});
  const auto held = inspection.statsSync();
  EXPECT_EQ(number(rowOf(*held.stats.dictionary("total"), "splunk"), "held"), 51);
  session = nullptr;
  const Dictionary row = rowOf(*statsWhen(inspection, nothingUnderWay).dictionary("ended"), "splunk");
  EXPECT_EQ(number(row, "accepted"), 62);
  EXPECT_EQ(number(row, "sent"), 0);
  EXPECT_EQ(*row.dictionary("dropped"), (Dictionary{{"method-limit", 10}, {"post-failed", 52}}));
}

TEST_F(InspectionTest, CountsMessagesThatReachNoBackend) {
  TestDaemon daemon(root);
  TallyInspection inspection(inspectionSocket());
  auto session = daemon.connect();
  session->sendMessageSync(1, 0, Dictionary{{"a", 1}});
  session->uploadLogDataSync({});
  EXPECT_EQ(
      session->sendMessageWithSessionInfoSync(sessionInfo(8), std::nullopt, 5, 0, Dictionary{{"b", 2}}).value,
      "finished");
  session = nullptr;
  const Dictionary ended = *statsWhen(inspection, nothingUnderWay).dictionary("ended");
  EXPECT_EQ(number(*ended.dictionary("messages"), "accepted"), 2);
  EXPECT_EQ(number(*ended.dictionary("messages"), "sent"), 1);
  EXPECT_EQ(*ended.dictionary("messages")->dictionary("dropped"), (Dictionary{{"no-backends", 1}}));
  EXPECT_EQ(*ended.dictionary("uploads")->dictionary("dropped"), (Dictionary{{"no-backends", 1}}));
  EXPECT_EQ(number(rowOf(ended, "splunk"), "sent"), 1);
}

TEST_F(InspectionTest, TheTapShowsTheDocumentThatTheCollectorReceived) {
  TestDaemon daemon(root);
  TallyInspection inspection(inspectionSocket());
  TapEnd tap;
  ASSERT_EQ(inspection.tapSync(std::move(tap.writing)), std::nullopt);
  const auto session = startedSession(daemon, sessionInfo(42));
  session->sendMessageSync(3, 0, Dictionary{{"text", "\"quoted\"\n"}});
  ASSERT_TRUE(collector.waitForRequests(2));
  std::vector<std::string> posts;
  std::vector<Dictionary> results;
  while (posts.size() < 2 || results.size() < 2) {
    const std::string line = tap.next().value_or("");
    const Dictionary event = parsed(line);
    ASSERT_EQ(event.string("kind"), "post") << line;
    EXPECT_EQ(number(event, "sessionID"), 42);
    EXPECT_EQ(event.string("backend"), "splunk");
    EXPECT_EQ(event.string("backendKind"), "https-post");
    if (event.contains("result")) {
      results.push_back(*event.dictionary("result"));
    } else {
      posts.push_back(line);
      EXPECT_EQ(event.string("url"), collector.url("/events"));
      EXPECT_EQ(number(event, "events"), 1);
    }
  }
  // Two posts may overtake each other.
  for (const auto& request : collector.requests()) {
    EXPECT_TRUE(std::any_of(posts.begin(), posts.end(), [&](const std::string& post) {
      return post.ends_with("\"document\":" + request.body + "}");
    })) << request.body;
  }
  EXPECT_EQ(results[0], (Dictionary{{"status", 200}}));
}

TEST_F(InspectionTest, TheTapShowsTheDatagramThatTheServerReceived) {
  LoopbackDashboard server;
  storebags.serve("playhall", {{"dashboard", Dictionary{{"ip", "127.0.0.1"}, {"port", server.port()}}}},
                  "max-age=600");
  TestDaemon daemon(root);
  TallyInspection inspection(inspectionSocket());
  TapEnd tap;
  ASSERT_EQ(inspection.tapSync(std::move(tap.writing)), std::nullopt);
  auto session = startedSession(daemon, sessionInfo(42));
  const auto datagram = server.waitForDatagram();
  ASSERT_TRUE(datagram);
  const Dictionary event = parsed(tap.next().value_or(""));
  EXPECT_EQ(event.string("kind"), "datagram");
  EXPECT_EQ(event.string("server"), "127.0.0.1:" + std::to_string(server.port()));
  std::string hexadecimal;
  for (const char byte : *datagram) hexadecimal += fmt::format("{:02x}", static_cast<unsigned char>(byte));
  EXPECT_EQ(event.string("bytes"), hexadecimal);
  session = nullptr;
  const Dictionary stats = statsWhen(inspection, nothingUnderWay);
  EXPECT_EQ(number(rowOf(*stats.dictionary("ended"), "dashboard"), "sent"), 2);
}

TEST_F(InspectionTest, ASlowReaderOfTheTapDelaysNobody) {
  TestDaemon daemon(root);
  TallyInspection inspection(inspectionSocket());
  TapEnd tap;
  ASSERT_EQ(inspection.tapSync(std::move(tap.writing)), std::nullopt);
  const auto session = startedSession(daemon, sessionInfo(42));
  const std::string text(64'000, 'x');
  constexpr int kMessages = 150;  // More than twice what is kept for one reader.
  for (int i = 0; i < kMessages; ++i) {
    ASSERT_TRUE(session->sendMessageSync(3, 0, Dictionary{{"text", text}}).value);
  }
  ASSERT_TRUE(collector.waitForRequests(kMessages + 1));
  std::int64_t documents = 0;
  std::int64_t missed = 0;
  while (missed == 0) {
    const Dictionary event = parsed(tap.next().value_or(""));
    ASSERT_FALSE(event.empty());
    if (event.string("kind") == "missed") missed = number(event, "count");
    if (event.contains("document")) ++documents;
  }
  EXPECT_GT(documents, 30);
  EXPECT_GT(missed, 0);
  EXPECT_LT(documents, kMessages);
}

TEST_F(InspectionTest, TheTapEndsWithItsConnection) {
  TestDaemon daemon(root);
  TapEnd tap;
  {
    TallyInspection inspection(inspectionSocket());
    ASSERT_EQ(inspection.tapSync(std::move(tap.writing)), std::nullopt);
  }
  EXPECT_TRUE(tap.ended());
}

TEST_F(InspectionTest, TheTapTakesPipesAndSocketsOnly) {
  TestDaemon daemon(root);
  TallyInspection inspection(inspectionSocket());
  EXPECT_TRUE(inspection.tapSync(FileDescriptor(::open("/dev/null", O_WRONLY | O_CLOEXEC))));
  TapEnd tap(TapEnd::Kind::Socket);
  EXPECT_EQ(inspection.tapSync(std::move(tap.writing)), std::nullopt);
}

TEST_F(InspectionTest, IsForRootAndTheDaemonsOwnUserOnly) {
  TestDaemon daemon(root);
  struct stat facts {};
  ASSERT_EQ(::stat(inspectionSocket().c_str(), &facts), 0);
  EXPECT_EQ(facts.st_mode & 0777U, 0600U);
  ASSERT_EQ(::stat(root.socket().c_str(), &facts), 0);
  EXPECT_EQ(facts.st_mode & 0777U, 0666U);
  if (::geteuid() != 0) return;  // Only root can be somebody else.
  constexpr uid_t kNobody = 65'534;
  // The mode out of the way, the credentials still stand.
  for (fs::path folder = inspectionSocket().parent_path(); folder != root.root().directory().parent_path();
       folder = folder.parent_path()) {
    fs::permissions(folder, fs::perms::group_exec | fs::perms::others_exec, fs::perm_options::add);
  }
  EXPECT_EQ(turnedAwayAs(kNobody, inspectionSocket()), 3);
  fs::permissions(inspectionSocket(), fs::perms::all);
  EXPECT_EQ(turnedAwayAs(kNobody, inspectionSocket()), 0);
  EXPECT_TRUE(daemon.process().waitForLineStartingWith("<4>Inspection is not for this client of process "));
}

TEST_F(InspectionTest, TheClientsSocketDoesNotOfferIt) {
  TestDaemon daemon(root);
  platform::AsioQueues queues{1};
  const auto connection =
      platform::DBusClientConnection::connect(root.socket(), inspectionInterface(), queues);
  std::promise<std::optional<std::string>> answered;
  connection->call({static_cast<std::size_t>(InspectionMethod::Stats), {}, {}}, WatchedProcess::kPatience,
                   [&](auto reply) { answered.set_value(std::move(reply.error)); });
  EXPECT_TRUE(answered.get_future().get());
  connection->close(std::chrono::seconds(5));
}

TEST_F(InspectionTest, IsThereBesideASocketThatTheServiceManagerPassed) {
  const fakes::TemporaryFolder elsewhere;
  const FileDescriptor listener(::socket(AF_UNIX, SOCK_STREAM, 0));
  const sockaddr_un address = addressOf(elsewhere.path() / "passed");
  ASSERT_EQ(::bind(listener.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  ASSERT_EQ(::listen(listener.get(), 16), 0);
  TestDaemon daemon(root, {.passedSocket = listener.get()});
  TallyInspection inspection(inspectionSocket());
  EXPECT_EQ(inspection.statsSync().error, std::nullopt);
}

TEST_F(InspectionTest, TheDaemonDoesItsWorkWithoutIt) {
  fs::create_directories(inspectionSocket() / "in the way");
  TestDaemon daemon(root);
  EXPECT_TRUE(daemon.process().waitForLineStartingWith("<4>Running without inspection: "));
  const auto session = startedSession(daemon, sessionInfo(42));
  EXPECT_TRUE(session->sendMessageSync(3, 0, Dictionary{{"a", 1}}).value);
}

}  // namespace
}  // namespace tallyd::test
