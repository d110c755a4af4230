// Sessions of one client and service find their parent.

#include <limits>

#include "AgentFixture.h"
#include "session/TallydSession.h"
#include "unit/session/ScriptedBackends.h"

namespace tallyd {
namespace {

TEST(CorrelationKeyTest, IsMadeOfBothNamesInLowerCase) {
  const auto keyOf = [](platform::Value client, platform::Value service) {
    return correlationKeyForUserInfo(
        platform::Dictionary{{std::string(kTallyUserInfoClientName), std::move(client)},
                             {std::string(kTallyUserInfoServiceName), std::move(service)}});
  };
  EXPECT_EQ(keyOf("Phone", "Calls"), "phone:calls");
  EXPECT_EQ(keyOf("phone", "CALLS"), "phone:calls");
  EXPECT_EQ(keyOf("\xC3\x84pfel", "\xCE\x91"), "\xC3\xA4pfel:\xCE\xB1");
  EXPECT_EQ(keyOf(" a ", "b:c"), " a :b:c");
  EXPECT_EQ(keyOf("", ""), ":");
  EXPECT_EQ(keyOf(5, platform::Array()), ":");
}

TEST(CorrelationKeyTest, AMissingNameIsEmpty) {
  EXPECT_EQ(correlationKeyForUserInfo(std::nullopt), ":");
  EXPECT_EQ(correlationKeyForUserInfo(platform::Dictionary()), ":");
  EXPECT_EQ(correlationKeyForUserInfo(platform::Dictionary{{std::string(kTallyUserInfoClientName), "A"}}),
            "a:");
  EXPECT_EQ(correlationKeyForUserInfo(platform::Dictionary{{std::string(kTallyUserInfoServiceName), "B"}}),
            ":b");
}

/// Sessions with the agent as delegate and one scripted backend that gives them their hierarchy.
class CorrelationTest : public AgentFixture {
 protected:
  struct Member {
    std::unique_ptr<ScriptedBackends> backends;
    std::shared_ptr<TallydSession> session;
  };

  Member memberOf(std::int32_t hierarchy, std::uint32_t sessionID) {
    Member member{std::make_unique<ScriptedBackends>(), nullptr};
    member.backends->scripts["splunk"].hierarchy = hierarchy;
    member.session = std::make_shared<TallydSession>(agent, platform, messageLog, member.backends->factory());
    member.session->setSessionInfo(sessionInfo(sessionID, 5), std::nullopt, {}, [](const auto&) {});
    member.session->createBackendsWithStorebag(member.backends->storebag());
    member.session->updateReportingStates();
    return member;
  }
  /// A session of this level that has joined its group; its combined ID is "ID<sessionID>".
  const TallydSession& join(std::int32_t hierarchy, std::uint32_t sessionID, const char* client = "phone",
                            const char* service = "calls") {
    members.push_back(memberOf(hierarchy, sessionID));
    TallydSession& session = *members.back().session;
    session.receivedUserInfo(userInfo(client, service));
    session.setCombinedSessionIDString("ID" + std::to_string(sessionID));
    fake.log.clear();
    return session;
  }
  TallydSession& member(std::size_t index) { return *members.at(index).session; }
  std::optional<std::string> parentOf(const TallydSession& session) {
    fake.log.clear();
    return agent.parentSessionIDStringForSession(session);
  }

  /// Ends the agent first: the sessions in its groups still know the message log and their backends.
  void TearDown() override {
    for (Member& each : members) each.session.reset();
    ownedAgent.reset();
  }

