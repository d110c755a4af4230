#include "support/Tap.h"

#include <fcntl.h>
#include <gtest/gtest.h>

#include <chrono>
#include <csignal>
#include <new>
#include <optional>

#include "fakes/FakeClock.h"
#include "fakes/FakeQueues.h"
#include "fakes/TemporaryFolder.h"
#include "platform/JSON.h"
#include "platform/queues/AsioQueues.h"
#include "support/Account.h"
#include "support/TapEnd.h"

namespace tallyd {
namespace {

using platform::Data;
using platform::Dictionary;
using platform::FileDescriptor;
using platform::Value;
using test::TapEnd;

Dictionary parsed(const std::string& line) {
  const auto result = platform::valueFromJSON(line);
  EXPECT_TRUE(result.value && result.value->dictionary()) << line << ": " << result.error;
  return result.value && result.value->dictionary() ? *result.value->dictionary() : Dictionary();
}

class TapTest : public testing::Test {
 protected:
  TapTest() { std::signal(SIGPIPE, SIG_IGN); }

  void write(const Value& value) const { tap->write(std::move(tap->line("test").add("value", value))); }

  fakes::FakeClock clock;
  platform::AsioQueues queues{2};
  std::shared_ptr<Tap> tap = std::make_shared<Tap>(queues, clock);
};

TEST_F(TapTest, IsSilentUntilSomebodyListens) {
  EXPECT_FALSE(tap->isListening());
  TapEnd reader;
  auto subscription = tap->listen(std::move(reader.writing));
  ASSERT_TRUE(subscription);
  EXPECT_TRUE(tap->isListening());
  subscription = nullptr;
  EXPECT_FALSE(tap->isListening());
  EXPECT_TRUE(reader.ended());
}

TEST_F(TapTest, WritesALineOfJSONForEachEvent) {
  for (const auto kind : {TapEnd::Kind::Pipe, TapEnd::Kind::Socket}) {
    TapEnd reader(kind);
    const auto subscription = tap->listen(std::move(reader.writing));
    ASSERT_TRUE(subscription);
    write("line\nfeed");
    write(2);
    const Dictionary first = parsed(reader.next().value_or(""));
    EXPECT_EQ(first.string("kind"), "test");
    EXPECT_EQ(first.string("value"), "line\nfeed");
    EXPECT_DOUBLE_EQ(first.real("time").value_or(0), platform::secondsSince1970(clock.now()));
    EXPECT_EQ(parsed(reader.next().value_or("")).integer("value"), 2);
  }
}

TEST_F(TapTest, WritesToEveryListenerWhatComesWhileItListens) {
  TapEnd early;
  const auto first = tap->listen(std::move(early.writing));
  write(1);
  TapEnd late;
  const auto second = tap->listen(std::move(late.writing));
  write(2);
  EXPECT_EQ(parsed(early.next().value_or("")).integer("value"), 1);
  EXPECT_EQ(parsed(early.next().value_or("")).integer("value"), 2);
  EXPECT_EQ(parsed(late.next().value_or("")).integer("value"), 2);
}

TEST_F(TapTest, TellsASlowReaderWhatItMissedAndNeverWaitsForIt) {
  TapEnd reader;
  const auto subscription = tap->listen(std::move(reader.writing));
  const std::string text(64 << 10, 'x');
  constexpr int kLines = 200;  // 12.5 MiB: three times the backlog.
  for (int i = 0; i < kLines; ++i) write(text);
  std::int64_t got = 0;
  std::int64_t missed = 0;
  while (got + missed < kLines) {
    const auto line = reader.next();
    ASSERT_TRUE(line);
    const Dictionary event = parsed(*line);
    if (event.string("kind") == "missed") {
      missed += event.integer("count").value_or(0);
    } else {
      EXPECT_EQ(event.string("value")->size(), text.size());
      ++got;
    }
  }
  EXPECT_EQ(got + missed, kLines);
  EXPECT_GE(missed, kLines - 4 - static_cast<std::int64_t>(Tap::kMaximumBacklogBytes / text.size()));
  EXPECT_GE(got, static_cast<std::int64_t>(Tap::kMaximumBacklogBytes / text.size()));
  write("again");
  EXPECT_EQ(parsed(reader.next().value_or("")).string("value"), "again");
}

TEST_F(TapTest, ASlowReaderCostsTheOthersNothing) {
  TapEnd slow;
  TapEnd quick;
  const auto first = tap->listen(std::move(slow.writing));
  const auto second = tap->listen(std::move(quick.writing));
  const std::string text(64 << 10, 'x');
  for (int i = 0; i < 200; ++i) {
    write(text);
    ASSERT_EQ(parsed(quick.next().value_or("")).string("value")->size(), text.size());
  }
}

TEST_F(TapTest, ForgetsAReaderThatHasGone) {
  for (const auto kind : {TapEnd::Kind::Pipe, TapEnd::Kind::Socket}) {
    TapEnd gone(kind);
    const auto first = tap->listen(std::move(gone.writing));
    gone.close();
    TapEnd reader;
    auto second = tap->listen(std::move(reader.writing));
    write(1);
    EXPECT_EQ(parsed(reader.next().value_or("")).integer("value"), 1);
    second = nullptr;
    EXPECT_FALSE(tap->isListening());  // The first one's subscription is still there.
  }
}

TEST_F(TapTest, TakesOnlyWhatCanBeWrittenWithoutBlocking) {
  const fakes::TemporaryFolder folder;
  const auto path = folder.path() / "file";
  EXPECT_FALSE(tap->listen(FileDescriptor(::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0600))));
  EXPECT_FALSE(tap->listen(FileDescriptor(::open("/dev/null", O_WRONLY | O_CLOEXEC))));
  EXPECT_FALSE(tap->listen(FileDescriptor()));
  int ends[2];
  ASSERT_EQ(::pipe2(ends, O_CLOEXEC), 0);
  const FileDescriptor writing(ends[1]);
  EXPECT_FALSE(tap->listen(FileDescriptor(ends[0])));
  EXPECT_FALSE(tap->isListening());
}

TEST_F(TapTest, TakesABoundedNumberOfListeners) {
  std::vector<TapEnd> readers(Tap::kMaximumListeners + 1);
  std::vector<std::unique_ptr<Tap::Subscription>> subscriptions;
  for (std::size_t i = 0; i < Tap::kMaximumListeners; ++i) {
    subscriptions.push_back(tap->listen(std::move(readers[i].writing)));
    EXPECT_TRUE(subscriptions.back());
  }
  EXPECT_FALSE(tap->listen(FileDescriptor(::dup(readers.back().writing.get()))));
  subscriptions.pop_back();
  EXPECT_TRUE(tap->listen(std::move(readers.back().writing)));
}

TEST_F(TapTest, ShowsWhatJSONCantHoldAsItsDescription) {
  TapEnd reader;
  const auto subscription = tap->listen(std::move(reader.writing));
  write(Dictionary{{"bytes", Data("ab")}});
  EXPECT_EQ(parsed(reader.next().value_or("")).string("value"),
            Value(Dictionary{{"bytes", Data("ab")}}).description());
}

TEST_F(TapTest, ShowsDropsWithTheirOwnerAndMessage) {
  TapEnd reader;
  const auto subscription = tap->listen(std::move(reader.writing));
  Account account({.session = 9,
                   .sessionID = 42,
                   .clientType = 6,
                   .clientName = "demo",
                   .backend = "splunk",
                   .kind = "https-post"},
                  tap);
  account.dropNew(DropReason::MethodLimit, 1, {{3, 65'535}});
  account.hold(7);
  account.dropHeld(DropReason::CleanUp, 0);  // Nothing dropped, nothing to show.
  account.dropHeld(DropReason::CleanUp, 7);
  Dictionary expected{{"kind", "drop"},
                      {"session", 9},
                      {"sessionID", 42},
                      {"clientType", 6},
                      {"clientName", "demo"},
                      {"backend", "splunk"},
                      {"count", 1},
                      {"reason", "method-limit"},
                      {"method", 3},
                      {"event", 65'535},
                      {"backendKind", "https-post"}};
  Dictionary drop = parsed(reader.next().value_or(""));
  drop.remove("time");
  EXPECT_EQ(drop, expected);
  drop = parsed(reader.next().value_or(""));
  EXPECT_EQ(drop.string("reason"), "clean-up");
  EXPECT_EQ(drop.integer("count"), 7);
  EXPECT_FALSE(drop.contains("method"));
}

TEST_F(TapTest, CountsALineForWhichThereIsNoMemoryAsMissed) {
  TapEnd reader;
  const auto subscription = tap->listen(std::move(reader.writing));
  const Account account({.session = 1}, tap);
  account.show("large", [](TapLine&) { throw std::bad_alloc(); });
  account.show("small", [](TapLine&) {});
  const Dictionary missed = parsed(reader.next().value_or(""));
  EXPECT_EQ(missed.string("kind"), "missed");
  EXPECT_EQ(missed.integer("count"), 1);
  EXPECT_EQ(parsed(reader.next().value_or("")).string("kind"), "small");
}

TEST(TapMemoryTest, WritesWithTheNextLineWhatItsQueueHadNoMemoryFor) {
  fakes::FakeQueues queues;
  const fakes::FakeClock clock;
  const auto tap = std::make_shared<Tap>(queues, clock);
  TapEnd reader;
  const auto subscription = tap->listen(std::move(reader.writing));
  queues.refuseWork(1);
  tap->write(tap->line("first"));
  tap->write(tap->line("second"));
  queues.run();
  EXPECT_EQ(parsed(reader.next().value_or("")).string("kind"), "first");
  EXPECT_EQ(parsed(reader.next().value_or("")).string("kind"), "second");
}

TEST_F(TapTest, AsksNobodyToDescribeWhatNobodySees) {
  const Account account({}, tap);
  int described = 0;
  account.show("test", [&](TapLine&) { ++described; });
  Account().show("test", [&](TapLine&) { ++described; });
  EXPECT_EQ(described, 0);
  TapEnd reader;
  const auto subscription = tap->listen(std::move(reader.writing));
  account.show("test", [&](TapLine&) { ++described; });
  EXPECT_EQ(described, 1);
}

}  // namespace
}  // namespace tallyd
