#include "storebag/StorebagRetrieval.h"

#include "StorebagFixture.h"
#include "storebag/StorebagEnvironment.h"

namespace tallyd {
namespace {

using platform::Dictionary;
using platform::Value;

class StorebagRetrievalTest : public StorebagFixture {
 protected:
  std::string requestedURL() const { return fake.http.synchronousRequests().back().url; }
};

TEST_F(StorebagRetrievalTest, ReturnsTheCurrentEnvironmentsSectionWithVersionAndMaxAge) {
  const StorebagFetch fetch = fetchStorebagForClientType(platform, 5);
  EXPECT_EQ(fetch.storebag, section("release"));
  EXPECT_EQ(fetch.version, "bag 17");
  EXPECT_EQ(fetch.maxAgeSeconds, 600);
  EXPECT_EQ(fake.log.lines(),
            (Lines{debug(std::string("Storebag Server URL: ") + kPlayhallURL), info("Environment type 4")}));
}

TEST_F(StorebagRetrievalTest, EachEnvironmentSelectsItsOwnSection) {
  for (const std::int64_t type : {1, 2, 3, 4}) {
    fakes::FakePlatform device;
    device.frameworkBundle.resources = fake.frameworkBundle.resources;
    device.http.answer = fake.http.answer;
    device.preferences.set("com.quillon.tally", "environmentType", type);
    const auto name = environmentNameForType(static_cast<std::uint32_t>(type));
    EXPECT_EQ(fetchStorebagForClientType(device.platform, 5).storebag, section(name->data()));
  }
}

TEST_F(StorebagRetrievalTest, TheRequestIsAPlainGETThatReloadsAndWaitsFifteenSeconds) {
  (void)fetchStorebagForClientType(platform, 5);
  ASSERT_EQ(requestCount(), 1U);
  const auto request = fake.http.synchronousRequests()[0];
  EXPECT_EQ(request.url, kPlayhallURL);
  EXPECT_EQ(request.method, "GET");
  EXPECT_TRUE(request.headers.empty());
  EXPECT_TRUE(request.body.empty());
  EXPECT_EQ(request.timeout, std::chrono::seconds(15));
  EXPECT_EQ(request.cachePolicy, platform::CachePolicy::ReloadIgnoringCache);
  EXPECT_TRUE(fake.http.posts().empty());
}

TEST_F(StorebagRetrievalTest, TheURLNamesTheClientTypesStorebagOnThePreferredServer) {
  prefer("tally_storebag_url", "http://bags.test/base");
  (void)fetchStorebagForClientType(platform, 11);
  EXPECT_EQ(requestedURL(), "http://bags.test/base/fennel?version=7.42.1");
}

TEST_F(StorebagRetrievalTest, AnInternalBuildAsksTheInternalServer) {
  fake.device.answers["ReleaseType"] = "Internal";
  EXPECT_EQ(fetchStorebagForClientType(platform, 6).storebag, section("quillon_internal"));
  EXPECT_EQ(requestedURL(), "https://storebags.quillon.internal/storebags/sorrel/vitrine?version=7.42.1");
}

TEST_F(StorebagRetrievalTest, AMissingBundleVersionSendsTheDefaultVersion) {
  fake.frameworkBundle.info.remove("CFBundleVersion");
  (void)fetchStorebagForClientType(platform, 5);
  EXPECT_EQ(requestedURL(), "https://storebags.quillon.example/bags/sorrel/playhall?version=6.21");
}

TEST_F(StorebagRetrievalTest, AClientTypeWithoutANameRequestsItAllTheSameWithNullForTheName) {
  for (const std::int32_t clientType : {1, 2, 3, 4, 12, -7}) {
    EXPECT_EQ(fetchStorebagForClientType(platform, clientType).storebag, section("release")) << clientType;
    EXPECT_EQ(requestedURL(), "https://storebags.quillon.example/bags/sorrel/(null)?version=7.42.1");
  }
  EXPECT_TRUE(fake.log.has(
      platform::LogLevel::Debug,
      "Storebag Server URL: https://storebags.quillon.example/bags/sorrel/(null)?version=7.42.1"));
}

TEST_F(StorebagRetrievalTest, ClientTypeZeroMakesNoRequest) {
  const StorebagFetch fetch = fetchStorebagForClientType(platform, 0);
  EXPECT_FALSE(fetch.storebag);
  EXPECT_FALSE(fetch.version);
  EXPECT_EQ(fetch.maxAgeSeconds, 0);
  EXPECT_EQ(requestCount(), 0U);
  EXPECT_EQ(fake.log.lines(), Lines{critical("Could not find storebag name for client type 0")});
}

TEST_F(StorebagRetrievalTest, TheMaxAgeIsReadFromTheHeaderInWhateverCase) {
  fake.http.answer = [body = server.envelope(bag())](const platform::HTTPRequest&) {
    return fakes::FakeHTTPClient::ok(body, {{"cache-control", "max-age=77"}});
  };
  EXPECT_EQ(fetchStorebagForClientType(platform, 5).maxAgeSeconds, 77);
}

TEST_F(StorebagRetrievalTest, AResponseWithoutCacheControlHasNoMaxAge) {
  serve(bag(), std::nullopt);
  EXPECT_EQ(fetchStorebagForClientType(platform, 5).maxAgeSeconds, 0);
}

TEST_F(StorebagRetrievalTest, ACacheControlWithoutMaxAgeGivesADay) {
  serve(bag(), "public");
  EXPECT_EQ(fetchStorebagForClientType(platform, 5).maxAgeSeconds, 86'400);
}

TEST_F(StorebagRetrievalTest, AStatusOtherThan200IsNoErrorButAWarning) {
  fake.http.answer = [body = server.envelope(bag())](const platform::HTTPRequest&) {
    auto result = fakes::FakeHTTPClient::ok(body);
    result.response->status = 503;
    return result;
  };
  EXPECT_EQ(fetchStorebagForClientType(platform, 5).storebag, section("release"));
  EXPECT_EQ(fake.log.lines(),
            (Lines{debug(std::string("Storebag Server URL: ") + kPlayhallURL),
                   warning(std::string("Storebag server answers status 503 for ") + kPlayhallURL),
                   info("Environment type 4")}));
}

TEST_F(StorebagRetrievalTest, EnvelopeAndBagMayBeBinaryPropertyLists) {
  using platform::PropertyListFormat;
  const std::string bytes = *platform::dataWithPropertyList(bag(), PropertyListFormat::Binary);
  const Dictionary envelope{{"signature", platform::base64Encoded(server.signature(bytes))},
                            {"bag", platform::base64Encoded(bytes)},
                            {"unknown", 5}};
  serveBody(*platform::dataWithPropertyList(envelope, PropertyListFormat::Binary));
  EXPECT_EQ(fetchStorebagForClientType(platform, 5).storebag, section("release"));
}

TEST_F(StorebagRetrievalTest, CharactersOutsideTheBase64AlphabetArePassedOver) {
  const std::string bytes = *platform::dataWithPropertyList(bag(), platform::PropertyListFormat::XML);
  const auto withJunk = [](const std::string& text) {
    return "\n\t " + text.substr(0, 5) + "\r\n*-_!" + text.substr(5) + "\n";
  };
  serveBody(server.envelopeOf(withJunk(platform::base64Encoded(server.signature(bytes))),
                              withJunk(platform::base64Encoded(bytes))));
  EXPECT_EQ(fetchStorebagForClientType(platform, 5).storebag, section("release"));
}

TEST_F(StorebagRetrievalTest, TheKeyMayBeABareRSAPublicKey) {
  fake.frameworkBundle.resources["publicKey.der"] = server.rsaPublicKey();
  EXPECT_EQ(fetchStorebagForClientType(platform, 5).storebag, section("release"));
}

TEST_F(StorebagRetrievalTest, SeedFallsBackToReleaseAfterAWarning) {
  prefer("environmentType", 3);
  serve({{"version", "1"}, {"release", section("release")}});
  const StorebagFetch fetch = fetchStorebagForClientType(platform, 5);
  EXPECT_EQ(fetch.storebag, section("release"));
  EXPECT_EQ(fetch.version, "1");
  EXPECT_EQ(fake.log.lines(),
            (Lines{debug(std::string("Storebag Server URL: ") + kPlayhallURL), info("Environment type 3"),
                   warning("Seed section is missing in the storebag.")}));
}

TEST_F(StorebagRetrievalTest, ASeedSectionThatIsNoDictionaryCountsAsMissing) {
  prefer("environmentType", 3);
  serve({{"version", "1"}, {"seed", "not a section"}, {"release", section("release")}});
  EXPECT_EQ(fetchStorebagForClientType(platform, 5).storebag, section("release"));
  EXPECT_TRUE(fake.log.has(platform::LogLevel::Warning, "Seed section is missing in the storebag."));
}

TEST_F(StorebagRetrievalTest, AnEmptySectionIsAStorebag) {
  serve({{"version", ""}, {"release", Dictionary()}});
  const StorebagFetch fetch = fetchStorebagForClientType(platform, 5);
  EXPECT_EQ(fetch.storebag, Dictionary());
  EXPECT_EQ(fetch.version, "");
}

TEST_F(StorebagRetrievalTest, AVersionThatIsNoTextIsDescribedAfterAWarning) {
  serve({{"version", 17}, {"release", section("release")}});
  EXPECT_EQ(fetchStorebagForClientType(platform, 5).version, "17");
  EXPECT_TRUE(
      fake.log.has(platform::LogLevel::Warning, "Storebag version for client type 5 is not a string"));
}

TEST_F(StorebagRetrievalTest, TheSignedBagIsReturnedWhole) {
  std::int32_t maxAgeSeconds = -1;
  EXPECT_EQ(fetchSignedStorebag(platform, "lanternbox", maxAgeSeconds), bag());
  EXPECT_EQ(maxAgeSeconds, 600);
  EXPECT_EQ(requestedURL(), "https://storebags.quillon.example/bags/sorrel/lanternbox?version=7.42.1");
}

TEST_F(StorebagRetrievalTest, EveryFetchAsksAnew) {
  for (int i = 0; i < 3; ++i) (void)fetchStorebagForClientType(platform, 5);
  EXPECT_EQ(requestCount(), 3U);
}

}  // namespace
}  // namespace tallyd
