#include "DashboardFixture.h"
#include "platform/property-list/KeyedArchive.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd {
namespace {

using fakes::FakeHTTPClient;
using platform::HTTPRequest;
using platform::Value;

class LogDataUploadTest : public DashboardFixture {
 protected:
  static constexpr const char* kURL = "http://logs.example/upload";

  std::shared_ptr<DashboardBackend> uploader() { return made(profile({{"post_url", kURL}})); }
  void answer(platform::HTTPResult result) {
    fake.http.answer = [result = std::move(result)](const HTTPRequest&) { return result; };
  }
  /// The text of the one datagram that was sent.
  std::string reportedText() {
    fake.queues.run();
    const auto datagram = server.received();
    EXPECT_TRUE(datagram);
    EXPECT_EQ(server.received(), std::nullopt);
    if (!datagram) return {};
    EXPECT_EQ(datagramNumber16(*datagram, DatagramMethod), 0);
    EXPECT_EQ(datagramNumber16(*datagram, DatagramRespCode), 2);
    return datagram->substr(DatagramText);
  }
};

TEST_F(LogDataUploadTest, PostsAKeyedArchive) {
  const Array logData{"line", 5, Dictionary{{"k", Array{true}}}};
  EXPECT_TRUE(uploader()->uploadLogData(logData));
  const auto requests = fake.http.synchronousRequests();
  ASSERT_EQ(requests.size(), 1U);
  EXPECT_EQ(requests[0].url, kURL);
  EXPECT_EQ(requests[0].method, "POST");
  EXPECT_EQ(requests[0].headers,
            (std::vector<std::pair<std::string, std::string>>{{"Content-Type", "application/octet-stream"}}));
  EXPECT_EQ(requests[0].body.bytes(), archivedDataWithRootObject(logData));
  EXPECT_TRUE(platform::propertyListWithData(requests[0].body.bytes()).value);
}

TEST_F(LogDataUploadTest, ReportsTheLocationAsAMessage) {
  answer(FakeHTTPClient::ok("https://logs.example/1?a=b\n"));
  const auto backend = uploader();
  send(*backend, 40);
  fake.queues.run();
  EXPECT_EQ(receivedEventIDs(), std::vector<std::uint16_t>{40});
  backend->sendMessage(std::nullopt, kTime, 1, 0);
  fake.queues.run();
  receivedEventIDs();

  EXPECT_TRUE(backend->uploadLogData(Array{1}));
  EXPECT_EQ(
      fake.log.lines(),
      (Lines{{Level::Debug, "Tally (DashboardBackend): Log data uploaded to https://logs.example/1?a=b\n"}}));
  EXPECT_EQ(backend->eventID(), 2);
  EXPECT_EQ(reportedText(), " LogDataUploadLocation=https://logs.example/1?a\\=b");
}

TEST_F(LogDataUploadTest, StampsTheReportWithTheCurrentTime) {
  fake.clock.set(Seconds(0x01020304) + Milliseconds(996));
  EXPECT_TRUE(uploader()->uploadLogData(Array{}));
  fake.queues.run();
  const std::string datagram = server.received().value_or(std::string(64, '\0'));
  EXPECT_EQ(datagramNumber32(datagram, DatagramSeconds), 0x01020304U);
  EXPECT_EQ(datagramByte(datagram, DatagramSubsecond), 249);
}

TEST_F(LogDataUploadTest, CountsAnyResponseAsOne) {
  auto failed = FakeHTTPClient::ok("");
  failed.response->status = 500;
  answer(failed);
  EXPECT_TRUE(uploader()->uploadLogData(Array{}));
  EXPECT_EQ(reportedText(), " LogDataUploadLocation=empty");
  EXPECT_EQ(fake.log.lines(), (Lines{{Level::Debug, "Tally (DashboardBackend): Log data uploaded to "}}));
}

TEST_F(LogDataUploadTest, ReplacesWhatIsNoTextInTheLocation) {
  answer(
      FakeHTTPClient::ok("a\xFF"
                         "b"));
  EXPECT_TRUE(uploader()->uploadLogData(Array{}));
  EXPECT_EQ(reportedText(),
            " LogDataUploadLocation=a\xEF\xBF\xBD"
            "b");
}

TEST_F(LogDataUploadTest, FailsWithoutAURL) {
  for (const auto& entry : {profile(), profile({{"post_url", 5}})}) {
    fake.log.clear();
    const auto backend = made(entry);
    EXPECT_FALSE(backend->uploadLogData(Array{"line"}));
    EXPECT_FALSE(backend->uploadLogData(Array{}));
    const fakes::FakeLog::Line line{Level::Error,
                                    "Tally (DashboardBackend): Post URL for log data array is nil"};
    EXPECT_EQ(fake.log.lines(), (Lines{line, line}));
  }
  EXPECT_EQ(fake.http.synchronousRequests().size(), 0U);
}

TEST_F(LogDataUploadTest, FailsForWhatCantBeArchived) {
  Value deep = Array{};
  for (int depth = 1; depth < platform::kMaximumValueDepth; ++depth) deep = Array{deep};
  EXPECT_TRUE(uploader()->uploadLogData(*deep.array()));
  fake.log.clear();
  EXPECT_FALSE(uploader()->uploadLogData(Array{deep}));
  EXPECT_EQ(
      fake.log.lines(),
      (Lines{{Level::Error, "Tally (DashboardBackend): Failed to serialize log data array for upload"}}));
  EXPECT_EQ(fake.http.synchronousRequests().size(), 1U);
}

TEST_F(LogDataUploadTest, FailsWithTheErrorOfTheRequest) {
  answer(FakeHTTPClient::failure("no route to logs.example"));
  const auto backend = uploader();
  EXPECT_FALSE(backend->uploadLogData(Array{1}));
  EXPECT_EQ(fake.log.lines(),
            (Lines{{Level::Error,
                    "Tally (DashboardBackend): Error uploading log data array (no route to logs.example)"}}));
  fake.queues.run();
  EXPECT_EQ(server.received(), std::nullopt);
  EXPECT_EQ(backend->eventID(), 0);
}

TEST_F(LogDataUploadTest, FailsWithoutErrorAndResponse) {
  answer({});
  EXPECT_FALSE(uploader()->uploadLogData(Array{1}));
  EXPECT_EQ(fake.log.lines(),
            (Lines{{Level::Error, "Tally (DashboardBackend): Error uploading log data array ((null))"}}));
}

}  // namespace
}  // namespace tallyd
