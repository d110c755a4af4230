// The real program, as a daemon meets it.

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <csignal>

#include <condition_variable>
#include <mutex>

#include "fakes/FakeLog.h"
#include "fakes/FakeQueues.h"
#include "fakes/TemporaryFolder.h"
#include "platform/JSON.h"
#include "platform/http/CurlHTTPClient.h"
#include "platform/property-list/KeyedArchive.h"
#include "platform/property-list/PropertyList.h"
#include "station/Files.h"
#include "support/ChildProcess.h"
#include "support/RawServer.h"
#include "unit/tools/station/Gzipped.h"

namespace tallyd::station {

using platform::HTTPRequest;
using platform::HTTPResult;
using test::ChildProcess;
using testing::HasSubstr;
using testing::StartsWith;
using Stream = ChildProcess::Stream;

namespace {

constexpr const char* kProgram = TALLYD_BIN_DIR "/tally-station";
constexpr const char* kPost =
    R"({"postTime":"100.  5","clientId":"C","events":[{"_sender":"PH","_sessionID":"42","_method":"7","_status":"2",)"
    R"("_eventNumber":"3","eventTime":"1772366401.250","note":"hello"}]})";

HTTPRequest get(const std::string& url) {
  HTTPRequest request;
  request.url = url;
  return request;
}

HTTPRequest post(const std::string& url, std::string body, const std::string& encoding = {}) {
  HTTPRequest request = get(url);
  request.method = "POST";
  request.headers = {{"Content-Type", "application/json"}};
  if (!encoding.empty()) request.headers.emplace_back("Content-Encoding", encoding);
  request.body = platform::Data(std::move(body));
  return request;
}

int statusOf(const HTTPResult& result) { return result.response ? result.response->status : 0; }

}  // namespace

class StationProgramTest : public testing::Test {
 protected:
  static void SetUpTestSuite() { ::setenv("no_proxy", "127.0.0.1,localhost", 1); }

