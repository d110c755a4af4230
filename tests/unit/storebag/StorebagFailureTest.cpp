// What is logged, and in which order, when a storebag can't be had.

#include "StorebagFixture.h"
#include "storebag/StorebagRetrieval.h"

namespace tallyd {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::LogLevel;

class StorebagFailureTest : public StorebagFixture {
 protected:
  /// Fetches for client type 5, which must fail, and returns the lines behind the URL's.
  Lines linesOfFailure() {
    fake.log.clear();
    const StorebagFetch fetch = fetchStorebagForClientType(platform, 5);
    EXPECT_FALSE(fetch.storebag);
    EXPECT_FALSE(fetch.version);
    maxAgeSeconds = fetch.maxAgeSeconds;
    Lines lines = fake.log.lines();
    EXPECT_FALSE(lines.empty());
    if (lines.empty()) return lines;
    EXPECT_EQ(lines.front(), debug(std::string("Storebag Server URL: ") + kPlayhallURL));
    lines.erase(lines.begin());
    return lines;
  }
  std::string signatureOf(std::string_view bytes) const {
    return platform::base64Encoded(server.signature(bytes));
  }
  void serveStatus(int status, std::string body) {
    fake.http.answer = [status, body = std::move(body)](const platform::HTTPRequest&) {
      auto result = fakes::FakeHTTPClient::ok(body);
      result.response->status = status;
      return result;
    };
  }
  void expectOnlyFetchLine() { EXPECT_EQ(linesOfFailure(), Lines{couldNotFetch}); }
  void expectRefusedSignature() {
    const Lines lines = linesOfFailure();
    ASSERT_EQ(lines.size(), 2U);
    EXPECT_EQ(lines[0].level, LogLevel::Critical);
    EXPECT_TRUE(lines[0].text.starts_with("Signature can not be verified, 0x")) << lines[0];
    EXPECT_EQ(lines[1], couldNotFetch);
  }

