#include "HTTPSPostBackendFixture.h"
#include "framework/Tally.h"
#include "support/GzipCompression.h"

namespace tallyd {
namespace {

class PostRequestTest : public HTTPSPostBackendFixture {
 protected:
  using Result = TallyBackend::Result;

  static Result send(HTTPSPostBackend& backend, const Payload& payload = std::nullopt) {
    return backend.sendMessage(payload, kEventTime, 3, 4);
  }
  /// A backend whose flushes post a document without events, as its limit lets none into the batch.
  std::shared_ptr<HTTPSPostBackend> postingNoEvents() {
    Dictionary entry = entryWith("event_threshold", -1);
    entry.set("extras_on_internal", 1);
    auto backend = evaluated({entry});
    backend->setIsInternal(true);
    backend->setBatchEvents(true);
    return backend;
  }
  static Result flushNoEvents(HTTPSPostBackend& backend) {
    send(backend);
    return backend.flushMessages();
  }
  std::string persistentIdentifier(bool consented) const {
    return Tally(fake.platform).getPersistentIdentifierForDNU(consented).value_or("none");
  }
};

TEST_F(PostRequestTest, PostsToTheURLOfTheStorebagWithoutATimeout) {
  send(*evaluated());
  const auto request = lastPost();
  EXPECT_EQ(request.url, kURL);
  EXPECT_EQ(request.method, "POST");
  EXPECT_EQ(request.timeout.count(), 0);
  EXPECT_EQ(request.cachePolicy, platform::CachePolicy::UseProtocol);
  EXPECT_TRUE(fake.http.synchronousRequests().empty());
}

TEST_F(PostRequestTest, CarriesJSONHeadersAndTheNamesOfUserInfo) {
  send(*evaluated());
  const auto request = lastPost();
  EXPECT_EQ(header(request, "X-RTC-Client-Name"), "Alpha");
  EXPECT_EQ(header(request, "X-RTC-Service-Name"), "VideoCallService");
  EXPECT_EQ(header(request, "X-RTC-Internal-Build"), std::nullopt);
  EXPECT_EQ(header(request, "Accept"), "application/json");
  EXPECT_EQ(header(request, "Content-Type"), "application/json");
  EXPECT_EQ(header(request, "Content-Length"), std::to_string(request.body.size()));
  EXPECT_EQ(request.headers.size(), 5U + (header(request, "Content-Encoding") ? 1U : 0U));
}

TEST_F(PostRequestTest, LeavesTheNamesOutThatUserInfoDoesNotHave) {
  const auto backend = evaluated();
  backend->setUserInfoDict(Dictionary{{kTallyUserInfoServiceName.data(), "OnlyService"}});
  send(*backend);
  EXPECT_EQ(header(lastPost(), "X-RTC-Client-Name"), std::nullopt);
  EXPECT_EQ(header(lastPost(), "X-RTC-Service-Name"), "OnlyService");

  backend->setUserInfoDict(Dictionary{{kTallyUserInfoClientName.data(), 5}});
  send(*backend);
  EXPECT_EQ(header(lastPost(), "X-RTC-Client-Name"), std::nullopt);
  EXPECT_EQ(header(lastPost(), "X-RTC-Service-Name"), std::nullopt);

  backend->setRequireUserInfo(false);
  backend->setUserInfoDict(std::nullopt);
  send(*backend);
  EXPECT_EQ(header(lastPost(), "X-RTC-Client-Name"), std::nullopt);
}

TEST_F(PostRequestTest, TellsAnInternalBuild) {
  const auto backend = evaluated();
  backend->setIsInternal(true);
  send(*backend);
  EXPECT_EQ(header(lastPost(), "X-RTC-Internal-Build"), "1");
  EXPECT_EQ(lastEvent().string("_internal"), "1");
}

TEST_F(PostRequestTest, SendsGzipThatInflatesToTheReturnedDocument) {
  const auto posted = send(*evaluated(), Dictionary{{"text", std::string(5000, 'x')}});
  const auto request = lastPost();
  EXPECT_EQ(header(request, "Content-Encoding"), "gzip");
  EXPECT_EQ(header(request, "Content-Length"), std::to_string(request.body.size()));
  ASSERT_TRUE(posted);
  EXPECT_LT(request.body.size(), posted->size());
  EXPECT_EQ(test::gunzipped(request.body.bytes()), *posted);
}

TEST_F(PostRequestTest, SendsABodyOf100BytesPlainThatGzipWouldMakeLonger) {
  const auto backend = postingNoEvents();
  const std::string letters = "q7Zx!Kp0@Vd3#Lw9$Rb5%Tn2^Gh8&Jc4*Fy6(Ms1)kWuEoAiDzXgHvNqPmB";
  std::string identifier;
  std::optional<std::string> json;
  for (std::size_t length = 1; length <= letters.size() && (!json || json->size() < 100); ++length) {
    identifier = letters.substr(0, length);
    backend->setUdid(identifier.c_str());
    json = flushNoEvents(*backend);
  }
  ASSERT_TRUE(json);
  ASSERT_EQ(json->size(), 100U);
  ASSERT_GT(gzipDeflate(*json, fake.log)->size(), 100U);
  const auto request = lastPost();
  EXPECT_EQ(request.body.bytes(), *json);
  EXPECT_EQ(header(request, "Content-Length"), "100");
  EXPECT_EQ(header(request, "Content-Encoding"), std::nullopt);
  backend->setUdid(kUdid);
}

TEST_F(PostRequestTest, CompressesOnlyWhatBecomesShorter) {
  const auto backend = postingNoEvents();
  bool longer = false;
  bool equal = false;
  bool shorter = false;
  for (std::size_t length = 0; length < 200; ++length) {
    const std::string identifier(length, 'a');
    backend->setUdid(identifier.c_str());
    const auto json = flushNoEvents(*backend);
    ASSERT_TRUE(json);
    const std::size_t compressedBytes = gzipDeflate(*json, fake.log)->size();
    longer |= compressedBytes > json->size();
    equal |= compressedBytes == json->size();
    shorter |= compressedBytes < json->size();
    const auto request = lastPost();
    const bool plain = compressedBytes >= json->size();
    EXPECT_EQ(header(request, "Content-Encoding"), plain ? std::nullopt : std::optional<std::string>("gzip"));
    EXPECT_EQ(header(request, "Content-Length"), std::to_string(plain ? json->size() : compressedBytes));
    EXPECT_EQ(textOf(request), *json);
  }
  EXPECT_TRUE(longer && equal && shorter) << longer << equal << shorter;
  backend->setUdid(kUdid);
}

// The document

TEST_F(PostRequestTest, DatesTheDocumentWithBlanksBeforeTheMilliseconds) {
  const auto backend = evaluated();
  fake.clock.set(std::chrono::microseconds(1'768'478'400'005'999));
  send(*backend);
  EXPECT_EQ(lastBody().string("postTime"), "1768478400.  5");
  EXPECT_EQ(lastBody().size(), 3U);
}

TEST_F(PostRequestTest, TakesTheClientIdentifierByTheTermsOfConsent) {
  ASSERT_NE(persistentIdentifier(true), persistentIdentifier(false));
  send(*evaluated());
  EXPECT_EQ(lastBody().string("clientId"), persistentIdentifier(true));
  send(*evaluated({entryWith("override_dnu", 1)}));
  EXPECT_EQ(lastBody().string("clientId"), persistentIdentifier(false));
  setConsent(false);
  send(*evaluated({entryWith("override_dnu", 1)}));
  EXPECT_EQ(lastBody().string("clientId"), persistentIdentifier(false));
}

TEST_F(PostRequestTest, TakesTheDeviceIDForInternalDevicesWhenTheStorebagAsksForIt) {
  const auto internal = evaluated({entryWith("extras_on_internal", 1)});
  internal->setIsInternal(true);
  send(*internal);
  EXPECT_EQ(lastBody().string("clientId"), kUdid);

  send(*evaluated({entryWith("extras_on_internal", 1)}));
  EXPECT_EQ(lastBody().string("clientId"), persistentIdentifier(true));

  const auto unasked = evaluated({entryWith("extras_on_internal", 0)});
  unasked->setIsInternal(true);
  send(*unasked);
  EXPECT_EQ(lastBody().string("clientId"), persistentIdentifier(true));
}

TEST_F(PostRequestTest, HoldsThePostTimeAloneWithoutAClientIdentifier) {
  fake.device.hasMachineID = false;
  const auto posted = send(*evaluated());
  EXPECT_EQ(posted, R"({"postTime":"1768478400.  0"})");
  const auto request = lastPost();
  EXPECT_EQ(request.body.bytes(), *posted);
  EXPECT_EQ(header(request, "Content-Encoding"), std::nullopt);
}

TEST_F(PostRequestTest, TakesTheDeviceIDWhereThereIsNoPersistentIdentifier) {
  fake.device.hasMachineID = false;
  const auto backend = evaluated({entryWith("extras_on_internal", -1)});
  backend->setIsInternal(true);
  send(*backend);
  EXPECT_EQ(lastBody().string("clientId"), kUdid);
  EXPECT_EQ(lastEvents().size(), 1U);
}

TEST_F(PostRequestTest, PostsTextThatIsNotWellFormedWithReplacements) {
  send(*evaluated(), Dictionary{{"text", "a\xff\"\n"}, {"emoji", "😀"}});
  EXPECT_EQ(lastEvent().string("text"), "a\uFFFD\"\n");
  EXPECT_EQ(lastEvent().string("emoji"), "😀");
}

// What is returned, and what becomes of the post

TEST_F(PostRequestTest, ReturnsTheDocumentOnlyForConsentWithoutAnOverride) {
  const auto posted = send(*evaluated());
  EXPECT_EQ(posted, textOf(lastPost()));
  EXPECT_EQ(send(*evaluated({entryWith("override_dnu", 1)})), std::nullopt);
  setConsent(false);
  EXPECT_EQ(send(*evaluated({entryWith("override_dnu", 1)})), std::nullopt);
  const auto unasked = pending();
  unasked->setRequireUserInfo(false);
  unasked->updateState();
  EXPECT_EQ(send(*unasked), std::nullopt);
  EXPECT_EQ(postCount(), 4U);
}

TEST_F(PostRequestTest, ReadsTheConsentOnceAtTheStart) {
  const auto backend = evaluated();
  setConsent(false);
  backend->updateState();
  EXPECT_EQ(backend->state(), ReportingStateOn);
  EXPECT_NE(send(*backend), std::nullopt);
}

TEST_F(PostRequestTest, LogsTheErrorOfAPost) {
  fake.http.answer = [](const auto&) { return fakes::FakeHTTPClient::failure("connection refused"); };
  const auto backend = evaluated();
  EXPECT_NE(send(*backend), std::nullopt);
  fake.log.clear();
  fake.queues.run();
  EXPECT_EQ(lines(), (Lines{{Level::Error, "Tally(sendMessage) post error: connection refused"}}));
  fake.queues.run();
  EXPECT_EQ(postCount(), 1U);
}

TEST_F(PostRequestTest, SaysNothingOfAResponseWhateverItsStatus) {
  fake.http.answer = [](const auto&) {
    return platform::HTTPResult{std::nullopt, platform::HTTPResponse{500, {}}, platform::Data("failed")};
  };
  send(*evaluated());
  fake.log.clear();
  fake.queues.run();
  EXPECT_TRUE(lines().empty());
  EXPECT_EQ(postCount(), 1U);
}

TEST_F(PostRequestTest, LogsTheErrorOfAPostWhoseBackendIsGone) {
  fake.http.answer = [](const auto&) { return fakes::FakeHTTPClient::failure("timed out"); };
  auto backend = evaluated();
  backend->setBatchEvents(true);
  send(*backend);
  backend->flushMessages();
  send(*backend);
  backend.reset();
  fake.log.clear();
  fake.queues.run();
  EXPECT_EQ(lines(), (Lines{{Level::Error, "Tally(sendMessage) post error: timed out"},
                            {Level::Error, "Tally(sendMessage) post error: timed out"}}));
}

TEST_F(PostRequestTest, LetsThePlatformFailAPostWithoutAURL) {
  fake.http.answer = [](const platform::HTTPRequest& request) {
    return request.url.empty() ? fakes::FakeHTTPClient::failure("no URL") : fakes::FakeHTTPClient::ok("");
  };
  const auto backend = evaluated({entryWithout("post_url")});
  EXPECT_EQ(backend->postURL(), std::nullopt);
  EXPECT_NE(send(*backend), std::nullopt);
  fake.queues.run();
  EXPECT_TRUE(fake.log.has(Level::Error, "Tally(sendMessage) post error: no URL"));
}

}  // namespace
}  // namespace tallyd