  /// Starts the station and waits until it is ready.
  void startStation(std::vector<std::string> options = {}) {
    std::vector<std::string> arguments{"--directory", directory.string(), "--port", "0", "--http-port", "0"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    station = std::make_unique<ChildProcess>(kProgram, arguments);
    const Stream notices = std::find(options.begin(), options.end(), "--json") == options.end()
                               ? Stream::Output
                               : Stream::Errors;
    ASSERT_TRUE(station->waitForText(notices, "ready\n")) << station->text(Stream::Errors);
    const auto ready = platform::valueFromJSON(readFile(directory / "station.json"));
    ASSERT_TRUE(ready.value && ready.value->dictionary());
    https =
        "https://127.0.0.1:" + std::to_string(ready.value->dictionary()->integer("https_port").value_or(0));
    http = "http://127.0.0.1:" + std::to_string(ready.value->dictionary()->integer("http_port").value_or(0));
    EXPECT_EQ(ready.value->dictionary()->integer("pid"), station->pid());
    EXPECT_THAT(station->text(notices), HasSubstr("listening on " + https + "\n"));
    EXPECT_THAT(station->text(notices), HasSubstr("listening on " + http + "\n"));
  }

  /// A client that trusts the station's authority, as a daemon with its "ca.pem" does.
  [[nodiscard]] HTTPResult send(const HTTPRequest& request) {
    const std::filesystem::path trusted = folder.path() / "root/etc/tally/ca.pem";
    std::filesystem::create_directories(trusted.parent_path());
    std::filesystem::copy_file(directory / "ca.pem", trusted,
                               std::filesystem::copy_options::overwrite_existing);
    platform::CurlHTTPClient client(platform::Root(folder.path() / "root"), queues, log);
    return client.sendSynchronousRequest(request);
  }

  fakes::TemporaryFolder folder;
  const std::filesystem::path directory = folder.path() / "station";
  fakes::FakeQueues queues;
  fakes::FakeLog log;
  std::unique_ptr<ChildProcess> station;
  std::string https;
  std::string http;
};

TEST_F(StationProgramTest, ServesSignedStorebags) {
  startStation({"--max-age", "300"});
  replaceFile(directory / "bags/playhall.plist", "{ version = \"5\"; release = { }; }", 0644);
  for (const char* path : {"/bags/sorrel/playhall?version=6.21", "/storebags/sorrel/playhall?version=6.21"}) {
    const HTTPResult result = send(get(https + path));
    ASSERT_EQ(statusOf(result), 200) << result.error.value_or("");
    EXPECT_EQ(result.response->header("Cache-Control"), "max-age=300");
    const auto envelope = platform::propertyListWithData(result.data.bytes()).value;
    ASSERT_TRUE(envelope && envelope->dictionary());
    EXPECT_TRUE(envelope->dictionary()->string("signature"));
    EXPECT_TRUE(envelope->dictionary()->string("bag"));
  }
  EXPECT_EQ(statusOf(send(get(https + "/bags/sorrel/(null)?version=6.21"))), 404);
  replaceFile(directory / "bags/broken.plist", "{", 0644);
  EXPECT_EQ(statusOf(send(get(https + "/bags/sorrel/broken?version=6.21"))), 500);
  EXPECT_TRUE(station->waitForText(Stream::Errors, (directory / "bags/broken.plist").string()));
}

TEST_F(StationProgramTest, IsRefusedByClientsThatDoNotKnowItsAuthority) {
  startStation();
  platform::CurlHTTPClient client(platform::Root(folder.path() / "elsewhere"), queues, log);
  EXPECT_TRUE(client.sendSynchronousRequest(get(https + "/bags/sorrel/playhall")).error);
}

TEST_F(StationProgramTest, CollectsPlainAndCompressedPosts) {
  startStation();
  EXPECT_EQ(statusOf(send(post(https + "/events", kPost))), 200);
  EXPECT_EQ(statusOf(send(post(https + "/events/of/the/day", gzipped(kPost), "gzip"))), 200);
  EXPECT_EQ(statusOf(send(post(http + "/events", gzipped(kPost), "gzip"))), 200);
  EXPECT_EQ(statusOf(send(post(http + "/elsewhere", kPost))), 404);
  EXPECT_EQ(statusOf(send(get(http + "/bags/sorrel/playhall"))), 404);

  station->sendSignal(SIGTERM);
  EXPECT_EQ(station->waitForExit(), 0);
  const std::string line = "2026-03-01 12:00:01.250  PH  session 42  method 7  status 2  #3  note=hello\n";
  EXPECT_THAT(station->text(Stream::Output), HasSubstr(line + line + line));
  EXPECT_THAT(station->text(Stream::Output),
              HasSubstr("3 events in 3 posts, 0 posts refused, 0 storebags served\n"));
  const std::string kept = readFile(directory / "events.jsonl");
  EXPECT_EQ(std::count(kept.begin(), kept.end(), '\n'), 3);
  EXPECT_FALSE(std::filesystem::exists(directory / "station.json"));
}

TEST_F(StationProgramTest, RefusesBrokenPosts) {
  startStation();
  EXPECT_EQ(statusOf(send(post(https + "/events", "junk"))), 400);
  EXPECT_EQ(statusOf(send(post(https + "/events", "not gzip", "gzip"))), 400);
  const std::string whole = gzipped(kPost);
  EXPECT_EQ(statusOf(send(post(https + "/events", whole.substr(0, 60), "gzip"))), 400);
  EXPECT_EQ(statusOf(send(post(https + "/events", whole.substr(0, whole.size() - 1), "gzip"))), 400);
  EXPECT_EQ(statusOf(send(post(https + "/events", whole.substr(0, whole.size() - 8), "gzip"))), 400);
  EXPECT_EQ(statusOf(send(post(https + "/events", kPost, "br"))), 415);
  EXPECT_EQ(statusOf(send(post(https + "/events", kPost))), 200);
  station->sendSignal(SIGINT);
  EXPECT_EQ(station->waitForExit(), 0);
  EXPECT_THAT(station->text(Stream::Output), HasSubstr("1 events in 1 posts, 6 posts refused"));
  EXPECT_THAT(station->text(Stream::Errors), HasSubstr("the body can't be decoded (gzip)"));
}

TEST_F(StationProgramTest, SaysThatItCannotKeepEvents) {
  startStation();
  ASSERT_EQ(::mkfifo((directory / "events.jsonl").c_str(), 0600), 0);
  const HTTPResult result = send(post(https + "/events", kPost));
  EXPECT_EQ(statusOf(result), 500);
  EXPECT_THAT(std::string(result.data.bytes()), HasSubstr((directory / "events.jsonl").string()));
  std::filesystem::remove(directory / "events.jsonl");
  EXPECT_EQ(statusOf(send(post(https + "/events", kPost))), 200);
}

TEST_F(StationProgramTest, KeepsUploads) {
  startStation();
  const std::string query =
      "?uuid=0123&sequence=42&description=Parlor%20QPRC%20log%20(Uploaded%20by%20PHS)"
      "&filename=..%2F..%2Fa%20b%2Blog.gz&raw=true";
  const HTTPResult result = send(post(https + "/upload" + query, gzipped("contents"), "gzip"));
  EXPECT_EQ(statusOf(result), 200);
  EXPECT_THAT(std::string(result.data.bytes()), HasSubstr("success"));
  EXPECT_EQ(statusOf(send(post(http + "/upload", "plain"))), 200);
  EXPECT_EQ(statusOf(send(post(http + "/upload", ""))), 200);
  EXPECT_EQ(statusOf(send(post(http + "/upload", "no gzip", "gzip"))), 400);

  const auto kept = platform::valueFromJSON(
      readFile(directory / "uploads.jsonl").substr(0, readFile(directory / "uploads.jsonl").find('\n')));
  ASSERT_TRUE(kept.value && kept.value->dictionary());
  EXPECT_EQ(kept.value->dictionary()->string("filename"), "../../a b+log.gz");
  const std::string file(kept.value->dictionary()->string("file").value_or(""));
  EXPECT_TRUE(file.ends_with("-a_b+log")) << file;
  EXPECT_EQ(readFile(directory / file), "contents");
  const std::filesystem::directory_iterator files(directory / "uploads");
  EXPECT_EQ(std::distance(begin(files), end(files)), 3);
}

TEST_F(StationProgramTest, AnswersUploadsAsItIsTold) {
  startStation({"--upload-answer", "busy"});
  EXPECT_EQ(std::string(send(post(https + "/upload", "plain")).data.bytes()), "busy");
}

TEST_F(StationProgramTest, TellsWhereLogDataIs) {
  startStation();
  const std::string archive = platform::archivedDataWithRootObject(platform::Array{"line"}).value();
  for (const int line : {1, 2}) {
    const HTTPResult result = send(post(https + "/log-data", archive));
    EXPECT_EQ(statusOf(result), 200);
    EXPECT_EQ(std::string(result.data.bytes()),
              (directory / "logdata.jsonl").string() + ":" + std::to_string(line));
  }
  EXPECT_EQ(statusOf(send(post(http + "/log-data", gzipped(archive), "gzip"))), 200);
  EXPECT_EQ(statusOf(send(post(http + "/log-data", "junk"))), 400);
  EXPECT_TRUE(station->waitForText(Stream::Output, "\n  [0] \"line\"\n"));
}

TEST_F(StationProgramTest, EndsWhileAPipeStandsForABag) {
  startStation();
  ASSERT_EQ(::mkfifo((directory / "bags/playhall.plist").c_str(), 0600), 0);
  EXPECT_EQ(statusOf(send(get(https + "/bags/sorrel/playhall?version=6.21"))), 500);
  station->sendSignal(SIGTERM);
  EXPECT_EQ(station->waitForExit(), 0);
}

TEST_F(StationProgramTest, IsAloneInItsDirectory) {
  startStation();
  ChildProcess second(kProgram, {"--directory", directory.string(), "--port", "0"});
  EXPECT_EQ(second.waitForExit(), 1);
  EXPECT_THAT(second.text(Stream::Errors), HasSubstr((directory / "station.lock").string()));
  EXPECT_THAT(second.text(Stream::Errors), HasSubstr("process " + std::to_string(station->pid())));
  EXPECT_TRUE(std::filesystem::exists(directory / "station.json"));
  station->sendSignal(SIGKILL);
  EXPECT_EQ(station->waitForExit(), -SIGKILL);
  startStation();
}

TEST_F(StationProgramTest, ShowsTotalsWhenAsked) {
  startStation({"--datagram-port", "0", "--lose", "10", "--seed", "7"});
  EXPECT_TRUE(station->waitForText(Stream::Output, "--seed 7 plays it again\n"));
  station->sendSignal(SIGUSR1);
  EXPECT_TRUE(station->waitForText(Stream::Output, "\ndatagrams: 0 received"));
  const auto ready = platform::valueFromJSON(readFile(directory / "station.json"));
  EXPECT_GT(ready.value->dictionary()->integer("datagram_port"), 0);
}

TEST_F(StationProgramTest, ShowsOneJSONObjectForEachEvent) {
  startStation({"--json"});
  EXPECT_EQ(statusOf(send(post(http + "/events", kPost))), 200);
  station->sendSignal(SIGTERM);
  EXPECT_EQ(station->waitForExit(), 0);
  EXPECT_EQ(station->text(Stream::Output), readFile(directory / "events.jsonl"));
  const auto line = platform::valueFromJSON(station->text(Stream::Output));
  ASSERT_TRUE(line.value && line.value->dictionary());
  EXPECT_EQ(line.value->dictionary()->string("clientId"), "C");
}

TEST_F(StationProgramTest, KeepsItsKeysFromOneRunToTheNext) {
  startStation();
  const std::string key = readFile(directory / "publicKey.der");
  const std::string authority = readFile(directory / "ca.pem");
  station->sendSignal(SIGTERM);
  EXPECT_EQ(station->waitForExit(), 0);
  startStation();
  EXPECT_EQ(readFile(directory / "publicKey.der"), key);
  EXPECT_EQ(readFile(directory / "ca.pem"), authority);
}

TEST_F(StationProgramTest, ExplainsItself) {
  ChildProcess help(kProgram, {"--help"});
  EXPECT_EQ(help.waitForExit(), 0);
  EXPECT_THAT(help.text(Stream::Output), HasSubstr("Example:"));
  ChildProcess version(kProgram, {"--version"});
  EXPECT_EQ(version.waitForExit(), 0);
  EXPECT_THAT(version.text(Stream::Output), StartsWith("tally-station "));
}

TEST_F(StationProgramTest, SaysWhatItCannotDo) {
  ChildProcess nothing(kProgram, {});
  EXPECT_EQ(nothing.waitForExit(), 2);
  EXPECT_THAT(nothing.text(Stream::Errors), HasSubstr("--directory"));
  ChildProcess wrong(kProgram, {"--directory", directory.string(), "--port", "70000"});
  EXPECT_EQ(wrong.waitForExit(), 2);
  for (const char* option : {"--lose", "--lose-acks", "--duplicate", "--reorder"}) {
    ChildProcess excess(kProgram,
                        {"--directory", directory.string(), "--datagram-port", "0", option, "100.5"});
    EXPECT_EQ(excess.waitForExit(), 2);
    EXPECT_THAT(excess.text(Stream::Errors),
                HasSubstr(std::string(option) + ": 100.5 is not a percentage from 0 to 100"));
  }
  ChildProcess useless(kProgram, {"--directory", directory.string(), "--lose", "5"});
  EXPECT_EQ(useless.waitForExit(), 2);
  EXPECT_THAT(useless.text(Stream::Errors), HasSubstr("--lose requires --datagram-port"));

  const auto taken = test::listenOnLoopback();
  const std::string port = std::to_string(test::portOf(taken.get()));
  ChildProcess late(kProgram, {"--directory", directory.string(), "--port", port});
  EXPECT_EQ(late.waitForExit(), 1);
  EXPECT_THAT(late.text(Stream::Errors), HasSubstr("127.0.0.1:" + port));

  replaceFile(folder.path() / "file", "", 0644);
  ChildProcess homeless(kProgram, {"--directory", (folder.path() / "file/below").string()});
  EXPECT_EQ(homeless.waitForExit(), 1);
  EXPECT_THAT(homeless.text(Stream::Errors), HasSubstr((folder.path() / "file/below").string()));
}

}  // namespace tallyd::station
