#include "platform/dbus/Authentication.h"

#include <gtest/gtest.h>

namespace tallyd::platform::dbus {
namespace {

using Progress = Authentication::Progress;

constexpr const char* kIdentifier = "0123456789abcdef0123456789abcdef";
constexpr uid_t kPeer = 1000;  // "31303030" in hexadecimal.

struct Outcome {
  Progress progress;
  std::string answers;
  std::size_t left;  ///< Bytes that were not taken.
};

Outcome heard(Authentication& side, std::string_view bytes) {
  Outcome outcome{};
  std::size_t taken = 0;
  outcome.progress = side.take(bytes, taken, outcome.answers);
  outcome.left = bytes.size() - taken;
  return outcome;
}

Outcome server(const std::string& lines) {
  ServerAuthentication side(kPeer, kIdentifier);
  return heard(side, std::string(1, '\0') + lines);
}

const std::string kAccepted = std::string("OK ") + kIdentifier + "\r\n";
const std::string kRejected = "REJECTED EXTERNAL ANONYMOUS\r\n";

TEST(ServerAuthenticationTest, TakesTheUserThatTheSocketNames) {
  const Outcome outcome = server("AUTH EXTERNAL 31303030\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\nl");
  EXPECT_EQ(outcome.progress, Progress::Over);
  EXPECT_EQ(outcome.answers, kAccepted + "AGREE_UNIX_FD\r\n");
  EXPECT_EQ(outcome.left, 1U) << "the first message";
}

TEST(ServerAuthenticationTest, TakesWhoeverTheSocketNamesWhenNobodyIsNamed) {
  EXPECT_EQ(server("AUTH EXTERNAL\r\nDATA\r\nBEGIN\r\n").answers, "DATA\r\n" + kAccepted);
  EXPECT_EQ(server("AUTH EXTERNAL\r\nDATA 31303030\r\nBEGIN\r\n").answers, "DATA\r\n" + kAccepted);
}

TEST(ServerAuthenticationTest, RejectsAnotherUser) {
  EXPECT_EQ(server("AUTH EXTERNAL 30\r\n").answers, kRejected);
  EXPECT_EQ(server("AUTH EXTERNAL\r\nDATA 30\r\n").answers, "DATA\r\n" + kRejected);
  EXPECT_EQ(server("AUTH EXTERNAL 3130303\r\n").answers, kRejected) << "half a byte";
  EXPECT_EQ(server("AUTH EXTERNAL 7a\r\n").answers, kRejected) << "no number";
  EXPECT_EQ(server("AUTH EXTERNAL 30\r\nAUTH ANONYMOUS\r\nDATA\r\nBEGIN\r\n").progress, Progress::Over);
}

TEST(ServerAuthenticationTest, TakesAnonymousClients) {
  EXPECT_EQ(server("AUTH ANONYMOUS 7465\r\n").answers, kAccepted);
  EXPECT_EQ(server("AUTH ANONYMOUS\r\nDATA\r\n").answers, "DATA\r\n" + kAccepted);
}

TEST(ServerAuthenticationTest, NamesItsMechanisms) {
  EXPECT_EQ(server("AUTH\r\n").answers, kRejected);
  EXPECT_EQ(server("AUTH DBUS_COOKIE_SHA1 30\r\n").answers, kRejected);
  EXPECT_EQ(server("AUTH EXTERNAL\r\nCANCEL\r\n").answers, "DATA\r\n" + kRejected);
  EXPECT_EQ(server("BANANA\r\n").answers, "ERROR\r\n");
  EXPECT_EQ(server("NEGOTIATE_UNIX_FD\r\n").answers, "ERROR\r\n") << "not yet";
}

TEST(ServerAuthenticationTest, NobodyBeginsUnaccepted) {
  EXPECT_EQ(server("BEGIN\r\n").progress, Progress::Failed);
  EXPECT_EQ(server("AUTH EXTERNAL 30\r\nBEGIN\r\n").progress, Progress::Failed);
}

TEST(ServerAuthenticationTest, StartsWithANUL) {
  ServerAuthentication side(kPeer, kIdentifier);
  EXPECT_EQ(heard(side, "AUTH EXTERNAL\r\n").progress, Progress::Failed);
}

TEST(ServerAuthenticationTest, TakesWholeLinesHoweverTheyCome) {
  ServerAuthentication side(kPeer, kIdentifier);
  const std::string dialogue = std::string(1, '\0') + "AUTH ANONYMOUS\r\nDATA\r\nBEGIN\r\n";
  std::string waiting;
  std::string answers;
  Progress progress = Progress::More;
  for (const char byte : dialogue) {
    ASSERT_EQ(progress, Progress::More);
    waiting += byte;
    std::size_t taken = 0;
    progress = side.take(waiting, taken, answers);
    waiting.erase(0, taken);
  }
  EXPECT_EQ(progress, Progress::Over);
  EXPECT_EQ(answers, "DATA\r\n" + kAccepted);
}

TEST(ServerAuthenticationTest, LinesAndTheirNumberAreBounded) {
  EXPECT_EQ(server(std::string(Authentication::kMaximumLineBytes + 1, 'x')).progress, Progress::Failed);
  EXPECT_EQ(server(std::string(Authentication::kMaximumLineBytes + 1, 'x') + "\r\n").progress,
            Progress::Failed);
  std::string lines;
  for (int i = 0; i < Authentication::kMaximumLines; ++i) lines += "AUTH\r\n";
  EXPECT_EQ(server(lines).progress, Progress::More);
  EXPECT_EQ(server(lines + "AUTH\r\n").progress, Progress::Failed);
}

TEST(ClientAuthenticationTest, IsOverWithTheLastOfThreeAnswers) {
  ClientAuthentication side;
  EXPECT_EQ(side.opening(), std::string(1, '\0') + "AUTH EXTERNAL\r\nDATA\r\nNEGOTIATE_UNIX_FD\r\nBEGIN\r\n");
  EXPECT_EQ(heard(side, "DATA\r\nOK 01\r\n").progress, Progress::More);
  const Outcome outcome = heard(side, "AGREE_UNIX_FD\r\nl");
  EXPECT_EQ(outcome.progress, Progress::Over);
  EXPECT_EQ(outcome.left, 1U);
}

TEST(ClientAuthenticationTest, AnyOtherAnswerFails) {
  for (const char* answers : {"OK 01\r\n", "DATA\r\nREJECTED EXTERNAL\r\n", "DATA\r\nOK 01\r\nERROR\r\n"}) {
    ClientAuthentication side;
    EXPECT_EQ(heard(side, answers).progress, Progress::Failed) << answers;
  }
}

TEST(AuthenticationTest, TheTwoSidesUnderstandEachOther) {
  ClientAuthentication client;
  ServerAuthentication service(kPeer, kIdentifier);
  const Outcome said = heard(service, client.opening());
  EXPECT_EQ(said.progress, Progress::Over);
  EXPECT_EQ(heard(client, said.answers).progress, Progress::Over);
}

}  // namespace
}  // namespace tallyd::platform::dbus