  MessageLog messageLog{platform};
  std::vector<Member> members;
};

TEST_F(CorrelationTest, NamesInAnotherCaseAreTheSameGroup) {
  join(1, 10, "Phone", "Calls");
  EXPECT_EQ(parentOf(join(2, 20, "phone", "CALLS")), "ID10");
  EXPECT_EQ(fake.log.lines(), Lines{debug("Checking userInfoKey 'phone:calls' for session 20")});
}

TEST_F(CorrelationTest, JoiningIsLoggedWithTheKey) {
  Member member = memberOf(0, 20);
  fake.log.clear();
  member.session->receivedUserInfo(userInfo("Phone", "Calls"));
  EXPECT_EQ(fake.log.lines().at(0), debug("Adding session 20 to list for userInfoKey phone:calls"));
  members.push_back(std::move(member));
}

TEST_F(CorrelationTest, LevelZeroHasNoParentAndNoLine) {
  join(1, 10);
  join(-1, 11);
  EXPECT_EQ(parentOf(join(0, 20)), std::nullopt);
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(CorrelationTest, ASessionWithoutBackendsIsOfLevelZero) {
  const auto session = std::make_shared<TallydSession>(agent, platform, messageLog);
  EXPECT_EQ(parentOf(*session), std::nullopt);
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(CorrelationTest, TheParentIsTheEarliestJoinedOfTheLevelAbove) {
  join(3, 5);
  join(1, 10);
  join(1, 11);
  EXPECT_EQ(parentOf(join(2, 20)), "ID10");
}

TEST_F(CorrelationTest, AParentMayJoinAfterItsChild) {
  const TallydSession& child = join(2, 20);
  EXPECT_EQ(parentOf(child), std::nullopt);
  join(1, 10);
  EXPECT_EQ(parentOf(child), "ID10");
}

TEST_F(CorrelationTest, LevelOneFindsItsParentAtLevelZero) {
  join(0, 10);
  EXPECT_EQ(parentOf(join(1, 20)), "ID10");
}

TEST_F(CorrelationTest, AMissingLevelIsLoggedAsDebug) {
  join(3, 30);
  join(0, 31);
  EXPECT_EQ(parentOf(join(2, 20)), std::nullopt);
  EXPECT_EQ(fake.log.lines(),
            (Lines{debug("Checking userInfoKey 'phone:calls' for session 20"),
                   debug("ERROR: Could not find parent for session 20 with user info key phone:calls")}));
}

TEST_F(CorrelationTest, ParentsOfOtherGroupsDoNotCount) {
  join(1, 10, "phone", "video");
  join(1, 11, "tablet", "calls");
  EXPECT_EQ(parentOf(join(2, 20)), std::nullopt);
}

TEST_F(CorrelationTest, WithoutAnyGroupUnderTheKeyThereAreNoSessions) {
  const Member member = memberOf(2, 20);
  EXPECT_EQ(parentOf(*member.session), std::nullopt);
  EXPECT_EQ(fake.log.lines(), (Lines{debug("Checking userInfoKey ':' for session 20"),
                                     critical("ERROR: No sessions found for user info key :")}));
}

TEST_F(CorrelationTest, AnEmptyGroupHasNoSessionsEither) {
  const Connection gone = connect();
  configure(gone, 9, 5, some(Dictionary()));
  gone->invalidate();
  const Member member = memberOf(2, 20);
  EXPECT_EQ(parentOf(*member.session), std::nullopt);
  EXPECT_EQ(fake.log.lines(), (Lines{debug("Checking userInfoKey ':' for session 20"),
                                     critical("ERROR: No sessions found for user info key :")}));
}

TEST_F(CorrelationTest, ASessionThatIsNotInTheGroupFindsNoParent) {
  const Connection nameless = connect();
  configure(nameless, 9, 5, some(Dictionary()));
  const Member member = memberOf(1, 20);
  EXPECT_EQ(parentOf(*member.session), std::nullopt);
  EXPECT_EQ(fake.log.lines(), (Lines{debug("Checking userInfoKey ':' for session 20"),
                                     critical("ERROR: Session 20 not found for user info key :")}));
}

TEST_F(CorrelationTest, TheGroupOfSessionsWithoutNamesIsOneLikeAnyOther) {
  join(1, 10, "", "");
  EXPECT_EQ(parentOf(join(2, 20, "", "")), "ID10");
}

TEST_F(CorrelationTest, AnUpdateWithoutUserInfoIsRefused) {
  const Member member = memberOf(1, 20);
  fake.log.clear();
  agent.userInfoUpdatedForSession(*member.session);
  EXPECT_EQ(fake.log.lines(),
            Lines{critical("-[TallydAgent userInfoUpdatedForSession:] No user info found for session 20")});
  EXPECT_EQ(counts(), "0(0)");
}

TEST_F(CorrelationTest, AnotherServiceMovesTheSession) {
  join(1, 10);
  join(1, 11, "phone", "video");
  join(2, 20);
  join(2, 21, "phone", "video");
  member(0).receivedUserInfo(userInfo("phone", "video"));
  EXPECT_EQ(parentOf(member(2)), std::nullopt);
  EXPECT_EQ(fake.log.lines().back(),
            debug("ERROR: Could not find parent for session 20 with user info key phone:calls"));
  // It is appended in its new group: the one that was there before it stays the first.
  EXPECT_EQ(parentOf(member(3)), "ID11");
}

TEST_F(CorrelationTest, TheSameUserInfoAgainMovesTheSessionToTheEndOfItsGroup) {
  join(1, 10);
  join(1, 11);
  const TallydSession& child = join(2, 20);
  EXPECT_EQ(parentOf(child), "ID10");
  fake.log.clear();
  agent.userInfoUpdatedForSession(member(0));
  EXPECT_EQ(fake.log.lines(), Lines{debug("Adding session 10 to list for userInfoKey phone:calls")});
  EXPECT_EQ(parentOf(child), "ID11");
  agent.userInfoUpdatedForSession(member(1));
  EXPECT_EQ(parentOf(child), "ID10");
}

TEST_F(CorrelationTest, ASessionIsInItsGroupOnlyOnce) {
  join(1, 10);
  const TallydSession& child = join(2, 20);
  for (int i = 0; i < 3; ++i) agent.userInfoUpdatedForSession(member(0));
  member(0).receivedUserInfo(userInfo("phone", "video"));
  EXPECT_EQ(parentOf(child), std::nullopt);
}

TEST_F(CorrelationTest, TheParentsCombinedIDIsTheOneOfTheMoment) {
  join(1, 10);
  const TallydSession& child = join(2, 20);
  member(0).setCombinedSessionIDString("grown.ID10");
  EXPECT_EQ(parentOf(child), "grown.ID10");
}

TEST_F(CorrelationTest, TheLowestLevelOfAllHasNoneAbove) {
  join(std::numeric_limits<std::int32_t>::max(), 10);
  EXPECT_EQ(parentOf(join(std::numeric_limits<std::int32_t>::min(), 20)), std::nullopt);
  join(-2, 11);
  EXPECT_EQ(parentOf(join(-1, 21)), "ID11");
}

/// The same through connections and storebags, where the client type decides the level.
class CorrelatedConnectionsTest : public AgentFixture {
 protected:
  /// Connects, configures and starts; gives back the combined ID that the backends got at the end.
  std::string startedWith(std::int64_t clientType, const char* client, const char* service) {
    connections.push_back(connect());
    configure(connections.back(), clientType * 10, clientType, some(userInfo(client, service)));
    connections.back()->call("StartConfig");
    return lastCombinedID();
  }
  std::string lastCombinedID() const {
    const std::string start = "Setting combined session ID '";
    std::string found;
    for (const auto& line : fake.log.lines()) {
      if (line.text.starts_with(start)) {
        found = line.text.substr(start.size(), line.text.rfind('\'') - start.size());
      }
    }
    return found;
  }

  std::vector<Connection> connections;
};

TEST_F(CorrelatedConnectionsTest, AChainOfSessionsCarriesTheIDsOfAllLevels) {
  const std::string first = startedWith(5, "Phone", "Calls");
  const std::string second = startedWith(6, "phone", "CALLS");
  const std::string third = startedWith(7, "PHONE", "calls");
  EXPECT_EQ(first, "AAAAAAAAQACAAAAAAAAAAQ==");
  EXPECT_EQ(second, "AAAAAAAAQACAAAAAAAAAAQ==.AAAAAAAAQACAAAAAAAAAAg==");
  EXPECT_EQ(third, second + ".AAAAAAAAQACAAAAAAAAAAw==");
}

TEST_F(CorrelatedConnectionsTest, ASessionThatIsGoneIsNobodysParent) {
  startedWith(5, "phone", "calls");
  connections[0]->invalidate();
  EXPECT_EQ(startedWith(6, "phone", "calls"), "AAAAAAAAQACAAAAAAAAAAg==");
}

TEST_F(CorrelatedConnectionsTest, AnInterruptedSessionIsStillAParent) {
  startedWith(5, "phone", "calls");
  connections[0]->interrupt();
  EXPECT_EQ(startedWith(6, "phone", "calls"), "AAAAAAAAQACAAAAAAAAAAQ==.AAAAAAAAQACAAAAAAAAAAg==");
}

TEST_F(CorrelatedConnectionsTest, EachCallWithUserInfoPutsTheParentInFrontOnceMore) {
  startedWith(5, "phone", "calls");
  const std::string parent = "AAAAAAAAQACAAAAAAAAAAQ==";
  const std::string once = startedWith(6, "phone", "calls");
  connections[1]->call("FetchStates", {some(userInfo("phone", "calls"))});
  EXPECT_EQ(lastCombinedID(), parent + "." + once);
  connections[1]->call("FetchStates", {none()});
  EXPECT_EQ(lastCombinedID(), parent + "." + once);
}

}  // namespace
}  // namespace tallyd
