// Memory that runs out at every place at which a request needs some, one after the other.

#include <gmock/gmock.h>

#include <atomic>
#include <deque>
#include <new>

#include "HTTPClientFixture.h"
#include "platform/http/CurlHandles.h"
#include "support/FailingAllocation.h"
#include "support/LoopbackServer.h"
#include "support/RawServer.h"

namespace tallyd::platform {

using test::OneFailingAllocation;
using test::RawConnection;
using test::RawServer;
using testing::AnyOf;
using testing::HasSubstr;
using testing::StartsWith;

namespace {

/// libcurl's own allocations, of which one may be made to fail.
class CurlAllocations {
 public:
  /// Before anything else uses libcurl, which takes its allocation once in a process.
  static void install() {
    static const CURLcode installed = curl_global_init_mem(CURL_GLOBAL_DEFAULT, &allocate, &std::free,
                                                           &reallocate, &duplicate, &allocateZeros);
    ASSERT_EQ(installed, CURLE_OK);
  }
  static void failOne(int number) { left = number; }
  /// Ends the failing; whether an allocation has failed.
  static bool hasFailed() { return left.exchange(0) <= 0; }

 private:
  static bool isToFail() { return left.load() > 0 && left.fetch_sub(1) == 1; }
  static void* allocate(std::size_t size) { return isToFail() ? nullptr : std::malloc(size); }
  static void* reallocate(void* memory, std::size_t size) {
    return isToFail() ? nullptr : std::realloc(memory, size);
  }
  static char* duplicate(const char* text) { return isToFail() ? nullptr : ::strdup(text); }
  static void* allocateZeros(std::size_t count, std::size_t size) {
    return isToFail() ? nullptr : std::calloc(count, size);
  }

  static inline std::atomic<int> left{0};
};

/// Runs its work when the test asks for it, knows which thread gave it, and at times has no memory for it.
class ScriptedQueue final : public SerialQueue {
 public:
  [[nodiscard]] const std::string& label() const override { return _label; }
  void async(Work work) override {
    const std::lock_guard lock(_mutex);
    giver = std::this_thread::get_id();
    if (refusals > 0 && refusals-- > 0) throw std::bad_alloc();
    _work.push_back(std::move(work));
    _given.notify_all();
  }
  void asyncAfter(std::chrono::milliseconds, Work) override { ADD_FAILURE(); }
  std::unique_ptr<Source> makeTimer(std::chrono::milliseconds, std::chrono::milliseconds, Work,
                                    Work) override {
    return nullptr;
  }
  std::unique_ptr<Source> makeReadSource(int, Work, Work) override { return nullptr; }
  std::unique_ptr<Source> makeWriteSource(int, Work, Work) override { return nullptr; }

  /// Waits for a piece of work and runs it.
  void runNext() {
    Work work;
    {
      std::unique_lock lock(_mutex);
      ASSERT_TRUE(_given.wait_for(lock, std::chrono::seconds(30), [&] { return !_work.empty(); }));
      work = std::move(_work.front());
      _work.pop_front();
    }
    work();
  }

  std::atomic<int> refusals{0};  ///< So many more pieces of work find no memory.
  std::atomic<std::thread::id> giver;

 private:
  const std::string _label = "completions";
  std::mutex _mutex;
  std::condition_variable _given;
  std::deque<Work> _work;
};

}  // namespace

class OutOfMemoryTest : public HTTPClientTest {
 protected:
  static void SetUpTestSuite() {
    HTTPClientTest::SetUpTestSuite();
    CurlAllocations::install();
  }

  /// Posts and waits for what becomes of it.
  HTTPResult posted() {
    client->sendAsynchronousRequest(post(server.url("/events"), "{}"), scripted, keepResult());
    return nextResult();
  }
  HTTPClient::Completion keepResult() {
    return [this](const HTTPResult& result) { results.push_back(result); };
  }
  HTTPResult nextResult() {
    scripted->runNext();
    EXPECT_EQ(results.size(), 1U);
    const HTTPResult result = results.empty() ? HTTPResult() : results.back();
    results.clear();
    return result;
  }
  void expectServed() { EXPECT_EQ(errorOf(posted()), "no error"); }

