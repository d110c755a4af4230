// What must cost at most the session that it came from.

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include "integration/TestDaemon.h"

namespace tallyd::test {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::FileDescriptor;
using platform::Value;

class BadInputTest : public testing::Test {
 protected:
  BadInputTest() {
    storebags.serve("playhall", storebagWithHTTPSPost(), "max-age=600");
    root.setPreferences("com.quillon.tally", {{"tally_storebag_url", storebags.baseURL()},
                                              {"httpsPostURL", collector.url("/events")}});
  }

  FileDescriptor rawConnection() const {
    FileDescriptor descriptor(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    root.socket().string().copy(address.sun_path, sizeof address.sun_path - 1);
    EXPECT_EQ(::connect(descriptor.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
    return descriptor;
  }
  static void send(const FileDescriptor& descriptor, std::string_view bytes) {
    EXPECT_EQ(::send(descriptor.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL),
              static_cast<ssize_t>(bytes.size()));
  }
  static std::string receiveUntilClosed(const FileDescriptor& descriptor) {
    std::string received;
    char buffer[1024];
    ssize_t got = 0;
    while ((got = ::recv(descriptor.get(), buffer, sizeof buffer, 0)) > 0) {
      received.append(buffer, static_cast<std::size_t>(got));
    }
    return received;
  }
  /// A session of another client, which must notice nothing.
  void expectDaemonServes(TestDaemon& daemon) {
    auto connection = daemon.connect();
    EXPECT_EQ(connection->setSessionInfoSync(sessionInfo(999), std::nullopt).value, "received");
    EXPECT_EQ(connection->startConfigSync().value, (std::vector<std::string>{"splunk"}));
  }

  StorebagServer storebags;
  LoopbackServer collector;
  TestRoot root{storebags};
};

TEST_F(BadInputTest, HangsUpOnBytesThatAreNoDBus) {
  TestDaemon daemon(root);
  auto bystander = daemon.connect();
  for (const std::string& bytes : {std::string("GET / HTTP/1.1\r\n\r\n"),
                                   std::string(1, '\0') + "AUTH NONSENSE\r\n" + std::string(100'000, 'x')}) {
    const FileDescriptor connection = rawConnection();
    ::send(connection.get(), bytes.data(), bytes.size(), MSG_NOSIGNAL);
    ::shutdown(connection.get(), SHUT_WR);
    receiveUntilClosed(connection);
  }
  EXPECT_EQ(bystander->setSessionInfoSync(sessionInfo(1), std::nullopt).value, "received");
  expectDaemonServes(daemon);
}

TEST_F(BadInputTest, InterruptsAConnectionThatBreaksWithinAMessage) {
  TestDaemon daemon(root);
  {
    const FileDescriptor connection = rawConnection();
    const std::string halfAHeader("l\x01\x00\x01\x10\x00\x00\x00", 8);  // Little-endian.
    send(connection, std::string(1, '\0') + "AUTH ANONYMOUS\r\nBEGIN\r\n" + halfAHeader);
  }
  EXPECT_TRUE(daemon.process().waitForLineStartingWith("<7>XPC connection to <TallydSession: "));
  const auto ended = [&](const char* how) {
    for (const auto& line : daemon.process().lines()) {
      if (line.starts_with("<7>XPC connection to ") && line.ends_with(how)) return true;
    }
    return false;
  };
  EXPECT_TRUE(daemon.process().waitForLine("<7>TallydSession dealloc: 0"));
  EXPECT_TRUE(ended("was interrupted"));
  EXPECT_TRUE(ended("was invalidated"));
  expectDaemonServes(daemon);
}

TEST_F(BadInputTest, RejectsArgumentsOfTheWrongTypeAndGoesOn) {
  TestDaemon daemon(root);
  WatchedProcess call(
      {.arguments = {"/usr/bin/busctl", "--address=unix:path=" + root.socket().string(), "call",
                     "com.quillon.tallyd", "/com/quillon/tallyd", "com.quillon.tallyd.ClientSessionInterface",
                     "FetchStates", "s", "wrong"}});
  EXPECT_EQ(call.wait().code, 1);
  EXPECT_NE(call.output().find("Invalid"), std::string::npos) << call.output();
  EXPECT_EQ(daemon.process().count("<7>Fetching states for session 0"), 0U);
  expectDaemonServes(daemon);
}

TEST_F(BadInputTest, TakesALargePayloadAndADeepOne) {
  TestDaemon daemon(root);
  auto connection = daemon.connect();
  connection->setSessionInfoSync(sessionInfo(1), std::nullopt);
  connection->startConfigSync();
  EXPECT_EQ(connection->sendMessageSync(1, 0, Dictionary{{"text", std::string(48U << 20U, 'x')}}).error,
            std::nullopt);
  Value deep("bottom");
  for (int i = 0; i < 20; ++i) deep = Array{deep};
  EXPECT_EQ(connection->sendMessageSync(1, 0, Dictionary{{"deep", deep}}).error, std::nullopt);
  ASSERT_TRUE(collector.waitForRequests(3));
  EXPECT_TRUE(daemon.process().waitForLineStartingWith(
      "<4>Tally: NSJSONSerialization unable to handle key: deep, value: ((("));
  expectDaemonServes(daemon);
}

TEST_F(BadInputTest, LeavesAClientThatSaysNothingToItself) {
  TestDaemon daemon(root);
  const FileDescriptor silent = rawConnection();
  send(silent, std::string(1, '\0') + "AUTH ANONYMOUS\r\nBEGIN\r\n");
  expectDaemonServes(daemon);
}

TEST_F(BadInputTest, TakesStorebagsWithValuesOfTheWrongType) {
  storebags.serve(
      "vitrine",
      {{"splunk", 5}, {"dashboard", Array{Value(1)}}, {"https_post", Dictionary{{"clients", "x"}}}},
      "max-age=600");
  storebags.serveBag("dialhouse", Dictionary{{"version", 3}, {"release", "text"}}, "max-age=600");
  storebags.serveBag("lanternbox", Array{Value("no dictionary")}, "max-age=600");
  storebags.serveWith("broadwave", [](const ReceivedRequest&) { return ServedResponse{.body = "{{{"}; });
  TestDaemon daemon(root);
  for (const std::int32_t clientType : {6, 7, 8, 9}) {
    auto connection = daemon.connect();
    connection->setSessionInfoSync(sessionInfo(1, clientType), std::nullopt);
    const auto states = connection->startConfigSync();
    EXPECT_EQ(states.error, std::nullopt);
    EXPECT_EQ(states.value.value_or(std::vector<std::string>()), std::vector<std::string>()) << clientType;
  }
  EXPECT_EQ(daemon.process().countOnce("<3>Storebag entry splunk is not a dictionary", 1), 1U);
  EXPECT_EQ(daemon.process().countOnce("<3>Tally(HTTPSPostBackend): can't find the client list.", 1), 1U);
  EXPECT_EQ(
      daemon.process().countOnce("<2>Could not find storebag for client type 7 with release environment", 1),
      1U);
  EXPECT_EQ(daemon.process().countOnce("<2>Could not fetch storebag for client type 8", 1), 1U);
  EXPECT_TRUE(daemon.process().waitForLineStartingWith("<2>propertyListWithData error "));
  expectDaemonServes(daemon);
}

TEST_F(BadInputTest, RefusesASignatureOfTheWrongLength) {
  ServedResponse response =
      storebags.signedBag(Dictionary{{"version", "1"}, {"release", storebagWithHTTPSPost()}}, "max-age=5");
  const auto start = response.body.find("<key>signature</key>");
  const auto text = response.body.find("<string>", start) + std::string("<string>").size();
  response.body.replace(text, response.body.find("</string>", text) - text, "AAAA");
  storebags.serveWith("vitrine", [response](const ReceivedRequest&) { return response; });
  TestDaemon daemon(root);
  auto connection = daemon.connect();
  connection->setSessionInfoSync(sessionInfo(1, 6), std::nullopt);
  EXPECT_EQ(connection->startConfigSync().value, std::nullopt);
  EXPECT_TRUE(daemon.process().waitForLineStartingWith("<2>Signature can not be verified, 0x"));
  expectDaemonServes(daemon);
}

TEST_F(BadInputTest, GoesOnWhenTheDiskIsFullUnderTheMessageLog) {
  root.setPreferences("com.quillon.diagnostics", {{"DiagnosticLogSubmissionEnabled", true}});
  root.write("/var/lib/tallyd/com.quillon.tallyd.plist",
             "<plist version=\"1.0\"><dict><key>logFilePath</key><string>/dev/full</string>"
             "<key>logFileCreationDate</key><date>2999-01-01T00:00:00Z</date></dict></plist>");
  TestDaemon daemon(root, {.arguments = {"--no-sandbox"}});
  expectDaemonServes(daemon);
  EXPECT_TRUE(
      daemon.process().waitForLine("<2>Error writing to tallyd log file /dev/full: No space left on device"));
  EXPECT_TRUE(collector.waitForRequests(1));
}

TEST_F(BadInputTest, WaitsForDescriptorsWhenNoneIsLeftAndServesAfterwards) {
  TestDaemon daemon(root, {.descriptorLimit = 40});
  {
    std::vector<FileDescriptor> greedy;
    for (int i = 0; i < 60; ++i) greedy.push_back(rawConnection());
    EXPECT_TRUE(daemon.process().waitForLineStartingWith("<2>"));
  }
  expectDaemonServes(daemon);
}

}  // namespace
}  // namespace tallyd::test
