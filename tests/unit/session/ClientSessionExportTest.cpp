#include "session/ClientSessionExport.h"

#include <fcntl.h>

#include "SessionFixture.h"
#include "fakes/FakeIPC.h"
#include "framework/ClientSessionInterface.h"

namespace tallyd {
namespace {

using platform::Array;
using platform::Value;
using Answer = fakes::FakeIncomingCall::Answer;
using Results = std::vector<Value>;

/// Notes in a trace when a grant comes and goes.
class TracingSandbox : public fakes::FakeSandbox {
 public:
  explicit TracingSandbox(std::vector<std::string>& trace) : _trace(trace) {}

  std::unique_ptr<Grant> offerGrant(std::string_view token,
                                    std::vector<platform::FileDescriptor> descriptors) override {
    _trace.push_back("grant of " + std::to_string(descriptors.size()) + " for " + std::string(token));
    return std::make_unique<TracedGrant>(_trace);
  }

 private:
  struct TracedGrant : Grant {
    explicit TracedGrant(std::vector<std::string>& all) : trace(all) {}
    ~TracedGrant() override { trace.emplace_back("grant withdrawn"); }
    std::vector<std::string>& trace;
  };
  std::vector<std::string>& _trace;
};

class ClientSessionExportTest : public SessionFixture {
 protected:
  ClientSessionExportTest() {
    auto session = makeSession();
    observed = session;
    connection.setExportedInterface(clientSessionInterface());
    connection.setExportedObject(std::make_shared<ClientSessionExport>(std::move(session), sandbox));
    connection.resume();
  }

  static Value none() { return Array(); }
  static Value some(const Dictionary& dictionary) {
    Array list;
    list.append(dictionary);
    return list;
  }
  /// What no place that may be missing takes.
  static Value two() {
    Array list;
    list.append(Dictionary());
    list.append(Dictionary());
    return list;
  }
  /// "[[NAME, …]]"
  static Value states(std::vector<Value> names) {
    Array list;
    list.append(Array(std::move(names)));
    return list;
  }

  Results answerTo(std::string_view method, std::vector<Value> arguments = {}) {
    const auto call = connection.call(method, std::move(arguments));
    EXPECT_TRUE(call->rejections.empty());
    EXPECT_EQ(call->replies.size(), 1U);
    return call->replies.empty() ? Results() : call->replies[0];
  }
  /// Calls without wanting an answer; gives back how many answers were tried all the same.
  int tell(std::string_view method, std::vector<Value> arguments = {}) {
    const auto call = connection.call(method, std::move(arguments), Answer::NotWanted);
    EXPECT_TRUE(call->replies.empty());
    EXPECT_TRUE(call->rejections.empty());
    return call->unwantedReplies;
  }
  void expectRejected(std::string_view method, std::vector<Value> arguments) {
    forget();
    const auto call = connection.call(method, arguments);
    EXPECT_EQ(call->rejections, Texts{"a dictionary that may be missing has at most one element"});
    EXPECT_TRUE(call->replies.empty());
    tell(method, std::move(arguments));
    EXPECT_TRUE(fake.log.lines().empty());
    EXPECT_TRUE(backends.trace.empty());
    EXPECT_TRUE(delegate.asked.empty());
  }
  /// Configures and starts with the scripted backends.
  void startThroughTheConnection() {
    delegate.storebag = backends.storebag();
    answerTo("SetSessionInfo", {some(sessionInfo()), none(), none()});
    answerTo("StartConfig");
    forget();
  }
  static std::vector<platform::FileDescriptor> twoDescriptors() {
    std::vector<platform::FileDescriptor> descriptors;
    for (int i = 0; i < 2; ++i) descriptors.emplace_back(::open("/dev/null", O_RDONLY | O_CLOEXEC));
    return descriptors;
  }
  std::shared_ptr<TallydSession> session() const { return observed.lock(); }