  /// Every request finds a new connection.
  const RawServer server{[](RawConnection& connection) {
    if (connection.readRequest().empty()) return;
    connection.write(
        "HTTP/1.1 200 OK\r\nX-Receipt: a text that is longer than a string's own room\r\n"
        "Content-Length: 2\r\nConnection: close\r\n\r\nok");
  }};
  std::unique_ptr<CurlHTTPClient> client = makeClient();
  std::shared_ptr<ScriptedQueue> scripted = std::make_shared<ScriptedQueue>();
  std::vector<HTTPResult> results;
};

TEST_F(OutOfMemoryTest, FailsThePostForWhichLibcurlHasNoneAndNoOther) {
  expectServed();
  int failed = 0;
  for (int number = 1;; ++number) {
    CurlAllocations::failOne(number);
    const HTTPResult result = posted();
    const bool wasNeeded = CurlAllocations::hasFailed();
    failed += result.error ? 1 : 0;
    EXPECT_NE(result.failure, HTTPFailure::Permanent) << number << ": " << errorOf(result);
    expectServed();
    if (!wasNeeded) break;
    ASSERT_LT(number, 2'000);
  }
  EXPECT_GT(failed, 20);
}

TEST_F(OutOfMemoryTest, FailsThePostForWhichTheThreadHasNoneAndNoOther) {
  expectServed();
  const std::thread::id thread = scripted->giver;
  ASSERT_NE(thread, std::this_thread::get_id());
  int failed = 0;
  for (int number = 1;; ++number) {
    std::optional<OneFailingAllocation> failing(std::in_place, thread, number);
    const HTTPResult result = posted();
    const bool wasNeeded = failing->hasFailed();
    failing.reset();
    failed += result.error ? 1 : 0;
    EXPECT_THAT(errorOf(result), AnyOf("no error", StartsWith("out of memory (http://127.0.0.1:")));
    expectServed();
    if (!wasNeeded) break;
    ASSERT_LT(number, 2'000);
  }
  EXPECT_GT(failed, 3);
}

TEST_F(OutOfMemoryTest, TakesARequestWholeOrNotAtAll) {
  int refused = 0;
  for (int number = 1;; ++number) {
    client = makeClient();  // Its thread is still to be started.
    const HTTPRequest request = post(server.url("/events"), "{}");
    bool isTaken = true;
    std::optional<OneFailingAllocation> failing(std::in_place, std::this_thread::get_id(), number);
    try {
      client->sendAsynchronousRequest(HTTPRequest(request), scripted, keepResult());
    } catch (const std::bad_alloc&) {
      isTaken = false;
    }
    const bool wasNeeded = failing->hasFailed();
    failing.reset();
    if (isTaken) {
      EXPECT_EQ(errorOf(nextResult()), "no error");
    } else {
      ++refused;
    }
    expectServed();
    if (!wasNeeded) break;
    ASSERT_LT(number, 2'000);
  }
  EXPECT_GT(refused, 2);
}

TEST_F(OutOfMemoryTest, TellsOnceTheQueueHasMemoryForTheCompletion) {
  scripted->refusals = 3;
  EXPECT_EQ(errorOf(posted()), "no error");
  EXPECT_EQ(scripted->refusals, 0);
}

TEST_F(OutOfMemoryTest, TellsAllThatIsUnfinishedBeforeItGoesAway) {
  const RawServer silent([](RawConnection& connection) { connection.waitForClose(); });
  for (int i = 0; i < 3; ++i)
    client->sendAsynchronousRequest(post(silent.url(), "{}"), scripted, keepResult());
  scripted->refusals = 2;
  client.reset();
  for (int i = 0; i < 3; ++i) EXPECT_THAT(errorOf(nextResult()), HasSubstr("the HTTP client is going away"));
}

TEST_F(OutOfMemoryTest, FailsTheSynchronousRequestForWhichThereIsNone) {
  const auto fetch = [this] { return client->sendSynchronousRequest(get(server.url("/storebag"))); };
  int failed = 0;
  for (int number = 1;; ++number) {
    CurlAllocations::failOne(number);
    failed += fetch().error ? 1 : 0;
    const bool wasNeeded = CurlAllocations::hasFailed();
    EXPECT_EQ(textOf(fetch()), "ok");
    if (!wasNeeded) break;
    ASSERT_LT(number, 2'000);
  }
  EXPECT_GT(failed, 20);
  for (int number = 1;; ++number) {
    const HTTPRequest request = get(server.url("/storebag"));
    std::optional<OneFailingAllocation> failing(std::in_place, std::this_thread::get_id(), number);
    const HTTPResult result = client->sendSynchronousRequest(request);
    const bool wasNeeded = failing->hasFailed();
    failing.reset();
    EXPECT_THAT(errorOf(result), AnyOf("no error", HasSubstr("out of memory")));
    EXPECT_EQ(textOf(fetch()), "ok");
    if (!wasNeeded) break;
    ASSERT_LT(number, 2'000);
  }
}

}  // namespace tallyd::platform
