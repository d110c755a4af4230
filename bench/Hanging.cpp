#include "Events.h"
#include "Figures.h"
#include "Measure.h"
#include "Sessions.h"

namespace tallyd::bench {

namespace {

/// Far more than the daemon has under way at a time: most posts wait in it, as long as the collector hangs.
/// All of them together stay far below what it lets wait, and the run ends before the first is given up.
constexpr std::size_t kFlushes = 200;
constexpr std::size_t kQuickFlushes = 150;

/// The median time of a flush's call and its answer, in milliseconds. The events are in the batch before.
double medianFlush(Sessions& sessions, std::size_t flushes, PostAnswers answers) {
  constexpr double kMilliseconds = 1e3;
  ReplayingClient& client = sessions.clients().front();
  std::vector<double> times;
  for (std::size_t flush = 0; flush < flushes; ++flush) {
    client.sendEvents(flush * kBatchSize, kBatchSize, ReplayingClient::kNoFlush);
    client.call(sessions.recording().fetchDisplayURL);
    const Stopwatch stopwatch;
    client.call(sessions.recording().flushAndAnswer);
    times.push_back(stopwatch.seconds() * kMilliseconds);
    // So that no post is under way when the clock starts again.
    if (answers == PostAnswers::AtOnce) sessions.collector().waitForPosts(flush + 1);
  }
  if (answers == PostAnswers::AtOnce) checkDocuments(sessions.takeDocuments(), flushes * kBatchSize);
  return median(std::move(times));
}

}  // namespace

void measureHanging(const Settings& settings, Figures& figures) {
  Figure figure{
      .name = "hanging/flush", .unit = "ms", .floorName = "collector answers", .target = Target::ratio(1.2)};
  if (!settings.wants(figure.name)) return;
  const std::size_t flushes = settings.quick ? kQuickFlushes : kFlushes;
  for (int run = 0; run < settings.runs(); ++run) {
    const auto flushTime = [&](PostAnswers answers) {
      Sessions sessions(settings, {.answers = answers});
      return medianFlush(sessions, flushes, answers);
    };
    const double value = flushTime(PostAnswers::Never);
    figure.add(value, flushTime(PostAnswers::AtOnce));
  }
  figures.push_back(std::move(figure));
}

}  // namespace tallyd::bench
