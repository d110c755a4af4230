// Which servers are believed, and HTTP/2 with those that are.

#include <gmock/gmock.h>

#include <fstream>
#include <set>

#include "HTTPClientFixture.h"
#include "support/LoopbackServer.h"
#include "support/NginxProxy.h"

namespace tallyd::platform {

using signing::CertificateAuthority;
using test::loopbackIdentity;
using test::LoopbackServer;
using test::NginxProxy;
using testing::HasSubstr;

class TrustTest : public HTTPClientTest {
 protected:
  [[nodiscard]] std::filesystem::path authoritiesFile() const { return folder.path() / "etc/tally/ca.pem"; }
  void writeAuthorities(const std::string& text) const {
    std::filesystem::create_directories(authoritiesFile().parent_path());
    std::ofstream(authoritiesFile()) << text;
  }
  [[nodiscard]] std::size_t linesNamingTheFile() const {
    const auto lines = log.lines();
    return static_cast<std::size_t>(std::count_if(lines.begin(), lines.end(), [this](const auto& line) {
      return line.level == LogLevel::Error && line.text.find(authoritiesFile().string()) != std::string::npos;
    }));
  }

  const CertificateAuthority authority{"Test authority"};
};

TEST_F(TrustTest, RefusesAnUnknownAuthority) {
  const LoopbackServer server(loopbackIdentity(authority));
  const auto client = makeClient();
  EXPECT_THAT(errorOf(client->sendSynchronousRequest(get(server.url()))), HasSubstr("certificate"));
  client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  EXPECT_THAT(errorOf(completions.wait(1).at(0)), HasSubstr("certificate"));
  EXPECT_TRUE(server.requests().empty());
  EXPECT_TRUE(log.lines().empty());
}

TEST_F(TrustTest, AcceptsTheAuthoritiesOfTheFile) {
  writeAuthorities(CertificateAuthority("Another authority").certificatePEM() + authority.certificatePEM());
  const LoopbackServer server(loopbackIdentity(authority));
  const auto client = makeClient();
  EXPECT_EQ(statusOf(client->sendSynchronousRequest(get(server.url()))), 200);
  client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
  EXPECT_EQ(statusOf(completions.wait(1).at(0)), 200);
  EXPECT_TRUE(log.lines().empty());
}

TEST_F(TrustTest, RefusesACertificateForAnotherName) {
  writeAuthorities(authority.certificatePEM());
  const LoopbackServer server(authority.issue({"DNS:collector.example"}));
  EXPECT_TRUE(makeClient()->sendSynchronousRequest(get(server.url())).error);
  EXPECT_TRUE(server.requests().empty());
}

TEST_F(TrustTest, RefusesAnAuthorityOfTheSameNameWithAnotherKey) {
  writeAuthorities(CertificateAuthority("Test authority").certificatePEM());
  const LoopbackServer server(loopbackIdentity(authority));
  EXPECT_TRUE(makeClient()->sendSynchronousRequest(get(server.url())).error);
}

TEST_F(TrustTest, SaysOnceThatTheFileIsBroken) {
  for (const std::string& broken :
       {std::string(), std::string("not a certificate"),
        authority.certificatePEM().substr(0, 300) + "\n-----END CERTIFICATE-----\n"}) {
    writeAuthorities(broken);
    log.clear();
    const LoopbackServer server(loopbackIdentity(authority));
    const auto client = makeClient();
    for (int i = 0; i < 3; ++i) EXPECT_TRUE(client->sendSynchronousRequest(get(server.url())).error);
    EXPECT_EQ(linesNamingTheFile(), 1U) << broken;
  }
}

TEST_F(TrustTest, ReusesTLSConnections) {
  writeAuthorities(authority.certificatePEM());
  const LoopbackServer server(loopbackIdentity(authority));
  const auto client = makeClient();
  for (std::size_t i = 1; i <= 20; ++i) {
    client->sendAsynchronousRequest(post(server.url(), "{}"), queue, completions.next());
    EXPECT_EQ(statusOf(completions.wait(i).back()), 200);
  }
  EXPECT_EQ(server.connectionCount(), 1U);
}

TEST_F(TrustTest, SendsABurstOverOneHTTP2Connection) {
  ASSERT_TRUE(NginxProxy::isInstalled());
  writeAuthorities(authority.certificatePEM());
  const LoopbackServer collector;
  const NginxProxy front(loopbackIdentity(authority), collector.port());
  const auto client = makeClient();
  for (int i = 0; i < 20; ++i) {
    client->sendAsynchronousRequest(post(front.url("/events"), "{\"number\":" + std::to_string(i) + "}"),
                                    queue, completions.next());
  }
  for (const HTTPResult& result : completions.wait(20)) EXPECT_EQ(statusOf(result), 200) << errorOf(result);

  std::set<std::string> bodies;
  std::set<std::string> connections;
  for (const auto& request : collector.requests()) {
    bodies.insert(request.body);
    connections.insert(request.header("X-Front-Connection").value_or("none"));
    EXPECT_EQ(request.header("X-Front-Protocol"), "HTTP/2.0");
  }
  EXPECT_EQ(bodies.size(), 20U);
  EXPECT_EQ(connections.size(), 1U);
}

}  // namespace tallyd::platform