  const fakes::FakeLog::Line couldNotFetch = critical("Could not fetch storebag for client type 5");
  const std::string bagBytes = *platform::dataWithPropertyList(bag(), platform::PropertyListFormat::XML);
  std::int32_t maxAgeSeconds = -1;
};

TEST_F(StorebagFailureTest, ATransportErrorIsLoggedWithTheURLFirst) {
  serveFailure("storebags.quillon.example: could not connect");
  EXPECT_EQ(linesOfFailure(),
            (Lines{critical(std::string("Error resolving with lookup server ") + kPlayhallURL),
                   critical("sendSynchronousRequest error storebags.quillon.example: could not connect"),
                   couldNotFetch}));
  EXPECT_EQ(maxAgeSeconds, 0);
}

TEST_F(StorebagFailureTest, AnErrorCountsWhateverBodyCameWithIt) {
  fake.http.answer = [body = server.envelope(bag())](const platform::HTTPRequest&) {
    auto result = fakes::FakeHTTPClient::ok(body, {{"Cache-Control", "max-age=600"}});
    result.error = "the line broke";
    return result;
  };
  EXPECT_EQ(linesOfFailure(),
            (Lines{critical(std::string("Error resolving with lookup server ") + kPlayhallURL),
                   critical("sendSynchronousRequest error the line broke"), couldNotFetch}));
  EXPECT_EQ(maxAgeSeconds, 0);
}

TEST_F(StorebagFailureTest, ATransportErrorLeavesTheMaxAgeUntouched) {
  serveFailure("no network");
  std::int32_t untouched = 41;
  EXPECT_FALSE(fetchSignedStorebag(platform, "playhall", untouched));
  EXPECT_EQ(untouched, 41);
}

TEST_F(StorebagFailureTest, ABodyThatIsNoPropertyListAlsoLacksItsSignature) {
  for (const char* body : {"", "<html>", "<?xml version=\"1.0\"?><plist><dict>", "bplist00"}) {
    serveBody(body);
    const Lines lines = linesOfFailure();
    ASSERT_EQ(lines.size(), 3U) << body;
    EXPECT_EQ(lines[0].level, LogLevel::Critical);
    EXPECT_TRUE(lines[0].text.starts_with("propertyListWithData error ")) << lines[0];
    EXPECT_GT(lines[0].text.size(), std::string_view("propertyListWithData error ").size());
    EXPECT_EQ(lines[1], critical("Signature is missing"));
    EXPECT_EQ(lines[2], couldNotFetch);
  }
}

TEST_F(StorebagFailureTest, TheStatusOfAnErrorPageIsLoggedWithTheURLFirst) {
  for (const int status : {199, 300, 304, 404, 503}) {
    serveStatus(status, "<html>");
    const Lines lines = linesOfFailure();
    ASSERT_EQ(lines.size(), 4U) << status;
    EXPECT_EQ(lines[0],
              warning(fmt::format("Storebag server answers status {} for {}", status, kPlayhallURL)));
    EXPECT_TRUE(lines[1].text.starts_with("propertyListWithData error ")) << lines[1];
    EXPECT_EQ(lines[2], critical("Signature is missing"));
    EXPECT_EQ(lines[3], couldNotFetch);
  }
}

TEST_F(StorebagFailureTest, ASuccessfulStatusIsNotLogged) {
  for (const int status : {200, 204, 299}) {
    serveStatus(status, "<html>");
    const Lines lines = linesOfFailure();
    ASSERT_EQ(lines.size(), 3U) << status;
    EXPECT_TRUE(lines[0].text.starts_with("propertyListWithData error ")) << lines[0];
  }
}

TEST_F(StorebagFailureTest, TheMaxAgeOfARefusedBodyIsKept) {
  serveBody("<html>", "public");
  (void)linesOfFailure();
  EXPECT_EQ(maxAgeSeconds, 86'400);
}

TEST_F(StorebagFailureTest, AnEnvelopeWithoutSignatureIsRefused) {
  serveBody(*platform::dataWithPropertyList(Dictionary{{"bag", platform::base64Encoded(bagBytes)}},
                                            platform::PropertyListFormat::XML));
  EXPECT_EQ(linesOfFailure(), (Lines{critical("Signature is missing"), couldNotFetch}));
}

TEST_F(StorebagFailureTest, AnEnvelopeThatIsNoDictionaryLacksItsSignature) {
  for (const platform::Value& envelope :
       {platform::Value(Array({"signature", "bag"})), platform::Value("signature"), platform::Value(5)}) {
    serveBody(*platform::dataWithPropertyList(envelope, platform::PropertyListFormat::XML));
    EXPECT_EQ(linesOfFailure(), (Lines{critical("Signature is missing"), couldNotFetch}));
  }
}

TEST_F(StorebagFailureTest, AMissingKeyIsNotLogged) {
  fake.frameworkBundle.resources.clear();
  expectOnlyFetchLine();
}

TEST_F(StorebagFailureTest, AKeyThatIsNoRSAKeyIsNotLogged) {
  fake.frameworkBundle.resources["publicKey.der"] = "not a key";
  expectOnlyFetchLine();
}

TEST_F(StorebagFailureTest, ABrokenSignatureTextIsNotLogged) {
  const std::string bagText = platform::base64Encoded(bagBytes);
  for (const char* text : {"A", "AAAAA", "A===", "AA==AAAA"}) {
    serveBody(server.envelopeOf(text, bagText));
    expectOnlyFetchLine();
  }
}

TEST_F(StorebagFailureTest, ASignatureThatIsNoTextIsNotLogged) {
  const std::string bagText = platform::base64Encoded(bagBytes);
  for (const platform::Value& signature :
       {platform::Value(5), platform::Value(true), platform::Value(Array()), platform::Value(Dictionary()),
        platform::Value(platform::Data(server.signature(bagBytes)))}) {
    serveBody(server.envelopeOf(signature, bagText));
    expectOnlyFetchLine();
  }
}

TEST_F(StorebagFailureTest, ABrokenBagTextIsNotLogged) {
  serveBody(server.envelopeOf(signatureOf(bagBytes), "AAAAA"));
  expectOnlyFetchLine();
}

TEST_F(StorebagFailureTest, ABagThatIsNoTextIsNotLogged) {
  serveBody(server.envelopeOf(signatureOf(bagBytes), platform::Data(bagBytes)));
  expectOnlyFetchLine();
  serveBody(server.envelopeOf(signatureOf(bagBytes), bag()));
  expectOnlyFetchLine();
}

TEST_F(StorebagFailureTest, AMissingBagIsNotLogged) {
  serveBody(*platform::dataWithPropertyList(Dictionary{{"signature", signatureOf(bagBytes)}},
                                            platform::PropertyListFormat::XML));
  expectOnlyFetchLine();
}

TEST_F(StorebagFailureTest, ASignatureOverOtherBytesCanNotBeVerified) {
  serveBody(server.envelopeOf(signatureOf("other bytes"), platform::base64Encoded(bagBytes)));
  expectRefusedSignature();
}

TEST_F(StorebagFailureTest, ASignatureOverTheBagsTextCanNotBeVerified) {
  const std::string bagText = platform::base64Encoded(bagBytes);
  serveBody(server.envelopeOf(signatureOf(bagText), bagText));
  expectRefusedSignature();
}

TEST_F(StorebagFailureTest, ASignatureWithAnotherKeyCanNotBeVerified) {
  serveBody(fakes::StorebagSigner::stranger().envelope(bag()));
  expectRefusedSignature();
  EXPECT_EQ(maxAgeSeconds, 600);
}

TEST_F(StorebagFailureTest, ASignatureOfTheWrongLengthCanNotBeVerified) {
  const std::string bagText = platform::base64Encoded(bagBytes);
  for (const std::string& signature : {std::string(), server.signature(bagBytes).substr(4),
                                       server.signature(bagBytes) + "more", std::string(5000, 'x')}) {
    serveBody(server.envelopeOf(platform::base64Encoded(signature), bagText));
    expectRefusedSignature();
  }
}

TEST_F(StorebagFailureTest, ASignedBagThatIsNoPropertyListIsNotLogged) {
  serveBody(server.envelopeOfBytes("<html>"));
  expectOnlyFetchLine();
  serveBody(server.envelopeOfBytes(""));
  expectOnlyFetchLine();
}

TEST_F(StorebagFailureTest, ASignedBagThatIsNoDictionaryIsNamed) {
  serveBody(server.envelope(Array({"release"})));
  EXPECT_EQ(linesOfFailure(), (Lines{critical("Storebag playhall is not a dictionary"), couldNotFetch}));
}

TEST_F(StorebagFailureTest, NoEnvironmentButSeedFallsBack) {
  prefer("environmentType", 1);
  serve({{"version", "1"}, {"release", section("release")}});
  EXPECT_EQ(linesOfFailure(),
            (Lines{info("Environment type 1"),
                   critical("Could not find storebag for client type 5 with development environment")}));
  EXPECT_EQ(maxAgeSeconds, 600);
}

TEST_F(StorebagFailureTest, SeedWithoutReleaseNamesRelease) {
  prefer("environmentType", 3);
  serve({{"version", "1"}, {"development", section("development")}});
  EXPECT_EQ(linesOfFailure(),
            (Lines{info("Environment type 3"), warning("Seed section is missing in the storebag."),
                   critical("Could not find storebag for client type 5 with release environment")}));
}

TEST_F(StorebagFailureTest, EnvironmentZeroMatchesNoSection) {
  prefer("environmentType", 0);
  EXPECT_EQ(linesOfFailure(),
            (Lines{info("Environment type 0"),
                   critical("Could not find storebag for client type 5 with (null) environment")}));
}

TEST_F(StorebagFailureTest, AnInvalidEnvironmentIsLoggedBeforeTheMissingSection) {
  prefer("environmentType", 7);
  serve({{"version", "1"}, {"release", section("release")}});
  EXPECT_EQ(linesOfFailure(),
            (Lines{critical("Invalid environment type 7"), info("Environment type 2"),
                   critical("Could not find storebag for client type 5 with quillon_internal environment")}));
}

TEST_F(StorebagFailureTest, ASectionThatIsNoDictionaryCountsAsMissing) {
  serve({{"version", "1"}, {"release", Array({"a"})}});
  EXPECT_EQ(linesOfFailure(),
            (Lines{info("Environment type 4"),
                   critical("Could not find storebag for client type 5 with release environment")}));
}

TEST_F(StorebagFailureTest, ABagWithoutSectionNeedsNoVersion) {
  serve(Dictionary());
  EXPECT_EQ(linesOfFailure().back(),
            critical("Could not find storebag for client type 5 with release environment"));
}

}  // namespace
}  // namespace tallyd
