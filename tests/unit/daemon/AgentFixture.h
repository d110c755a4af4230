// An agent whose storebag server serves every client type.
#pragma once

#include <gtest/gtest.h>

#include <map>
#include <memory>

#include "daemon/TallydAgent.h"
#include "fakes/FakeIPC.h"
#include "fakes/FakePlatform.h"
#include "fakes/SignedStorebag.h"
#include "framework/TallyKeys.h"

namespace tallyd {

/// Answers as a storebag server: the sessions of "playhall" (client type 5) have hierarchy 1, those of
/// "vitrine" (6) hierarchy 2, those of "dialhouse" (7) hierarchy 3. Clients called "phone" report.
class StorebagServer {
 public:
  explicit StorebagServer(std::string cacheControl = "max-age=600") : _cacheControl(std::move(cacheControl)) {
    std::int64_t hierarchy = 0;
    for (const char* name : {"playhall", "vitrine", "dialhouse"}) _bodies[name] = body(++hierarchy);
  }

  platform::HTTPResult operator()(const platform::HTTPRequest& request) const {
    for (const auto& [name, body] : _bodies) {
      if (request.url.find("/" + name + "?") != std::string::npos) {
        return fakes::FakeHTTPClient::ok(body, {{"Cache-Control", _cacheControl}});
      }
    }
    return fakes::FakeHTTPClient::ok("");
  }

 private:
  static std::string body(std::int64_t hierarchy) {
    using platform::Array;
    using platform::Dictionary;
    const Dictionary client{
        {"client", "phone"},  {"hierarchy", hierarchy},    {"locale_whitelist", Array({"DE"})},
        {"filters", Array()}, {"sampling_threshold", 1.0}, {"post_url", "https://post.test/in"}};
    const Dictionary release{{"splunk", Dictionary{{"clients", Array({client})}}}};
    return fakes::StorebagSigner::server().envelope(Dictionary{{"version", "bag 17"}, {"release", release}});
  }

  std::string _cacheControl;
  std::map<std::string, std::string> _bodies;
};

class AgentFixture : public testing::Test {
 protected:
  using Dictionary = platform::Dictionary;
  using Value = platform::Value;
  using Lines = std::vector<fakes::FakeLog::Line>;
  using Connection = std::shared_ptr<fakes::FakeServiceConnection>;

  AgentFixture() {
    fake.frameworkBundle.resources["publicKey.der"] = fakes::StorebagSigner::server().subjectPublicKeyInfo();
    fake.preferences.set("com.quillon.diagnostics", "DiagnosticLogSubmissionEnabled", true);
    fake.http.answer = StorebagServer();
  }

  static Dictionary sessionInfo(std::int64_t sessionID, std::int64_t clientType) {
    return {{std::string(kTallySessionInfoSessionID), sessionID},
            {std::string(kTallySessionInfoClientType), clientType},
            {std::string(kTallySessionInfoRequireUserInfo), true}};
  }
  static Dictionary userInfo(const char* client, const char* service) {
    return {{std::string(kTallyUserInfoClientName), client},
            {std::string(kTallyUserInfoServiceName), service}};
  }
  static Value none() { return platform::Array(); }
  static Value some(const Dictionary& dictionary) {
    platform::Array list;
    list.append(dictionary);
    return list;
  }

  Connection connect() {
    auto connection = std::make_shared<fakes::FakeServiceConnection>();
    EXPECT_TRUE(agent.shouldAcceptNewConnection(connection));
    return connection;
  }
  static void configure(const Connection& connection, std::int64_t sessionID, std::int64_t clientType,
                        const Value& user = none()) {
    connection->call("SetSessionInfo", {some(sessionInfo(sessionID, clientType)), user, none()});
  }
  /// "SESSIONS(GROUPS)" as the next connection's acceptance counts them.
  std::string counts() {
    fake.log.clear();
    const Connection next = connect();
    std::string text = fake.log.lines().at(0).text;
    next->invalidate();
    fake.log.clear();
    const std::string start = "Accepting new XPC connection client 1 of user 0, ";
    const std::string end = " connections.";
    EXPECT_TRUE(text.starts_with(start) && text.ends_with(end)) << text;
    return text.substr(start.size(), text.size() - start.size() - end.size());
  }

  static fakes::FakeLog::Line critical(std::string text) {
    return {platform::LogLevel::Critical, std::move(text)};
  }
  static fakes::FakeLog::Line debug(std::string text) { return {platform::LogLevel::Debug, std::move(text)}; }

  fakes::FakePlatform fake;
  const platform::Platform& platform = fake.platform;
  std::unique_ptr<TallydAgent> ownedAgent = std::make_unique<TallydAgent>(platform);
  TallydAgent& agent = *ownedAgent;
};

}  // namespace tallyd
