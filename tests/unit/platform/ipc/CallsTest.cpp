#include <fcntl.h>

#include <fstream>

#include "IPCTest.h"

namespace tallyd::platform {
namespace {

using CallsTest = IPCTest;

TEST_F(CallsTest, AnswersACall) {
  const auto client = makeClient();
  const auto reply = call(*client, kEcho, {Value("text")});
  EXPECT_FALSE(reply.error);
  ASSERT_EQ(reply.results.size(), 1U);
  EXPECT_EQ(reply.results[0], Value("text"));
}

TEST_F(CallsTest, DescribesItsClient) {
  const auto client = makeClient();
  EXPECT_TRUE(_service.events.waitFor("client of process " + std::to_string(getpid()) + ", user " +
                                      std::to_string(getuid())));
}

TEST_F(CallsTest, AnswersWithoutResults) {
  const auto client = makeClient();
  const auto reply = call(*client, kNothing);
  EXPECT_FALSE(reply.error);
  EXPECT_TRUE(reply.results.empty());
}

TEST_F(CallsTest, CallsRunInTheOrderInWhichTheyWereMade) {
  const auto client = makeClient();
  std::vector<std::int64_t> answers;
  std::promise<void> last;
  for (int i = 0; i < 500; ++i) {
    client->call({kEcho, {Value(i)}, {}}, kTimeout, [&answers, &last](Reply reply) {
      answers.push_back(reply.results.at(0).integerValue().value_or(-1));
      if (answers.size() == 500) last.set_value();
    });
  }
  last.get_future().get();
  for (std::size_t i = 0; i < answers.size(); ++i) EXPECT_EQ(answers[i], static_cast<std::int64_t>(i));
}

TEST_F(CallsTest, ACallWithoutReplyGetsNoneAndTheObjectKnows) {
  const auto client = makeClient();
  client->call({kNothing, {}, {}}, kTimeout, {});
  client->call({kRejected, {Value("x")}, {}}, kTimeout, {});
  ASSERT_TRUE(_service.events.waitFor("Nothing no reply"));
  ASSERT_TRUE(_service.events.waitFor("Rejected no reply"));
}

TEST_F(CallsTest, NothingIsSentForACallThatWantsNoReply) {
  RawClient client(_socketPath);
  client.authenticate();
  auto silent = rawCall(1, "Nothing");
  silent[2] = 1;  // NO_REPLY_EXPECTED (D-Bus Specification, "Message Format").
  auto wrongTypes = rawCall(2, "Echo", "u", RawBytes().number(1).bytes());
  wrongTypes[2] = 1;
  auto unreadable = rawCall(3, "Echo", "v", RawBytes().signature("o").text("/a").bytes());
  unreadable[2] = 1;
  client.send(silent + wrongTypes + unreadable + rawCall(4, "Nothing"));
  const auto answer = client.receiveMessage();
  ASSERT_TRUE(answer);
  EXPECT_EQ((*answer)[1], 2);  // A method's return, and the first that comes is the last call's.
  EXPECT_NE(answer->find(std::string("\5\1u\0\4\0\0\0", 8)), std::string::npos);  // REPLY_SERIAL 4.
  EXPECT_EQ(_service.events.count("Nothing no reply"), 1U);
}

TEST_F(CallsTest, ACallThatNobodyAnswersGetsNoAnswer) {
  const auto client = makeClient();
  const auto reply = call(*client, kNeverAnswered, {}, {}, std::chrono::milliseconds(50));
  EXPECT_TRUE(reply.error);
  EXPECT_FALSE(call(*client, kNothing).error);
}

TEST_F(CallsTest, RejectedArgumentsAreAnErrorAndOnlyTheFirstAnswerCounts) {
  const auto client = makeClient();
  EXPECT_EQ(call(*client, kRejected, {Value("x")}).error, "not this text");
  EXPECT_FALSE(call(*client, kNothing).error);
}

TEST_F(CallsTest, DescriptorsTravelInOrder) {
  std::vector<FileDescriptor> files;
  for (const auto* name : {"first", "second"}) {
    const auto path = _folder.path() / name;
    std::ofstream(path) << "contents of " << name;
    files.emplace_back(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  }
  const auto client = makeClient();
  const auto reply =
      call(*client, kReadFiles, {Value("x"), Value(Array(std::vector<Value>(2)))}, std::move(files));
  ASSERT_FALSE(reply.error) << *reply.error;
  EXPECT_EQ(reply.results[0], Value(Array{Value("contents of first"), Value("contents of second")}));
}

TEST_F(CallsTest, ADataPayloadOf64MiBArrives) {
  constexpr std::size_t kSize = 64UL * 1024 * 1024;
  const auto client = makeClient();
  const auto reply = call(*client, kLength, {Value(Data(std::string(kSize, 'p')))});
  ASSERT_FALSE(reply.error) << *reply.error;
  EXPECT_EQ(reply.results[0], Value(static_cast<std::int64_t>(kSize)));
}

TEST_F(CallsTest, ALargeAnswerArrives) {
  constexpr int kSize = 32 * 1024 * 1024;
  const auto client = makeClient();
  const auto reply = call(*client, kLarge, {Value(kSize)});
  ASSERT_FALSE(reply.error) << *reply.error;
  EXPECT_EQ(reply.results[0].string()->size(), static_cast<std::size_t>(kSize));
}

TEST_F(CallsTest, ArgumentsThatDoNotFitTheirTypesAreNotSent) {
  const auto client = makeClient();
  EXPECT_TRUE(call(*client, kLarge, {Value("text")}).error);
  EXPECT_TRUE(call(*client, kLarge, {Value(-1)}).error);
  EXPECT_TRUE(call(*client, kLarge, {}).error);
  EXPECT_TRUE(call(*client, kLarge, {Value(1), Value(2)}).error);
  EXPECT_FALSE(call(*client, kLarge, {Value(1)}).error);
  EXPECT_EQ(_service.events.count("Large"), 1U);
}

TEST_F(CallsTest, CloseSendsWhatWasCalledAndFailsTheRest) {
  const auto client = makeClient();
  std::vector<std::string> errors;
  for (int i = 0; i < 100; ++i) client->call({kNothing, {}, {}}, kTimeout, {});
  client->call({kNeverAnswered, {}, {}}, kTimeout,
               [&errors](Reply reply) { errors.push_back(*reply.error); });
  client->close(std::chrono::seconds(30));
  EXPECT_EQ(errors.size(), 1U);
  EXPECT_TRUE(_service.events.waitFor("NeverAnswered"));
  EXPECT_EQ(_service.events.count("Nothing no reply"), 100U);
  EXPECT_TRUE(_service.events.waitFor("invalidated"));
}

TEST_F(CallsTest, ACallAfterTheEndFails) {
  const auto client = makeClient();
  client->close(std::chrono::seconds(30));
  EXPECT_TRUE(call(*client, kNothing).error);
}

TEST_F(CallsTest, CloseLetsTheServiceAnswer) {
  const auto client = makeClient();
  std::size_t answered = 0;
  for (int i = 0; i < 200; ++i) {
    client->call({kNothing, {}, {}}, kTimeout,
                 [&answered](const Reply& reply) { answered += reply.error ? 0 : 1; });
  }
  client->close(std::chrono::seconds(30));
  EXPECT_EQ(answered, 200U);
}

TEST_F(CallsTest, EveryCallWithoutReplyIsHeardAlsoWhenTheClientLeavesAtOnce) {
  RawClient client(_socketPath);
  client.authenticate();
  std::string calls;
  for (std::uint32_t i = 1; i <= 200; ++i) {
    calls += rawCall(i, "Nothing");
    calls[calls.size() - rawCall(i, "Nothing").size() + 2] = 1;  // NO_REPLY_EXPECTED.
  }
  client.send(calls);
  client.close();
  EXPECT_TRUE(_service.events.waitFor("invalidated"));
  EXPECT_EQ(_service.events.count("Nothing no reply"), 200U);
}

TEST_F(CallsTest, AClientThatOnlyStoppedSendingGetsItsAnswers) {
  RawClient client(_socketPath);
  client.authenticate();
  std::string calls;
  for (std::uint32_t i = 1; i <= 200; ++i) calls += rawCall(i, "Nothing");
  client.send(calls);
  ::shutdown(client.descriptor(), SHUT_WR);
  for (int i = 0; i < 200; ++i) ASSERT_TRUE(client.receiveMessage());
  EXPECT_TRUE(client.isClosedByPeer());
}

}  // namespace
}  // namespace tallyd::platform
