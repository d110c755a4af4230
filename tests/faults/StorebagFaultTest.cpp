// Storebag servers that hang, break off, send without end or sign with the wrong key.

#include <gtest/gtest.h>

#include <atomic>
#include <fstream>
#include <future>

#include "fakes/FakePlatform.h"
#include "fakes/SignedStorebag.h"
#include "faults/StorebagFaultFixture.h"
#include "platform/http/CurlHTTPClient.h"
#include "platform/queues/AsioQueues.h"
#include "storebag/StorebagCache.h"
#include "support/TLSServer.h"

namespace tallyd::test {
namespace {

using platform::Dictionary;

class StorebagFaultTest : public StorebagFaultFixture {};

TEST_F(StorebagFaultTest, DelaysNobodyWhileAServerHangs) {
  std::promise<void> answered;
  auto server =
      std::make_unique<TLSServer>(loopbackIdentity(storebags.authority()),
                                  serveWith([](TLSConnection& connection) { connection.waitForClose(); }));
  useServer(*server);
  TestDaemon daemon(root);
  auto hanging = daemon.connect();
  hanging->setSessionInfoSync(sessionInfo(7, 6), std::nullopt);
  hanging->startConfig([&](const auto&) { answered.set_value(); });
  ASSERT_TRUE(daemon.process().waitForLine("<7>Fetching storebag for client type 6"));
  expectOthersServed(daemon);
  auto answer = answered.get_future();
  EXPECT_EQ(answer.wait_for(std::chrono::seconds(0)), std::future_status::timeout);
  server.reset();
  EXPECT_EQ(answer.wait_for(WatchedProcess::kPatience), std::future_status::ready);
}

TEST_F(StorebagFaultTest, TakesNoHalfOfABody) {
  const std::string half = brokenOffText();
  const TLSServer server(loopbackIdentity(storebags.authority()), serveWith([&](TLSConnection& connection) {
                           connection.write(half);
                           connection.close();
                         }));
  useServer(server);
  TestDaemon daemon(root);
  expectNoStorebag(daemon);
  expectOthersServed(daemon);
}

TEST_F(StorebagFaultTest, BoundsTheMemoryThatABodyOfAGibibyteTakes) {
  std::atomic<std::size_t> written = 0;
  const TLSServer server(loopbackIdentity(storebags.authority()),
                         serveWith([&](TLSConnection& connection) { writeGibibyte(connection, written); }));
  useServer(server);
  TestDaemon daemon(root);
  expectOthersServed(daemon);
  const std::size_t before = figuresOf(daemon.process().pid()).residentBytes;
  expectNoStorebag(daemon);
  // The bound of a response is 16 MiB; a text that grows is there twice for a moment.
  constexpr std::size_t kMost = (std::size_t{56} << 20U) * kSanitizersShare;
  EXPECT_LT(figuresOf(daemon.process().pid()).peakBytes, before + kMost);
  EXPECT_LT(written, std::size_t{64} << 20U);
}

TEST_F(StorebagFaultTest, TakesNoBagThatAnotherKeyHasSigned) {
  const std::string forged = forgedText();
  const TLSServer server(loopbackIdentity(storebags.authority()),
                         serveWith([&](TLSConnection& connection) { connection.write(forged); }));
  useServer(server);
  TestDaemon daemon(root);
  expectNoStorebag(daemon);
  expectOthersServed(daemon);
}

/// A daemon tries a server again after 900 s at the earliest: here the clock stands in the test's hands, and
/// the rest, from the cache down to the socket, is real.
class StorebagRecoveryTest : public testing::Test {
 protected:
  enum class Conduct { Good, HalfABody, NoBody, WrongSignature, HangsUp, Error };

  StorebagRecoveryTest() {
    const auto file = fake.folder.path() / "etc/tally/ca.pem";
    std::filesystem::create_directories(file.parent_path());
    std::ofstream(file) << authority.certificatePEM();
    fake.frameworkBundle.resources["publicKey.der"] = fakes::StorebagSigner::server().subjectPublicKeyInfo();
    fake.preferences.set("com.quillon.tally", "tally_storebag_url", server.url("/bags"));
  }

  void serve(TLSConnection& connection) {
    if (connection.readRequest().empty()) return;
    const int number = ++requests;
    const Dictionary bag{{"version", std::to_string(number)}, {"release", storebagWithHTTPSPost()}};
    const std::string body = fakes::StorebagSigner::server().envelope(bag);
    const auto text = [](std::string served) {
      return httpText({.body = std::move(served), .headers = {{"Cache-Control", "max-age=600"}}});
    };
    switch (conduct) {
      case Conduct::Good:
        return connection.write(text(body));
      case Conduct::HalfABody:
        return connection.write(text(body).substr(0, body.size() / 2));
      case Conduct::NoBody:
        return connection.write(text(""));
      case Conduct::WrongSignature:
        return connection.write(text(fakes::StorebagSigner::stranger().envelope(bag)));
      case Conduct::HangsUp:
        return connection.reset();
      case Conduct::Error:
        return connection.write(httpText({.status = 503}));
    }
  }

  std::atomic<Conduct> conduct = Conduct::Good;
  std::atomic<int> requests = 0;
  const signing::CertificateAuthority authority{"Test authority"};
  const TLSServer server{loopbackIdentity(authority),
                         [this](TLSConnection& connection) { serve(connection); }};
  fakes::FakePlatform fake;
  platform::AsioQueues queues;
  platform::CurlHTTPClient http{fake.root, queues, fake.log};
  platform::Platform platform{
      fake.root,     fake.log,         fake.clock,    fake.randomness, fake.locale,          queues,
      http,          fake.preferences, fake.defaults, fake.device,     fake.frameworkBundle, fake.sandbox,
      fake.powerLog, fake.codeBundles, fake.process};
  StorebagCache cache{platform};
};

TEST_F(StorebagRecoveryTest, ServesTheOldStorebagThroughEveryFaultAndTheNewOneAfterwards) {
  ASSERT_TRUE(cache.storebag(1, 5));
  EXPECT_EQ(cache.version(5), "1");
  fake.clock.advance(std::chrono::seconds(600));
  for (const Conduct fault :
       {Conduct::HalfABody, Conduct::NoBody, Conduct::WrongSignature, Conduct::HangsUp, Conduct::Error}) {
    conduct = fault;
    const int before = requests;
    EXPECT_TRUE(cache.storebag(1, 5)) << "the old one";
    EXPECT_GT(requests, before);
    const int asked = requests;
    fake.clock.advance(std::chrono::seconds(899));
    conduct = Conduct::Good;
    EXPECT_TRUE(cache.storebag(1, 5)) << "the old one";
    EXPECT_EQ(requests, asked) << "too early";
    EXPECT_EQ(cache.version(5), std::nullopt);
    fake.clock.advance(std::chrono::seconds(1));
    EXPECT_TRUE(cache.storebag(1, 5));
    EXPECT_EQ(cache.version(5), std::to_string(asked + 1));
    fake.clock.advance(std::chrono::seconds(600));
  }
}

}  // namespace
}  // namespace tallyd::test
