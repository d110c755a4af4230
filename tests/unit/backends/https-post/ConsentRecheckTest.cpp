// Consent that is withdrawn while a session runs.

#include "HTTPSPostBackendFixture.h"

namespace tallyd {
namespace {

class ConsentRecheckTest : public HTTPSPostBackendFixture {
 protected:
  std::shared_ptr<HTTPSPostBackend> rechecking(std::shared_ptr<HTTPSPostBackend> backend) const {
    backend->setAccount(account);
    backend->recheckConsent();
    return backend;
  }
  static TallyBackend::Result send(HTTPSPostBackend& backend, std::uint16_t method = 3) {
    return backend.sendMessage(Dictionary{{"i", 1}}, kEventTime, method, 4);
  }
  [[nodiscard]] std::uint64_t withdrawn() const {
    return account->counts().droppedFor(DropReason::ConsentWithdrawn);
  }
  [[nodiscard]] std::size_t linesAbout(int events) const {
    return fake.log.count(Level::Info, "Tally(HTTPSPostBackend): consent has been withdrawn, not posting " +
                                           std::to_string(events) + " events");
  }

  std::shared_ptr<Account> account = std::make_shared<Account>();
};

TEST_F(ConsentRecheckTest, PostsWhileTheUserConsents) {
  const auto backend = rechecking(evaluated());
  EXPECT_NE(send(*backend), std::nullopt);
  EXPECT_EQ(postCount(), 1U);
  EXPECT_EQ(withdrawn(), 0U);
}

TEST_F(ConsentRecheckTest, DropsAMessageOnceConsentIsWithdrawnWithOneLine) {
  const auto backend = rechecking(evaluated());
  setConsent(false);
  EXPECT_EQ(send(*backend), std::nullopt);
  EXPECT_EQ(postCount(), 0U);
  EXPECT_EQ(withdrawn(), 1U);
  EXPECT_EQ(linesAbout(1), 1U);
  EXPECT_TRUE(account->counts().isBalanced());
}

TEST_F(ConsentRecheckTest, WithoutTheRecheckAWithdrawalWaitsForTheNextSession) {
  const auto backend = evaluated();
  backend->setAccount(account);
  setConsent(false);
  EXPECT_NE(send(*backend), std::nullopt);
  EXPECT_EQ(postCount(), 1U);
  EXPECT_EQ(linesAbout(1), 0U);
}

TEST_F(ConsentRecheckTest, DropsTheBatchAtAFlush) {
  const auto backend = rechecking(evaluated());
  backend->setBatchEvents(true);
  for (int i = 0; i < 5; ++i) (void)send(*backend);
  setConsent(false);
  EXPECT_EQ(withdrawn(), 0U);
  EXPECT_EQ(backend->flushMessages(), std::nullopt);
  EXPECT_EQ(postCount(), 0U);
  EXPECT_EQ(withdrawn(), 5U);
  EXPECT_EQ(linesAbout(5), 1U);
  EXPECT_EQ(backend->batchedEventCount(), 0U);
  EXPECT_TRUE(account->counts().isBalanced());
}

TEST_F(ConsentRecheckTest, DropsTheBatchThatAChangeOfStateWouldLetGo) {
  const auto backend = rechecking(pending());
  (void)send(*backend);
  setConsent(false);
  backend->setUserInfoDict(userInfo());
  backend->updateState();
  EXPECT_EQ(postCount(), 0U);
  EXPECT_EQ(withdrawn(), 1U);
}

TEST_F(ConsentRecheckTest, DropsTheBatchAtItsEnd) {
  auto backend = rechecking(evaluated());
  backend->setBatchEvents(true);
  (void)send(*backend);
  setConsent(false);
  backend.reset();
  EXPECT_EQ(postCount(), 0U);
  EXPECT_EQ(withdrawn(), 1U);
  EXPECT_TRUE(account->counts().isBalanced());
}

TEST_F(ConsentRecheckTest, AFailedPostIsSentAgainOnlyWhileTheUserConsents) {
  auto backend = rechecking(evaluated());
  (void)send(*backend);
  backend.reset();
  const auto request = fake.http.posts().at(0);
  ASSERT_TRUE(request.mayBeSentAgain);
  EXPECT_TRUE(request.mayBeSentAgain());
  setConsent(false);
  EXPECT_FALSE(request.mayBeSentAgain());
  setConsent(true);
  EXPECT_FALSE(request.mayBeSentAgain());
}

TEST_F(ConsentRecheckTest, WithoutTheRecheckNothingAsksBeforeAPostIsSentAgain) {
  const auto backend = evaluated();
  (void)send(*backend);
  EXPECT_FALSE(fake.http.posts().at(0).mayBeSentAgain);
}

TEST_F(ConsentRecheckTest, BooksAPostThatWasNotSentAgainAsWithdrawnWithOneLine) {
  const auto backend = rechecking(evaluated());
  fake.http.answer = [](const auto&) {
    auto result = fakes::FakeHTTPClient::failure("not to be sent again");
    result.failure = platform::HTTPFailure::Withdrawn;
    return result;
  };
  (void)send(*backend);
  fake.queues.run();
  EXPECT_EQ(withdrawn(), 1U);
  EXPECT_EQ(linesAbout(1), 1U);
  EXPECT_FALSE(fake.log.hasTextStartingWith(Level::Error, ""));
  EXPECT_TRUE(account->counts().isBalanced());
}

TEST_F(ConsentRecheckTest, ConsentThatComesBackDoesNotStartTheSessionAgain) {
  const auto backend = rechecking(evaluated());
  setConsent(false);
  (void)send(*backend);
  setConsent(true);
  (void)send(*backend);
  backend->updateState();
  (void)send(*backend);
  EXPECT_EQ(postCount(), 0U);
  EXPECT_EQ(withdrawn(), 3U);
}

TEST_F(ConsentRecheckTest, ConsentThatComesLaterStartsNothing) {
  setConsent(false);
  const auto backend = rechecking(evaluated());
  EXPECT_EQ(backend->state(), ReportingStateOff);
  setConsent(true);
  backend->updateState();
  (void)send(*backend);
  EXPECT_EQ(postCount(), 0U);
  EXPECT_EQ(withdrawn(), 0U);
}

TEST_F(ConsentRecheckTest, WhatNeverNeededConsentIsNotStoppedByItsAbsence) {
  setConsent(false);
  const auto overridden = rechecking(evaluated({entryWith("override_dnu", 1)}));
  EXPECT_EQ(overridden->dnuType(), DNUTypeOverrideNoConsent);
  (void)send(*overridden);
  EXPECT_EQ(postCount(), 1U);
  const auto free = rechecking(pending());
  free->setRequireUserInfo(false);
  free->updateState();
  (void)send(*free);
  EXPECT_EQ(postCount(), 2U);
  EXPECT_EQ(withdrawn(), 0U);
}

TEST_F(ConsentRecheckTest, AWithdrawalStopsASessionOfAUserWhoHadConsentedWhateverTheRules) {
  const auto overridden = rechecking(evaluated({entryWith("override_dnu", 1)}));
  EXPECT_EQ(overridden->dnuType(), DNUTypeOverrideConsent);
  setConsent(false);
  (void)send(*overridden);
  EXPECT_EQ(postCount(), 0U);
  EXPECT_EQ(withdrawn(), 1U);
}

}  // namespace
}  // namespace tallyd
