// Client types without a storebag name end the daemon.

#include <csignal>

#include "AgentFixture.h"
#include "fakes/LoudLog.h"

namespace tallyd {
namespace {

using testing::KilledBySignal;

class TallydAgentDeathTest : public AgentFixture {
 protected:
  Connection connectLoudly() {
    auto connection = std::make_shared<fakes::FakeServiceConnection>();
    loudAgent.shouldAcceptNewConnection(connection);
    return connection;
  }

  fakes::LoudLog loudLog;
  platform::Platform loudPlatform{
      fake.root,     loudLog,          fake.clock,    fake.randomness, fake.locale,          fake.queues,
      fake.http,     fake.preferences, fake.defaults, fake.device,     fake.frameworkBundle, fake.sandbox,
      fake.powerLog, fake.codeBundles, fake.process};
  TallydAgent loudAgent{loudPlatform};
};

TEST_F(TallydAgentDeathTest, AStartBeforeAnyConfigurationEndsTheDaemon) {
  const Connection connection = connectLoudly();
  EXPECT_EXIT(connection->call("StartConfig"), KilledBySignal(SIGABRT),
              "<7>Starting configuration for session 0\n"
              "<7>Retrieving storebag for session 0 with client type 0\n"
              "<7>Fetching storebag for client type 0\n"
              "<2>Could not find storebag name for client type 0\n"
              "<7>Storebag max age: 0 seconds\n"
              "<2>Client type 0 has no storebag name to keep its storebag under\n$");
}

TEST_F(TallydAgentDeathTest, ASessionInfoWithoutClientTypeCountsAsTypeZero) {
  const Connection connection = connectLoudly();
  connection->call("SetSessionInfo",
                   {some(Dictionary{{std::string(kTallySessionInfoSessionID), 9}}), none(), none()});
  EXPECT_EXIT(connection->call("StartConfig"), KilledBySignal(SIGABRT),
              "<7>Retrieving storebag for session 9 with client type 0\n(.|\n)*<2>Client type 0 has no "
              "storebag name to keep its storebag under\n$");
}

TEST_F(TallydAgentDeathTest, AOneShotMessageOfAClientTypeWithoutStorebagEndsTheDaemon) {
  const Connection connection = connectLoudly();
  for (const std::int64_t clientType : {0, 3, -1, 12}) {
    EXPECT_EXIT(connection->call("SendMessageWithSessionInfo",
                                 {some(sessionInfo(9, clientType)), none(), 1, 2, none()}),
                KilledBySignal(SIGABRT),
                "<2>Client type " + std::to_string(clientType) +
                    " has no storebag name to keep its storebag under\n$");
  }
}

}  // namespace
}  // namespace tallyd
