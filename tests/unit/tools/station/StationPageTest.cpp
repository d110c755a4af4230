// The page's routes, on a real server.
#include "station/StationPage.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <httplib.h>

#include <condition_variable>
#include <filesystem>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include "fakes/FakeClock.h"
#include "fakes/TemporaryFolder.h"
#include "station/Files.h"
#include "station/Limits.h"
#include "station/PageFiles.h"

namespace tallyd::station {

using testing::HasSubstr;
using testing::Not;
using testing::StartsWith;

namespace {

/// A live page: reads what comes until it is destroyed.
class LivePage {
 public:
  LivePage(int port, const std::string& path, const httplib::Headers& headers = {})
      : _client("127.0.0.1", port), _reader([this, path, headers] {
          const auto result = _client.Get(
              path, headers,
              [this](const httplib::Response& response) {
                const std::lock_guard lock(_mutex);
                _response = response;
                _changed.notify_all();
                return true;
              },
              [this](const char* bytes, std::size_t size) {
                const std::lock_guard lock(_mutex);
                _text.append(bytes, size);
                _changed.notify_all();
                return true;
              });
          const std::lock_guard lock(_mutex);
          _ended = true;
          _changed.notify_all();
        }) {}
  ~LivePage() {
    _client.stop();
    _reader.join();
  }
  LivePage(const LivePage&) = delete;
  LivePage& operator=(const LivePage&) = delete;

  /// 0 when no answer comes.
  int status() {
    std::unique_lock lock(_mutex);
    _changed.wait_for(lock, kPatience, [this] { return _response.status > 0 || _ended; });
    return _response.status;
  }
  std::string header(const char* name) {
    const std::lock_guard lock(_mutex);
    return _response.get_header_value(name);
  }
  bool waitForText(const std::string& part) {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, kPatience, [&] { return _text.find(part) != std::string::npos; });
  }
  bool waitForEnd() {
    std::unique_lock lock(_mutex);
    return _changed.wait_for(lock, kPatience, [this] { return _ended; });
  }
  std::string text() {
    const std::lock_guard lock(_mutex);
    return _text;
  }

 private:
  static constexpr std::chrono::seconds kPatience{20};
  std::mutex _mutex;
  std::condition_variable _changed;
  httplib::Response _response;
  std::string _text;
  bool _ended = false;
  httplib::Client _client;
  std::thread _reader;
};

}  // namespace

class StationPageTest : public testing::Test {
 protected:
  StationPageTest() {
    server.new_task_queue = [] { return new httplib::ThreadPool(kServerThreads); };
    page.addRoutes(server);
    port = server.bind_to_any_port("127.0.0.1");
    listener = std::thread([this] { server.listen_after_bind(); });
    while (!server.is_running()) std::this_thread::yield();
  }
  ~StationPageTest() override {
    model.stop();
    server.stop();
    listener.join();
  }

  httplib::Response get(const std::string& path, const httplib::Headers& headers = {}) {
    auto result = httplib::Client("127.0.0.1", port).Get(path, headers);
    return result ? *result : httplib::Response();
  }
  void publish(const std::string& session) {
    feed.publish(Feed::Kind::Event, R"({"event":{"_sessionID":")" + session + "\"}}");
  }
  std::unique_ptr<LivePage> openLive(const std::string& after = "", const httplib::Headers& headers = {}) {
    return std::make_unique<LivePage>(port, "/live?after=" + after, headers);
  }
  /// The text behind the last "id: ".
  static std::string lastPositionIn(const std::string& text) {
    const std::size_t start = text.rfind("id: ") + 4;
    return text.substr(start, text.find('\n', start) - start);
  }

  fakes::TemporaryFolder folder;
  Feed feed{100};
  fakes::FakeClock clock;
  PageModel model{feed, clock, 100};
  StationPage page{model, folder.path() / "uploads"};
  httplib::Server server;
  int port = 0;
  std::thread listener;
};

TEST_F(StationPageTest, ServesThePageAndAllThatItNames) {
  const httplib::Response html = get("/sessions?sequences=7&override=yes");
  EXPECT_EQ(html.status, 200);
  EXPECT_EQ(html.get_header_value("Content-Type"), "text/html; charset=utf-8");
  EXPECT_THAT(html.get_header_value("Content-Security-Policy"), StartsWith("default-src 'none'; "));
  EXPECT_THAT(html.get_header_value("Content-Security-Policy"), Not(HasSubstr("unsafe")));
  EXPECT_EQ(html.get_header_value("X-Content-Type-Options"), "nosniff");
  for (const PageFile& file : pageFiles()) {
    if (file.name == "index.html") continue;
    const std::string path = "/sessions/" + std::string(file.name);
    EXPECT_THAT(html.body, HasSubstr('"' + path + '"'));
    const httplib::Response answer = get(path);
    EXPECT_EQ(answer.status, 200) << path;
    EXPECT_EQ(answer.body, file.bytes) << path;
    EXPECT_NE(answer.get_header_value("Content-Type"), "application/octet-stream") << path;
  }
  EXPECT_EQ(get("/").get_header_value("Location"), "/sessions");
  EXPECT_EQ(get("/sessions/nothing.js").status, 404);
}

TEST_F(StationPageTest, SendsAnUnchangedFileOnce) {
  const std::string tag = get("/sessions/page.js").get_header_value("ETag");
  const httplib::Response again = get("/sessions/page.js", {{"If-None-Match", tag}});
  EXPECT_EQ(again.status, 304);
  EXPECT_EQ(again.body, "");
  EXPECT_EQ(get("/sessions/page.css", {{"If-None-Match", tag}}).status, 200);
}

