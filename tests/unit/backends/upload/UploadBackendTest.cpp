#include "backends/upload/UploadBackend.h"

#include <gtest/gtest.h>

#include <fstream>

#include "fakes/FakePlatform.h"
#include "support/Gunzipped.h"

namespace tallyd {
namespace {

namespace fs = std::filesystem;
using fakes::FakeHTTPClient;
using fakes::FakeLog;
using platform::Dictionary;
using platform::HTTPRequest;
using platform::LogLevel;
using Lines = std::vector<FakeLog::Line>;

class UploadBackendTest : public testing::Test {
 protected:
  static constexpr const char* kURL = "https://upload.example/in";
  static constexpr const char* kUdid = "0123456789abcdef0123456789abcdef01234567";
  static constexpr const char* kToken = "tally.file:token";

  UploadBackendTest() { backend->setSessionID(42), backend->setUdid(kUdid); }

  std::shared_ptr<UploadBackend> made(const TallyBackend::Payload& profile) {
    return UploadBackend::initWithName(fake.platform, "upload_server", profile, "Kasten");
  }
  fs::path write(const std::string& name, const std::string& text) {
    std::ofstream(fake.folder.path() / name, std::ios::binary) << text;
    return fake.folder.path() / name;
  }
  void answerWith(const std::string& body, int status = 200) {
    fake.http.answer = [body, status](const HTTPRequest&) {
      auto result = FakeHTTPClient::ok(body);
      result.response->status = status;
      return result;
    };
  }
  bool upload(const fs::path& path) { return backend->uploadFileAtPath(path.string(), kToken); }
  /// Uploads and expects that nothing was sent, for the reason of that one error line.
  void expectRefused(const fs::path& path, const std::string& errorLine) {
    fake.log.clear();
    EXPECT_FALSE(upload(path)) << path;
    EXPECT_EQ(fake.log.lines(),
              (Lines{{LogLevel::Debug, "Tally(uploadFileAtPath): Uploading file " + path.string()},
                     {LogLevel::Error, errorLine}}));
    EXPECT_TRUE(fake.http.synchronousRequests().empty());
    expectExtensionReleased();
  }
  /// The token was consumed and what came of it released, nothing else.
  void expectExtensionReleased() {
    EXPECT_EQ(fake.sandbox.consumed, std::vector<std::string>{kToken});
    EXPECT_EQ(fake.sandbox.released, std::vector<platform::Sandbox::ExtensionHandle>{1});
  }

