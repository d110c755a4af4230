// One session with a scripted agent and scripted backends.
#pragma once

#include <gtest/gtest.h>

#include <fstream>

#include "ScriptedBackends.h"
#include "fakes/FakePlatform.h"
#include "fakes/FakeSessionDelegate.h"
#include "framework/TallyKeys.h"
#include "session/TallydSession.h"
#include "support/MessageLog.h"

namespace tallyd {

class SessionFixture : public testing::Test {
 protected:
  using Dictionary = platform::Dictionary;
  using Info = TallydSession::Info;
  using Lines = std::vector<fakes::FakeLog::Line>;
  using Names = TallydSession::Names;
  using Texts = std::vector<std::string>;

  SessionFixture() {
    // The message log's files are made at the true time: the clock starts there.
    fake.clock.set(std::chrono::duration_cast<std::chrono::microseconds>(
        std::chrono::system_clock::now().time_since_epoch()));
  }

  std::shared_ptr<TallydSession> makeSession() {
    return std::make_shared<TallydSession>(delegate, platform, messageLog, backends.factory());
  }
  static Dictionary sessionInfo(std::int64_t sessionID = 7) {
    return {{std::string(kTallySessionInfoSessionID), sessionID},
            {std::string(kTallySessionInfoClientType), 5}};
  }
  static Dictionary userInfo(const char* client, const char* service) {
    return {{std::string(kTallyUserInfoClientName), client},
            {std::string(kTallyUserInfoServiceName), service}};
  }
  void configure(TallydSession& session, const Info& info = sessionInfo(), const Info& user = std::nullopt) {
    session.setSessionInfo(info, user, {}, [this](const std::string& text) { replies.push_back(text); });
  }
  /// Starts on a storebag with the scripted backends; what was noted until then is forgotten.
  std::optional<Names> start(TallydSession& session) {
    delegate.storebag = backends.storebag();
    std::optional<Names> states;
    session.startConfigWithCompletionHandler([&](const auto& given) { states = given; });
    forget();
    return states;
  }
  std::shared_ptr<TallydSession> startedSession() {
    auto session = makeSession();
    configure(*session);
    start(*session);
    return session;
  }
  void forget() {
    fake.log.clear();
    backends.trace.clear();
    backends.messages.clear();
    backends.requests.clear();
    delegate.asked.clear();
    replies.clear();
  }

  /// The log without the message log's lines about its files, which alone are at the info level.
  Lines lines() const {
    Lines all = fake.log.lines();
    std::erase_if(all, [](const auto& line) { return line.level == platform::LogLevel::Info; });
    return all;
  }
  /// The message log's lines without their dates.
  Texts messageLogLines() const {
    Texts all;
    const auto path = fake.defaults.value("logFilePath");
    if (!path) return all;
    std::ifstream file{std::string(*path->string())};
    for (std::string line; std::getline(file, line);) all.push_back(line.substr(line.find(") ") + 2));
    return all;
  }

  static fakes::FakeLog::Line critical(std::string text) {
    return {platform::LogLevel::Critical, std::move(text)};
  }
  static fakes::FakeLog::Line warning(std::string text) {
    return {platform::LogLevel::Warning, std::move(text)};
  }
  static fakes::FakeLog::Line debug(std::string text) { return {platform::LogLevel::Debug, std::move(text)}; }

  fakes::FakePlatform fake;
  const platform::Platform& platform = fake.platform;
  MessageLog messageLog{platform};
  fakes::FakeSessionDelegate delegate;
  ScriptedBackends backends;
  Texts replies;
};

/// The key of the first session that FakeRandomness makes.
inline constexpr const char* kFirstKey = "AAAAAAAAQACAAAAAAAAAAQ==";

}  // namespace tallyd
