#include "Events.h"
#include "Figures.h"
#include "Measure.h"
#include "Samples.h"
#include "ZlibFloor.h"
#include "backends/https-post/EventRecord.h"
#include "backends/https-post/PostBody.h"
#include "support/GzipCompression.h"

namespace tallyd::bench {

using platform::Dictionary;

namespace {

constexpr int kBatches = 200;
constexpr int kQuickBatches = 30;

std::string jsonOfEvents(const std::vector<Dictionary>& payloads, platform::Log& log) {
  EventRecords records;
  std::vector<EventRecord> batch;
  batch.reserve(payloads.size());
  for (std::size_t number = 0; number < payloads.size(); ++number) {
    batch.push_back(records.record(payloads[number], eventFacts(number)));
  }
  platform::JSONText array;
  EventFields fields;
  array.startArray();
  for (const EventRecord& record : batch) {
    record.fieldsInto(fields);
    sanitizeEventForJSON(fields, log);
    appendEvent(array, fields);
  }
  array.endArray();
  return documentAround(array.view());
}

/// Microseconds of processor time for one of `count` calls.
template <class Work>
double processorTime(int count, Work&& work) {
  constexpr double kMicroseconds = 1e6;
  const double start = processorSecondsOfThisThread();
  for (int i = 0; i < count; ++i) work();
  return (processorSecondsOfThisThread() - start) * kMicroseconds / count;
}

}  // namespace

void measureBatch(const Settings& settings, Figures& figures) {
  if (!settings.wants("batch/")) return;
  const int batches = settings.quick ? kQuickBatches : kBatches;
  NoLog log;
  Deflater deflater;
  std::vector<Dictionary> payloads;
  for (std::size_t number = 0; number < kBatchSize; ++number) payloads.push_back(payload(number));
  const std::string ofBatch = jsonOfEvents(payloads, log);
  const std::string ofOne = jsonOfEvents({payloads[0]}, log);

  const auto measure = [&](const char* name, const char* unit, const std::string& document,
                           const auto& work) {
    if (!settings.wants(name)) return;
    const auto floor = [&] { keep(deflater.deflate(document)); };
    Figure figure{.name = name, .unit = unit, .floorName = "zlib alone"};
    processorTime(batches / 10, work);
    processorTime(batches / 10, floor);
    for (int run = 0; run < settings.runs(); ++run) {
      const double value = processorTime(batches, work);
      figure.add(value, processorTime(batches, floor));
    }
    figures.push_back(std::move(figure));
  };
  measure("batch/record-json-gzip", "us/50", ofBatch,
          [&] { keep(gzipDeflate(jsonOfEvents(payloads, log), log)->size()); });
  measure("batch/record-json", "us/50", ofBatch, [&] { keep(jsonOfEvents(payloads, log).size()); });
  measure("batch/gzip", "us/50", ofBatch, [&] { keep(gzipDeflate(ofBatch, log)->size()); });
  measure("batch/gzip-one-event", "us", ofOne, [&] { keep(gzipDeflate(ofOne, log)->size()); });
}

}  // namespace tallyd::bench
