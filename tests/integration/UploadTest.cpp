// Files on their way from a client through the sandboxed daemon to an upload server.

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <atomic>
#include <fstream>
#include <future>

#include "framework/ClientSessionInterface.h"
#include "integration/TestDaemon.h"
#include "platform/ipc/DBusClientConnection.h"
#include "platform/queues/AsioQueues.h"

namespace tallyd::test {
namespace {

namespace fs = std::filesystem;
using platform::Array;
using platform::Dictionary;
using platform::Value;

/// A client that names files without opening them for the daemon.
class GrantlessClient {
 public:
  explicit GrantlessClient(const TestRoot& root)
      : _connection(
            platform::DBusClientConnection::connect(root.socket(), clientSessionInterface(), _queues)) {}
  ~GrantlessClient() { _connection->close(std::chrono::seconds(5)); }
  GrantlessClient(const GrantlessClient&) = delete;
  GrantlessClient& operator=(const GrantlessClient&) = delete;

  std::vector<Value> call(ClientSessionMethod method, std::vector<Value> arguments) {
    std::promise<platform::DBusClientConnection::Reply> answered;
    _connection->call({static_cast<std::size_t>(method), std::move(arguments), {}}, WatchedProcess::kPatience,
                      [&](auto reply) { answered.set_value(std::move(reply)); });
    auto reply = answered.get_future().get();
    EXPECT_EQ(reply.error, std::nullopt);
    return reply.results;
  }
  bool upload(const fs::path& path) {
    const auto results = call(ClientSessionMethod::UploadFileAtPath,
                              {"file://" + path.string(), "tally.file:" + path.string(), Array()});
    return !results.empty() && results[0].booleanValue();
  }

 private:
  platform::AsioQueues _queues{1};
  const std::shared_ptr<platform::DBusClientConnection> _connection;
};

class UploadTest : public testing::Test {
 protected:
  static constexpr const char* kUdid = "0123456789abcdef0123456789abcdef01234567";
  static constexpr const char* kRefused = "<3>Tally(uploadFileAtPath): Only upload a regular file.";

  UploadTest() {
    storebags.serve("playhall", {{"upload_server", Dictionary{{"post_url", uploads.url("/in")}}}},
                    "max-age=600");
    root.setDevice({{"DeviceName", "Kasten"}, {"UniqueDeviceID", kUdid}});
  }

  static std::unique_ptr<TallyConnection> startedSession(TestDaemon& daemon, std::uint32_t sessionID) {
    auto connection = daemon.connect();
    EXPECT_EQ(connection->setSessionInfoSync(sessionInfo(sessionID), std::nullopt).value, "received");
    EXPECT_EQ(connection->startConfigSync().value, (std::vector<std::string>{"upload_server"}));
    return connection;
  }
  static void write(const fs::path& path, const std::string& bytes) {
    std::ofstream(path, std::ios::binary) << bytes;
  }
  [[nodiscard]] std::string answerLine() const {
    return "<7>Tally(uploadFileAtPath): sending to |" + uploads.url("/in") + "|, Json output: " + answer;
  }

