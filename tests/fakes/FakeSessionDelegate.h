// Answers a session's questions as the test wants and keeps what was asked.
#pragma once

#include <optional>
#include <string>
#include <vector>

#include "session/TallydSession.h"
#include "session/TallydSessionDelegate.h"

namespace tallyd::fakes {

class FakeSessionDelegate : public TallydSessionDelegate {
 public:
  std::optional<platform::Dictionary> storebagForSession(const TallydSession& session) override {
    asked.push_back("storebag of session " + std::to_string(session.sessionID()));
    return storebag;
  }
  std::optional<std::string> storebagVersionForSession(const TallydSession& session) override {
    asked.push_back("storebag version of session " + std::to_string(session.sessionID()));
    return version;
  }
  std::optional<std::string> parentSessionIDStringForSession(const TallydSession& session) override {
    asked.push_back("parent of session " + std::to_string(session.sessionID()));
    return parent;
  }
  void userInfoUpdatedForSession(TallydSession& session) override {
    asked.push_back("user info of session " + std::to_string(session.sessionID()));
    userInfoSeen = session.userInfo();
  }
  [[nodiscard]] std::string description() const override { return "<FakeSessionDelegate>"; }

  std::optional<platform::Dictionary> storebag;
  std::optional<std::string> version;
  std::optional<std::string> parent;

  std::vector<std::string> asked;
  std::optional<platform::Dictionary> userInfoSeen;  ///< What the session held when it told of its user info.
};

}  // namespace tallyd::fakes