  fakes::FakePlatform fake;
  std::shared_ptr<UploadBackend> backend =
      made(Dictionary{{"post_url", kURL}, {"display_url", "https://d/"}});
};

TEST_F(UploadBackendTest, IsNotMadeWithoutAnUploadURL) {
  for (const TallyBackend::Payload& profile :
       {TallyBackend::Payload(), TallyBackend::Payload(Dictionary()),
        TallyBackend::Payload(Dictionary{{"display_url", "https://d/"}}),
        TallyBackend::Payload(Dictionary{{"post_url", 5}})}) {
    fake.log.clear();
    EXPECT_EQ(made(profile), nullptr);
    EXPECT_EQ(fake.log.lines(),
              (Lines{{LogLevel::Error, "Tally(UploadBackend): can't resolve upload post URL."}}));
  }
}

TEST_F(UploadBackendTest, DrawsASamplingFactorOnlyWhenItIsMade) {
  fake.randomness.draws = {0.125, 0.25};
  EXPECT_EQ(made(Dictionary()), nullptr);
  EXPECT_EQ(made(Dictionary{{"post_url", kURL}})->samplingFactor(), 0.125);
}

TEST_F(UploadBackendTest, TakesItsURLsFromTheProfile) {
  EXPECT_EQ(backend->uploadURL(), kURL);
  EXPECT_EQ(backend->displayURL(), "https://d/");
  EXPECT_EQ(made(Dictionary{{"post_url", kURL}})->displayURL(), std::nullopt);
}

TEST_F(UploadBackendTest, PassesMessagesAndFlushesBy) {
  EXPECT_EQ(backend->sendMessage(Dictionary{{"a", 1}}, timeval{1, 2}, 3, 0), std::nullopt);
  EXPECT_EQ(backend->flushMessages(), std::nullopt);
  EXPECT_FALSE(backend->uploadLogData({}));
  EXPECT_TRUE(fake.http.posts().empty() && fake.http.synchronousRequests().empty());
}

TEST_F(UploadBackendTest, PostsTheCompressedFile) {
  const auto path = write("a b.log", "line one\nline two\n");
  EXPECT_TRUE(upload(path));
  const auto requests = fake.http.synchronousRequests();
  ASSERT_EQ(requests.size(), 1U);
  EXPECT_EQ(requests[0].method, "POST");
  EXPECT_EQ(requests[0].url, std::string(kURL) + "?uuid=" + kUdid +
                                 "&sequence=42&description=Parlor%20QPRC%20log%20(Uploaded%20by%20PHS)"
                                 "&filename=a%20b.log.gz&raw=true");
  EXPECT_EQ(requests[0].headers,
            (std::vector<std::pair<std::string, std::string>>{{"Content-Type", "application/octet-stream"},
                                                              {"Content-Encoding", "gzip"}}));
  EXPECT_EQ(test::gunzipped(requests[0].body.bytes()), "line one\nline two\n");
  EXPECT_EQ(requests[0].timeout.count(), 0);
  EXPECT_EQ(requests[0].cachePolicy, platform::CachePolicy::UseProtocol);
  expectExtensionReleased();
}

TEST_F(UploadBackendTest, LogsTheUploadAndTheAnswer) {
  answerWith("{\"result\": 1}");
  const auto path = write("a.log", "aaaaaaaaaa");
  EXPECT_TRUE(upload(path));
  const auto lines = fake.log.lines();
  ASSERT_EQ(lines.size(), 3U);
  EXPECT_EQ(lines[0],
            (FakeLog::Line{LogLevel::Debug, "Tally(uploadFileAtPath): Uploading file " + path.string()}));
  EXPECT_TRUE(lines[1].text.find("Compressed file from 10 to ") != std::string::npos) << lines[1];
  EXPECT_EQ(lines[2],
            (FakeLog::Line{LogLevel::Debug,
                           "Tally(uploadFileAtPath): sending to |https://upload.example/in|, Json output: "
                           "{\"result\": 1}"}));
}

TEST_F(UploadBackendTest, DeletesTheFileOnTheWordSuccessAnywhereInTheAnswer) {
  for (const std::string body : {"success", "{\"success\": false}", "unsuccessful", "\n\xC3\xA4success\n"}) {
    answerWith(body, 500);
    const auto path = write("a.log", "text");
    EXPECT_TRUE(upload(path)) << body;
    EXPECT_FALSE(fs::exists(path)) << body;
  }
}

TEST_F(UploadBackendTest, KeepsTheFileWithoutTheWord) {
  for (const std::string body : {"", "Success", "SUCCESS", "succes", "ok",
                                 "succ\xFF"
                                 "ess"}) {
    answerWith(body, 200);
    const auto path = write("a.log", "text");
    EXPECT_TRUE(upload(path)) << body;
    EXPECT_TRUE(fs::exists(path)) << body;
  }
}

TEST_F(UploadBackendTest, FindsNoWordInAnAnswerThatIsNoUTF8) {
  answerWith("success \xFF");
  const auto path = write("a.log", "text");
  EXPECT_TRUE(upload(path));
  EXPECT_TRUE(fs::exists(path));
  EXPECT_TRUE(
      fake.log.has(LogLevel::Debug,
                   "Tally(uploadFileAtPath): sending to |https://upload.example/in|, Json output: (null)"));
}

TEST_F(UploadBackendTest, CountsAnEmptyAnswerAsAnAnswer) {
  answerWith("");
  EXPECT_TRUE(upload(write("a.log", "text")));
  EXPECT_TRUE(fake.log.has(LogLevel::Debug,
                           "Tally(uploadFileAtPath): sending to |https://upload.example/in|, Json output: "));
}

TEST_F(UploadBackendTest, KeepsTheFileWhenTheRequestFails) {
  fake.http.answer = [](const HTTPRequest&) { return FakeHTTPClient::failure("no route (success.example)"); };
  const auto path = write("a.log", "text");
  EXPECT_TRUE(upload(path));
  EXPECT_TRUE(fs::exists(path));
  EXPECT_TRUE(fake.log.has(LogLevel::Error, "Tally(uploadFileAtPath): post no route (success.example)"));
  expectExtensionReleased();
}

TEST_F(UploadBackendTest, IgnoresThatTheFileCannotBeDeleted) {
  const auto path = write("a.log", "text");
  fake.http.answer = [path](const HTTPRequest&) {
    fs::remove(path);
    fs::create_directory(path);  // By somebody else, meanwhile.
    return FakeHTTPClient::ok("success");
  };
  EXPECT_TRUE(upload(path));
  EXPECT_TRUE(fs::is_directory(path));
  expectExtensionReleased();
}

TEST_F(UploadBackendTest, RefusesADirectory) {
  expectRefused(fake.folder.path(), "Tally(uploadFileAtPath): Only upload a regular file.");
}

TEST_F(UploadBackendTest, RefusesAMissingFile) {
  expectRefused(fake.folder.path() / "missing.log", "Tally(uploadFileAtPath): Only upload a regular file.");
}

TEST_F(UploadBackendTest, RefusesADevice) {
  expectRefused("/dev/null", "Tally(uploadFileAtPath): Only upload a regular file.");
}

TEST_F(UploadBackendTest, RefusesAnEmptyFile) {
  expectRefused(write("empty.log", ""), "Tally(uploadFileAtPath): Input file is empty");
}

TEST_F(UploadBackendTest, RefusesAFileThatZlibCannotCount) {
  const auto path = write("large.log", "");
  fs::resize_file(path, UploadBackend::kMaximumFileBytes + 1);
  expectRefused(path,
                "Tally(uploadFileAtPath): " + path.string() + " is too large to upload, 4000000001 bytes");
}

TEST_F(UploadBackendTest, RefusesAURLThatIsNone) {
  backend->setUploadURL("https://upload.example/a b");
  const auto path = write("a.log", "text");
  EXPECT_FALSE(upload(path));
  EXPECT_EQ(fake.log.lines().back(),
            (FakeLog::Line{LogLevel::Error, "Tally(uploadFileAtPath): Unable to create URL request"}));
  EXPECT_TRUE(fake.http.synchronousRequests().empty());
  EXPECT_TRUE(fs::exists(path));
  expectExtensionReleased();
}

TEST_F(UploadBackendTest, ConsumesNothingWithoutAnUploadURL) {
  backend->setUploadURL(std::nullopt);
  const auto path = write("a.log", "text");
  EXPECT_FALSE(upload(path));
  EXPECT_EQ(fake.log.lines(),
            (Lines{{LogLevel::Debug, "Tally(uploadFileAtPath): Uploading file " + path.string()}}));
  EXPECT_TRUE(fake.sandbox.consumed.empty());
  EXPECT_TRUE(fake.sandbox.released.empty());
}

TEST_F(UploadBackendTest, HoldsTheExtensionDuringTheRequestAndReleasesItWhateverHappens) {
  fake.http.answer = [this](const HTTPRequest&) -> platform::HTTPResult {
    EXPECT_EQ(fake.sandbox.consumed.size(), 1U);
    EXPECT_TRUE(fake.sandbox.released.empty());
    throw std::runtime_error("a fault");
  };
  EXPECT_THROW(upload(write("a.log", "text")), std::runtime_error);
  expectExtensionReleased();
}

TEST_F(UploadBackendTest, MarksReadingAndCompressingAsBlocking) {
  upload(write("a.log", "text"));
  EXPECT_EQ(fake.queues.blockingCalls, 1U);
}

TEST_F(UploadBackendTest, SendsTheDeviceIDThatItHas) {
  backend->setUdid("");
  upload(write("a.log", "text"));
  backend->setUdid(nullptr);
  upload(write("a.log", "text"));
  const auto requests = fake.http.synchronousRequests();
  ASSERT_EQ(requests.size(), 2U);
  EXPECT_TRUE(requests[0].url.starts_with(std::string(kURL) + "?uuid=&sequence=42&"));
  EXPECT_TRUE(requests[1].url.starts_with(std::string(kURL) + "?uuid=(null)&sequence=42&"));
}

TEST_F(UploadBackendTest, BooksEachFileOnceAndMessagesNotAtAll) {
  backend->sendMessage(platform::Dictionary{{"a", 1}}, timeval{1, 2}, 3, 0);
  backend->uploadLogData({});
  EXPECT_EQ(backend->account().counts().passedBy, 2U);
  answerWith("no word of it", 500);
  EXPECT_TRUE(upload(write("file", "text")));
  EXPECT_EQ(backend->account().counts().refused, 1U);
  EXPECT_FALSE(upload(fake.folder.path() / "missing"));
  EXPECT_FALSE(upload(write("empty", "")));
  fake.http.answer = [](const HTTPRequest&) { return FakeHTTPClient::failure("refused"); };
  EXPECT_TRUE(upload(write("file", "text")));
  const auto counts = backend->account().counts();
  EXPECT_EQ(counts.accepted, 4U);
  EXPECT_EQ(counts.sent, 1U);
  EXPECT_EQ(*counts.dictionary().dictionary("dropped"),
            (platform::Dictionary{{"not-uploadable", 2}, {"upload-failed", 1}}));
  EXPECT_TRUE(counts.isBalanced());
}

}  // namespace
}  // namespace tallyd