  StorebagServer storebags;
  std::string answer = "{\"success\": true}";
  LoopbackServer uploads{[this](const ReceivedRequest&) { return ServedResponse{.body = answer}; }};
  TestRoot root{storebags};
  fakes::TemporaryFolder outside;  ///< Where the sandbox does not let the daemon look.
};

TEST_F(UploadTest, UploadsAndDeletesAFileOfTheDaemonsOwnFolders) {
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 42);
  root.write("/var/mobile/a b.log", std::string(100'000, 'x') + "end");
  const auto path = root.under("/var/mobile/a b.log");
  EXPECT_TRUE(session->uploadFileSync(path).value);
  const auto requests = uploads.requests();
  ASSERT_EQ(requests.size(), 1U);
  EXPECT_EQ(requests[0].method, "POST");
  EXPECT_EQ(requests[0].target, std::string("/in?uuid=") + kUdid +
                                    "&sequence=42&description=Parlor%20QPRC%20log%20(Uploaded%20by%20PHS)"
                                    "&filename=a%20b.log.gz&raw=true");
  EXPECT_EQ(requests[0].header("Content-Type"), "application/octet-stream");
  EXPECT_EQ(requests[0].header("Content-Encoding"), "gzip");
  EXPECT_EQ(requests[0].body, std::string(100'000, 'x') + "end");
  EXPECT_FALSE(fs::exists(path));

  EXPECT_TRUE(
      daemon.process().waitForLineCount("<7>Tally(uploadFileAtPath): Uploading file " + path.string(), 1));
  EXPECT_TRUE(daemon.process().waitForLineCount(answerLine(), 1));
  EXPECT_TRUE(daemon.process().waitForLineCount("<7>File upload successful for " + path.string(), 1));
  std::string escaped = "file://" + path.string();
  escaped.replace(escaped.find(' '), 1, "%20");
  EXPECT_EQ(root.messageLog(), std::vector{"[uploadFileWithURL] Upload succeeded for file " + escaped});
}

TEST_F(UploadTest, ReadsAFileThatOnlyTheClientsDescriptorReaches) {
  TestDaemon daemon(root);
  const auto path = outside.path() / "far.log";
  const std::string bytes("far\0away", 8);
  write(path, bytes);

  GrantlessClient grantless(root);
  grantless.call(ClientSessionMethod::SetSessionInfo, {Array{sessionInfo(1)}, Array(), Array()});
  grantless.call(ClientSessionMethod::StartConfig, {});
  EXPECT_FALSE(grantless.upload(path));
  EXPECT_TRUE(daemon.process().waitForLineCount("<3>Tally(uploadFileAtPath): Input file is empty", 1));
  EXPECT_EQ(uploads.requests().size(), 0U);

  EXPECT_TRUE(startedSession(daemon, 2)->uploadFileSync(path).value);
  ASSERT_EQ(uploads.requests().size(), 1U);
  EXPECT_EQ(uploads.requests()[0].body, bytes);
  EXPECT_TRUE(fs::exists(path));  // The sandbox lets the daemon delete nothing there.

  EXPECT_FALSE(grantless.upload(path));  // The grant went with the call.
  EXPECT_EQ(uploads.requests().size(), 1U);
}

TEST_F(UploadTest, KeepsTheFileThatTheServerDoesNotTake) {
  answer = "{\"error\": \"full\"}";
  TestDaemon daemon(root);
  root.write("/var/mobile/a.log", "text");
  EXPECT_TRUE(startedSession(daemon, 1)->uploadFileSync(root.under("/var/mobile/a.log")).value);
  EXPECT_TRUE(fs::exists(root.under("/var/mobile/a.log")));
  EXPECT_TRUE(daemon.process().waitForLineCount(answerLine(), 1));
}

TEST_F(UploadTest, LogsAServerThatCannotBeReached) {
  storebags.serve("playhall", {{"upload_server", Dictionary{{"post_url", "http://127.0.0.1:1/in"}}}},
                  "max-age=600");
  TestDaemon daemon(root);
  root.write("/var/mobile/a.log", "text");
  EXPECT_TRUE(startedSession(daemon, 1)->uploadFileSync(root.under("/var/mobile/a.log")).value);
  EXPECT_TRUE(fs::exists(root.under("/var/mobile/a.log")));
  EXPECT_TRUE(daemon.process().waitForLineStartingWith("<3>Tally(uploadFileAtPath): post "));
}

TEST_F(UploadTest, RefusesWhateverIsNoRegularFile) {
  TestDaemon daemon(root);
  auto session = startedSession(daemon, 1);
  const auto below = [this](const std::string& name) { return root.under("/var/mobile/" + name); };
  root.write("/var/mobile/file", "text");
  fs::create_directory(below("folder"));
  ASSERT_EQ(::mkfifo(below("pipe").c_str(), 0600), 0);
  ASSERT_EQ(::mkfifo((outside.path() / "pipe").c_str(), 0600), 0);
  fs::create_symlink(below("file"), below("link"));
  const std::vector<fs::path> others{below("folder"), below("pipe"),          outside.path() / "pipe",
                                     below("link"),   below("missing"),       outside.path(),
                                     "/dev/null",     outside.path() / "none"};
  for (const auto& path : others) EXPECT_FALSE(session->uploadFileSync(path).value) << path;
  EXPECT_TRUE(daemon.process().waitForLineCount(kRefused, others.size()));
  EXPECT_EQ(uploads.requests().size(), 0U);
  EXPECT_TRUE(session->uploadFileSync(below("file")).value);
}

TEST_F(UploadTest, DelaysNobodyWhileAnUploadServerHangs) {
  std::promise<void> release;
  const std::shared_future<void> released = release.get_future().share();
  LoopbackServer hanging([released](const ReceivedRequest&) {
    released.wait();
    return ServedResponse{};
  });
  storebags.serve("vitrine", {{"upload_server", Dictionary{{"post_url", hanging.url()}}}}, "max-age=600");
  TestDaemon daemon(root);
  root.write("/var/mobile/a.log", "text");
  // More than any pool has threads at rest.
  constexpr unsigned kHanging = 8;
  std::vector<std::unique_ptr<TallyConnection>> clients;
  std::atomic<int> answered = 0;
  for (unsigned i = 0; i < kHanging; ++i) {
    clients.push_back(daemon.connect());
    clients.back()->setSessionInfoSync(sessionInfo(100 + i, 6), std::nullopt);
    clients.back()->startConfigSync();
    clients.back()->uploadFile(root.under("/var/mobile/a.log"), [&](const auto&) { ++answered; });
  }
  ASSERT_TRUE(hanging.waitForRequests(kHanging));
  EXPECT_TRUE(startedSession(daemon, 1)->uploadFileSync(root.under("/var/mobile/a.log")).value);
  EXPECT_EQ(answered, 0);
  release.set_value();
  clients.clear();
}

}  // namespace
}  // namespace tallyd::test