TEST_F(StationPageTest, SendsWhatComesAfterASnapshot) {
  publish("A");
  const auto live = openLive();
  EXPECT_EQ(live->status(), 200);
  EXPECT_EQ(live->header("Content-Type"), "text/event-stream");
  EXPECT_TRUE(live->waitForText(R"("session":"A")"));
  EXPECT_THAT(live->text(), StartsWith("id: "));
  const std::string position = lastPositionIn(live->text());
  publish("B");
  EXPECT_TRUE(live->waitForText(R"("session":"B")"));

  const auto later = openLive(position);
  EXPECT_TRUE(later->waitForText(R"("session":"B")"));
  EXPECT_THAT(later->text(), Not(HasSubstr(R"("session":"A")")));
  EXPECT_THAT(get("/api/snapshot").body, HasSubstr(R"("session":"A")"));
}

TEST_F(StationPageTest, GoesOnAfterTheLastEventThatABrowserSaw) {
  publish("A");
  const auto live = openLive();
  EXPECT_TRUE(live->waitForText(R"("session":"A")"));
  const std::string position = lastPositionIn(live->text());
  publish("B");
  const auto again = openLive("", {{"Last-Event-ID", position}});
  EXPECT_TRUE(again->waitForText(R"("session":"B")"));
  EXPECT_THAT(again->text(), Not(HasSubstr(R"("session":"A")")));
}

TEST_F(StationPageTest, LeavesTheStreamUncompressedAndUnbuffered) {
  const auto live = openLive("", {{"Accept-Encoding", "gzip, deflate, br"}});
  EXPECT_EQ(live->status(), 200);
  publish("A");
  EXPECT_TRUE(live->waitForText(R"("session":"A")"));
  EXPECT_EQ(live->header("Content-Encoding"), "");
}

TEST_F(StationPageTest, KeepsASilentConnectionAlive) {
  const auto live = openLive();
  EXPECT_TRUE(live->waitForText("\n:\n\n"));
}

TEST_F(StationPageTest, TurnsTheNinthLivePageAway) {
  std::vector<std::unique_ptr<LivePage>> pages;
  for (std::size_t i = 0; i < kMostLivePages; ++i) {
    pages.push_back(openLive());
    ASSERT_EQ(pages.back()->status(), 200);
  }
  const auto ninth = openLive();
  EXPECT_EQ(ninth->status(), 503);
  EXPECT_EQ(ninth->header("Retry-After"), "5");
  EXPECT_EQ(get("/sessions").status, 200);

  pages.pop_back();
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::seconds(20);
  int status = 503;
  while (status == 503 && std::chrono::steady_clock::now() < deadline) status = openLive()->status();
  EXPECT_EQ(status, 200);
}

TEST_F(StationPageTest, EndsLivePagesWhenTheModelStops) {
  const auto live = openLive();
  EXPECT_TRUE(live->waitForText("\n\n"));
  model.stop();
  EXPECT_TRUE(live->waitForEnd());
}

TEST_F(StationPageTest, AnswersNobodyButThisMachine) {
  for (const char* host : {"evil.example", "evil.example:80", "127.0.0.1.evil.example", ""})
    EXPECT_EQ(get("/api/snapshot", {{"Host", host}}).status, 421) << host;
  for (const char* host : {"127.0.0.1", "localhost:8443", "[::1]:8443", "[::1]"})
    EXPECT_EQ(get("/api/snapshot", {{"Host", host}}).status, 200) << host;
}

TEST_F(StationPageTest, AnswersNoOtherSite) {
  const httplib::Headers image{{"Sec-Fetch-Site", "cross-site"}, {"Sec-Fetch-Mode", "no-cors"}};
  EXPECT_EQ(get("/live", image).status, 403);
  EXPECT_EQ(get("/api/snapshot", image).status, 403);
  const httplib::Headers link{{"Sec-Fetch-Site", "cross-site"}, {"Sec-Fetch-Mode", "navigate"}};
  EXPECT_EQ(get("/sessions", link).status, 200);
}

TEST_F(StationPageTest, ServesUploadsToBeSaved) {
  std::filesystem::create_directory(folder.path() / "uploads");
  const std::string bytes = std::string(200'000, 'x') + "<script>";
  replaceFile(folder.path() / "uploads/20260301T1-a.html", bytes, 0600);
  replaceFile(folder.path() / "uploads/empty", "", 0600);
  const httplib::Response file = get("/uploads/20260301T1-a.html");
  EXPECT_EQ(file.status, 200);
  EXPECT_EQ(file.body, bytes);
  EXPECT_EQ(file.get_header_value("Content-Type"), "application/octet-stream");
  EXPECT_EQ(file.get_header_value("Content-Disposition"), "attachment; filename=\"20260301T1-a.html\"");
  EXPECT_EQ(get("/uploads/empty").status, 200);
}

TEST_F(StationPageTest, ServesNothingButUploads) {
  const auto uploads = folder.path() / "uploads";
  std::filesystem::create_directories(uploads / "folder");
  replaceFile(folder.path() / "secret", "x", 0600);
  replaceFile(uploads / ".hidden", "x", 0600);
  replaceFile(uploads / "folder/inner", "x", 0600);
  std::filesystem::create_symlink(folder.path() / "secret", uploads / "link");
  for (const char* name : {"missing", "../secret", "%2e%2e%2fsecret", "..%2fsecret", ".hidden", "folder",
                           "folder/inner", "link", "%00", "a%0d%0ab", "."})
    EXPECT_EQ(get(std::string("/uploads/") + name).status, 404) << name;
}

}  // namespace tallyd::station