  TracingSandbox sandbox{backends.trace};
  fakes::FakeServiceConnection connection;
  std::weak_ptr<TallydSession> observed;
};

TEST_F(ClientSessionExportTest, SetSessionInfoTakesBothDictionaries) {
  EXPECT_EQ(answerTo("SetSessionInfo",
                     {some(sessionInfo()), some(userInfo("phone", "calls")), Array({"first", "second"})}),
            Results{"received"});
  EXPECT_EQ(session()->sessionID(), 7U);
  EXPECT_EQ(session()->userInfo(), userInfo("phone", "calls"));
}

TEST_F(ClientSessionExportTest, SetSessionInfoTakesNothingForEither) {
  EXPECT_EQ(answerTo("SetSessionInfo", {none(), none(), none()}), Results{"received"});
  EXPECT_EQ(session()->sessionInfo(), std::nullopt);
  EXPECT_EQ(session()->userInfo(), std::nullopt);
}

TEST_F(ClientSessionExportTest, AnEmptyDictionaryIsNotNothing) {
  EXPECT_EQ(answerTo("SetSessionInfo", {some({}), some({}), none()}), Results{"received"});
  EXPECT_EQ(session()->sessionInfo(), Dictionary());
  EXPECT_EQ(session()->userInfo(), Dictionary());
}

TEST_F(ClientSessionExportTest, StartConfigAnswersNothingWithoutStorebag) {
  EXPECT_EQ(answerTo("StartConfig"), Results{none()});
}

TEST_F(ClientSessionExportTest, StartConfigAnswersAnEmptyListWhenNoBackendReports) {
  delegate.storebag = Dictionary();
  answerTo("SetSessionInfo", {some(sessionInfo()), none(), none()});
  EXPECT_EQ(answerTo("StartConfig"), Results{states({})});
}

TEST_F(ClientSessionExportTest, StartConfigAnswersTheReportingBackends) {
  backends.scripts = {{"dashboard", {}}, {"splunk", {}}};
  delegate.storebag = backends.storebag();
  answerTo("SetSessionInfo", {some(sessionInfo()), none(), none()});
  EXPECT_EQ(answerTo("StartConfig"), (Results{states({"dashboard", "splunk"})}));
}

TEST_F(ClientSessionExportTest, FetchStatesTakesUserInfoOrNothing) {
  EXPECT_EQ(answerTo("FetchStates", {none()}), Results{none()});
  backends.scripts["splunk"];
  startThroughTheConnection();
  EXPECT_EQ(answerTo("FetchStates", {none()}), Results{states({"splunk"})});
  EXPECT_EQ(session()->userInfo(), std::nullopt);
  EXPECT_EQ(answerTo("FetchStates", {some(userInfo("phone", "calls"))}), Results{states({"splunk"})});
  EXPECT_EQ(session()->userInfo(), userInfo("phone", "calls"));
}

TEST_F(ClientSessionExportTest, FetchDisplayURLAnswersText) {
  EXPECT_EQ(answerTo("FetchDisplayURL"), Results{"URL not available"});
}

TEST_F(ClientSessionExportTest, SendMessageWithCategoryTakesNumbersAndPayloadOrNothing) {
  backends.scripts["splunk"];
  startThroughTheConnection();
  EXPECT_EQ(answerTo("SendMessageWithCategory", {65'535, 300, some({{"a", 1}})}), Results{none()});
  EXPECT_EQ(answerTo("SendMessageWithCategory", {0, 2, some({})}), Results{none()});
  EXPECT_EQ(answerTo("SendMessageWithCategory", {0, 2, none()}), Results{none()});
  ASSERT_EQ(backends.messages.size(), 3U);
  EXPECT_EQ(backends.messages[0].method, 65'535);
  EXPECT_EQ(backends.messages[0].respCode, 300);
  EXPECT_EQ(backends.messages[0].payload, (Dictionary{{"a", 1}}));
  EXPECT_EQ(backends.messages[1].payload, Dictionary());
  EXPECT_EQ(backends.messages[2].payload, std::nullopt);
}

TEST_F(ClientSessionExportTest, AResultTravelsAsTheOnlyElement) {
  backends.scripts["splunk"] = {.sent = "posted", .flushed = ""};
  startThroughTheConnection();
  EXPECT_EQ(answerTo("SendMessageWithCategory", {1, 2, none()}), Results{Array({"posted"})});
  EXPECT_EQ(answerTo("FlushMessages"), Results{Array({""})});
}

TEST_F(ClientSessionExportTest, FlushMessagesAnswersNothingWithoutBackends) {
  EXPECT_EQ(answerTo("FlushMessages"), Results{none()});
}

TEST_F(ClientSessionExportTest, UploadFileOffersTheGrantForAsLongAsTheUploadLasts) {
  backends.scripts["upload_server"] = {.uploadsFiles = true};
  startThroughTheConnection();
  const auto call =
      connection.call("UploadFileAtPath", {"file:///tmp/a", "tally.file:/tmp/a", Array({nullptr, nullptr})},
                      Answer::Wanted, twoDescriptors());
  ASSERT_EQ(call->replies.size(), 1U);
  EXPECT_EQ(call->replies[0], Results{true});
  EXPECT_EQ(backends.trace, (Texts{"grant of 2 for tally.file:/tmp/a",
                                   "upload_server: file /tmp/a tally.file:/tmp/a", "grant withdrawn"}));
}

TEST_F(ClientSessionExportTest, UploadFileWithoutDescriptorsOffersNoGrant) {
  backends.scripts["upload_server"];
  startThroughTheConnection();
  EXPECT_EQ(answerTo("UploadFileAtPath", {"file:///tmp/a", "", none()}), Results{false});
  EXPECT_EQ(backends.trace, Texts{"upload_server: file /tmp/a "});
}

TEST_F(ClientSessionExportTest, UploadLogDataAnswersWithoutAnError) {
  EXPECT_EQ(answerTo("UploadLogData", {Array({"line"})}), (Results{false, none()}));
  backends.scripts["dashboard"] = {.uploadsLogData = true};
  startThroughTheConnection();
  EXPECT_EQ(answerTo("UploadLogData", {Array({"line", 5})}), (Results{true, none()}));
  EXPECT_EQ(answerTo("UploadLogData", {none()}), (Results{true, none()}));
  EXPECT_EQ(backends.trace, (Texts{"dashboard: log data (line, 5)", "dashboard: log data ()"}));
}

TEST_F(ClientSessionExportTest, SendMessageWithSessionInfoTakesEverythingOrNothing) {
  EXPECT_EQ(answerTo("SendMessageWithSessionInfo", {some(sessionInfo()), none(), 1, 2, none()}),
            Results{"storebag not available"});
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  EXPECT_EQ(answerTo("SendMessageWithSessionInfo",
                     {some(sessionInfo(9)), some(userInfo("phone", "calls")), 65'535, 300, some({{"a", 1}})}),
            Results{"finished"});
  EXPECT_EQ(session()->sessionID(), 9U);
  EXPECT_EQ(session()->userInfo(), userInfo("phone", "calls"));
  ASSERT_EQ(backends.messages.size(), 1U);
  EXPECT_EQ(backends.messages[0].method, 65'535);
  EXPECT_EQ(backends.messages[0].respCode, 300);
  EXPECT_EQ(backends.messages[0].payload, (Dictionary{{"a", 1}}));
}

TEST_F(ClientSessionExportTest, SendMessageWithSessionInfoWithoutIdentifiersIsNeverAnswered) {
  for (const Value& info : {none(), some({})}) {
    const auto call = connection.call("SendMessageWithSessionInfo", {info, none(), 1, 2, none()});
    EXPECT_TRUE(call->replies.empty());
    EXPECT_TRUE(call->rejections.empty());
  }
}

TEST_F(ClientSessionExportTest, TwoElementsWhereOneMayBeAreRejectedBeforeTheSessionHears) {
  backends.scripts["splunk"];
  startThroughTheConnection();
  expectRejected("SetSessionInfo", {two(), none(), none()});
  expectRejected("SetSessionInfo", {none(), two(), none()});
  expectRejected("FetchStates", {two()});
  expectRejected("SendMessageWithCategory", {1, 2, two()});
  expectRejected("SendMessageWithSessionInfo", {two(), none(), 1, 2, none()});
  expectRejected("SendMessageWithSessionInfo", {some(sessionInfo()), two(), 1, 2, none()});
  expectRejected("SendMessageWithSessionInfo", {some(sessionInfo()), none(), 1, 2, two()});
  EXPECT_EQ(session()->sessionID(), 7U);
}

TEST_F(ClientSessionExportTest, CallsThatWantNoAnswerDoTheirWork) {
  backends.scripts["splunk"] = {.sent = "s", .uploadsFiles = true, .uploadsLogData = true};
  delegate.storebag = backends.storebag();
  tell("SetSessionInfo", {some(sessionInfo()), none(), none()});
  tell("StartConfig");
  tell("FetchStates", {some(userInfo("phone", "calls"))});
  EXPECT_EQ(session()->userInfo(), userInfo("phone", "calls"));
  forget();
  tell("FetchDisplayURL");
  tell("SendMessageWithCategory", {1, 2, none()});
  tell("FlushMessages");
  tell("UploadFileAtPath", {"file:///tmp/a", "t", none()});
  tell("UploadLogData", {none()});
  EXPECT_EQ(backends.trace,
            (Texts{"splunk: message 1/2", "splunk: flush", "splunk: file /tmp/a t", "splunk: log data ()"}));
  EXPECT_TRUE(fake.log.has(platform::LogLevel::Debug, "Fetching display URL for session 7"));
  forget();
  tell("SendMessageWithSessionInfo", {some(sessionInfo(9)), none(), 3, 4, none()});
  EXPECT_EQ(backends.messages.size(), 1U);
  EXPECT_EQ(session()->sessionID(), 9U);
}

TEST_F(ClientSessionExportTest, CallsThatWantNoAnswerHaveNoReplyBlockWhereItMayBeMissing) {
  backends.scripts["splunk"];
  delegate.storebag = backends.storebag();
  EXPECT_EQ(tell("SetSessionInfo", {some(sessionInfo()), none(), none()}), 1);
  EXPECT_EQ(tell("StartConfig"), 0);
  EXPECT_EQ(tell("FetchStates", {none()}), 0);
  EXPECT_EQ(tell("FetchDisplayURL"), 1);
  EXPECT_EQ(tell("SendMessageWithCategory", {1, 2, none()}), 1);
  EXPECT_EQ(tell("FlushMessages"), 1);
  EXPECT_EQ(tell("UploadFileAtPath", {"file:///tmp/a", "t", none()}), 1);
  EXPECT_EQ(tell("UploadLogData", {none()}), 1);
  EXPECT_EQ(tell("SendMessageWithSessionInfo", {some(sessionInfo()), none(), 1, 2, none()}), 0);
}

TEST_F(ClientSessionExportTest, TheSessionEndsWithItsConnection) {
  EXPECT_FALSE(observed.expired());
  connection.invalidate();
  EXPECT_TRUE(observed.expired());
}

}  // namespace
}  // namespace tallyd
