#include "platform/Log.h"

#include <gtest/gtest.h>

#include <new>
#include <utility>

#include "fakes/FakeLog.h"

namespace {

/// What takes more memory to write than there is.
struct TooLarge {};

}  // namespace

template <>
struct fmt::formatter<TooLarge> {
  constexpr auto parse(format_parse_context& context) { return context.begin(); }
  template <class Context>
  auto format(const TooLarge&, Context&) const -> decltype(std::declval<Context>().out()) {
    throw std::bad_alloc();
  }
};

namespace tallyd::platform {
namespace {

TEST(LogTest, WritesOneFormattedLine) {
  fakes::FakeLog log;
  asl_log(log, LogLevel::Warning, "{} of {}", 1, "two");
  EXPECT_EQ(log.lines(), (std::vector<fakes::FakeLog::Line>{{LogLevel::Warning, "1 of two"}}));
}

TEST(LogTest, FormatsNothingThatNobodyTakes) {
  fakes::FakeLog log(LogLevel::Info);
  asl_log(log, LogLevel::Debug, "{}", TooLarge());
  EXPECT_TRUE(log.lines().empty());
}

TEST(LogTest, LosesALineForWhichThereIsNoMemoryAndFailsNobody) {
  class FullLog : public fakes::FakeLog {
   public:
    void write(LogLevel, std::string_view) override { throw std::bad_alloc(); }
  } full;
  EXPECT_NO_THROW(asl_log(full, LogLevel::Critical, "a line"));
  fakes::FakeLog log;
  EXPECT_NO_THROW(asl_log(log, LogLevel::Critical, "{}", TooLarge()));
  EXPECT_TRUE(log.lines().empty());
}

}  // namespace
}  // namespace tallyd::platform
