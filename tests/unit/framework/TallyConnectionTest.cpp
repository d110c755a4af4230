#include "framework/TallyConnection.h"

#include <gtest/gtest.h>
#include <sys/stat.h>

#include <condition_variable>
#include <fstream>
#include <mutex>
#include <system_error>
#include <utility>

#include "fakes/TemporaryFolder.h"
#include "unit/framework/ScriptedDaemon.h"

namespace tallyd {
namespace {

using platform::Array;
using platform::Data;
using platform::Date;
using platform::Dictionary;
using platform::FileDescriptor;
using platform::Value;

class TallyConnectionTest : public testing::Test {
 protected:
  ReceivedCall onlyCall() { return _daemon->calls(1).at(0); }
  static Value some(Value value) { return Value(Array{std::move(value)}); }
  static Value none() { return Value(Array()); }

  fakes::TemporaryFolder _folder;
  const std::filesystem::path _path = _folder.path() / "service";
  std::unique_ptr<ScriptedDaemon> _daemon = std::make_unique<ScriptedDaemon>(_path);
  std::unique_ptr<TallyConnection> _connection = std::make_unique<TallyConnection>(_path);
  const Dictionary _info{{"SessionID", Value(7)}, {"Name", Value("client")}};
};

TEST_F(TallyConnectionTest, SetsSessionInfo) {
  _daemon->answerWith({Value("received")});
  const auto reply = _connection->setSessionInfoSync(_info, std::nullopt, {"A", "B"});
  EXPECT_FALSE(reply.error);
  EXPECT_EQ(reply.value, "received");
  const auto call = onlyCall();
  EXPECT_EQ(call.method, ClientSessionMethod::SetSessionInfo);
  EXPECT_EQ(call.arguments,
            (std::vector<Value>{some(Value(_info)), none(), Value(Array{Value("A"), Value("B")})}));
  EXPECT_TRUE(call.expectsReply);
}

TEST_F(TallyConnectionTest, TellsAnEmptyDictionaryFromNone) {
  _daemon->answerWith({Value("received")});
  _connection->setSessionInfoSync(Dictionary(), std::nullopt);
  EXPECT_EQ(onlyCall().arguments, (std::vector<Value>{some(Value(Dictionary())), none(), none()}));
}

TEST_F(TallyConnectionTest, StartsTheConfigurationAndTellsStatesFromNone) {
  _daemon->answerWith({none()});
  EXPECT_EQ(_connection->startConfigSync().value, std::nullopt);
  _daemon->answerWith({some(none())});
  EXPECT_EQ(_connection->startConfigSync().value, TallyConnection::Strings());
  _daemon->answerWith({some(Value(Array{Value("dashboard"), Value("splunk")}))});
  EXPECT_EQ(_connection->startConfigSync().value, (TallyConnection::Strings{"dashboard", "splunk"}));
  EXPECT_EQ(onlyCall().method, ClientSessionMethod::StartConfig);
}

TEST_F(TallyConnectionTest, FetchesStates) {
  _daemon->answerWith({some(Value(Array{Value("dashboard")}))});
  EXPECT_EQ(_connection->fetchStatesSync(_info).value, TallyConnection::Strings{"dashboard"});
  EXPECT_EQ(onlyCall().method, ClientSessionMethod::FetchStates);
  EXPECT_EQ(onlyCall().arguments, std::vector<Value>{some(Value(_info))});
}

TEST_F(TallyConnectionTest, FetchesTheDisplayURL) {
  _daemon->answerWith({Value("URL not available")});
  EXPECT_EQ(_connection->fetchDisplayURLSync().value, "URL not available");
  EXPECT_EQ(onlyCall().method, ClientSessionMethod::FetchDisplayURL);
}

TEST_F(TallyConnectionTest, SendsAMessageWithEveryKindOfValue) {
  const Dictionary payload{
      {"null", Value()},
      {"boolean", Value(true)},
      {"integer", Value(-5)},
      {"large", Value(~std::uint64_t{0})},
      {"real", Value(0.25)},
      {"text", Value("text")},
      {"date", Value(Date{12.5})},
      {"data", Value(Data("bytes"))},
      {"array", Value(Array{Value(1), Value("two")})},
      {"dictionary", Value(Dictionary{{"k", Value(Dictionary())}})},
  };
  _daemon->answerWith({some(Value("result"))});
  EXPECT_EQ(_connection->sendMessageSync(3, 65'535, payload).value, "result");
  EXPECT_EQ(onlyCall().method, ClientSessionMethod::SendMessageWithCategory);
  EXPECT_EQ(onlyCall().arguments, (std::vector<Value>{Value(3), Value(65'535), some(Value(payload))}));
  _daemon->answerWith({none()});
  EXPECT_EQ(_connection->sendMessageSync(0, 0, std::nullopt).value, std::nullopt);
}

TEST_F(TallyConnectionTest, FlushesMessages) {
  _daemon->answerWith({some(Value("done"))});
  EXPECT_EQ(_connection->flushMessagesSync().value, "done");
  EXPECT_EQ(onlyCall().method, ClientSessionMethod::FlushMessages);
}

TEST_F(TallyConnectionTest, UploadsAFileWithTheGrantToReadIt) {
  const auto file = _folder.path() / "a log #1 ü.txt";
  std::ofstream(file) << "text";
  _daemon->answerWith({Value(true)});
  EXPECT_TRUE(_connection->uploadFileSync(file).value);
  const auto call = onlyCall();
  EXPECT_EQ(call.method, ClientSessionMethod::UploadFileAtPath);
  EXPECT_EQ(call.arguments.at(0),
            Value("file://" + _folder.path().string() + "/a%20log%20%231%20%C3%BC.txt"));
  EXPECT_EQ(call.arguments.at(1), Value("tally.file:" + file.string()));
  struct stat fileStatus {};
  struct stat folderStatus {};
  ASSERT_EQ(::stat(file.c_str(), &fileStatus), 0);
  ASSERT_EQ(::stat(_folder.path().c_str(), &folderStatus), 0);
  EXPECT_EQ(call.files, (std::vector<ino_t>{fileStatus.st_ino, folderStatus.st_ino}));
}

TEST_F(TallyConnectionTest, UploadsAFileThatItCannotOpenWithoutAGrant) {
  _daemon->answerWith({Value(false)});
  const auto reply = _connection->uploadFileSync(_folder.path() / "missing");
  EXPECT_FALSE(reply.error);
  EXPECT_FALSE(reply.value);
  EXPECT_TRUE(onlyCall().files.empty());
  EXPECT_EQ(onlyCall().arguments.at(1), Value("tally.file:" + (_folder.path() / "missing").string()));
}

TEST_F(TallyConnectionTest, UploadsLogData) {
  _daemon->answerWith({Value(true), none()});
  const auto reply = _connection->uploadLogDataSync(Array{Value(Dictionary{{"a", Value(1)}}), Value("line")});
  EXPECT_TRUE(reply.value.uploaded);
  EXPECT_EQ(reply.value.error, std::nullopt);
  EXPECT_EQ(onlyCall().arguments,
            std::vector<Value>{Value(Array{Value(Dictionary{{"a", Value(1)}}), Value("line")})});
  _daemon->answerWith({Value(false), some(Value("no room"))});
  EXPECT_EQ(_connection->uploadLogDataSync(Array()).value.error, "no room");
}

TEST_F(TallyConnectionTest, SendsAMessageWithItsOwnSessionInfo) {
  _daemon->answerWith({Value("finished")});
  EXPECT_EQ(_connection->sendMessageWithSessionInfoSync(_info, Dictionary(), 1, 2, Dictionary()).value,
            "finished");
  EXPECT_EQ(onlyCall().method, ClientSessionMethod::SendMessageWithSessionInfo);
  EXPECT_EQ(onlyCall().arguments, (std::vector<Value>{some(Value(_info)), some(Value(Dictionary())), Value(1),
                                                      Value(2), some(Value(Dictionary()))}));
}

TEST_F(TallyConnectionTest, ACallWithoutACompletionAsksForNoAnswer) {
  _connection->sendMessage(1, 2, std::nullopt, {});
  EXPECT_FALSE(onlyCall().expectsReply);
}

TEST_F(TallyConnectionTest, ACallWithoutAnAnswerRunsIntoTheTimeout) {
  TallyConnection impatient(_path, std::chrono::milliseconds(50));
  EXPECT_TRUE(impatient.fetchDisplayURLSync().error);
  _daemon->answerWith({Value("here")});
  EXPECT_EQ(impatient.fetchDisplayURLSync().value, "here");
}

TEST_F(TallyConnectionTest, WhatWasSentLeavesBeforeTheEnd) {
  constexpr std::size_t kMessages = 1'000;
  for (std::size_t i = 0; i < kMessages; ++i) _connection->sendMessage(1, 2, _info, {});
  _connection.reset();
  EXPECT_EQ(_daemon->calls(kMessages).size(), kMessages);
  EXPECT_TRUE(_daemon->waitForInvalidation());
}

TEST_F(TallyConnectionTest, WhenTheDaemonGoesCallsFailAndTheHandlerRuns) {
  std::mutex mutex;
  std::condition_variable changed;
  std::vector<std::string> events;
  const auto note = [&](const char* event) {
    const std::lock_guard lock(mutex);
    events.emplace_back(event);
    changed.notify_all();
  };
  _connection->setInvalidationHandler([&] { note("invalidated"); });
  _connection->fetchDisplayURL(
      [&](const TallyReply<std::string>& reply) { note(reply.error ? "failed" : "answered"); });
  _daemon->calls(1);
  _daemon.reset();
  std::unique_lock lock(mutex);
  ASSERT_TRUE(changed.wait_for(lock, std::chrono::seconds(30), [&] { return events.size() == 2; }));
  EXPECT_EQ(events, (std::vector<std::string>{"failed", "invalidated"}));
  lock.unlock();
  EXPECT_TRUE(_connection->fetchDisplayURLSync().error);
}

TEST_F(TallyConnectionTest, CompletionsComeInTheOrderOfTheCalls) {
  _daemon->answerWith({Value("x")});
  std::mutex mutex;
  std::condition_variable changed;
  std::vector<int> order;
  for (int i = 0; i < 50; ++i) {
    _connection->fetchDisplayURL([&, i](const TallyReply<std::string>&) {
      const std::lock_guard lock(mutex);
      order.push_back(i);
      changed.notify_all();
    });
  }
  std::unique_lock lock(mutex);
  ASSERT_TRUE(changed.wait_for(lock, std::chrono::seconds(30), [&] { return order.size() == 50; }));
  EXPECT_TRUE(std::is_sorted(order.begin(), order.end()));
}

TEST(TallyConnectionWithoutDaemonTest, NamesTheSocketThatItCannotReach) {
  try {
    const TallyConnection connection("/nonexistent/run/service");
    FAIL();
  } catch (const std::system_error& error) {
    EXPECT_NE(std::string(error.what()).find("/nonexistent/run/service"), std::string::npos);
  }
}

}  // namespace
}  // namespace tallyd
