#include <benchmark/benchmark.h>

#include <string>

#include "Device.h"
#include "Samples.h"
#include "support/MessageLog.h"

namespace tallyd::bench {
namespace {

/// A document with one event, in the file system of temporary files.
void writeLine(benchmark::State& state) {
  const Device device;
  const std::string document = documentOf(1);
  MessageLog log(device.platform());
  log.writeMessageLog(document);  // Makes folder, file and its entry in the defaults.
  for (auto _ : state) log.writeMessageLog(document);
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(document.size()));
  state.SetItemsProcessed(state.iterations());
}
BENCHMARK(writeLine)->Name("message-log/line");

}  // namespace
}  // namespace tallyd::bench
