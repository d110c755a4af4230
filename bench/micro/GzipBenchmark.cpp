#include <benchmark/benchmark.h>

#include <string>

#include "Events.h"
#include "Samples.h"
#include "ZlibFloor.h"
#include "support/GzipCompression.h"

namespace tallyd::bench {
namespace {

/// Compresses the document of as many events as the state's argument says.
template <class Compress>
void compressDocument(benchmark::State& state, Compress&& compress) {
  const std::string document = documentOf(static_cast<std::size_t>(state.range(0)));
  for (auto _ : state) benchmark::DoNotOptimize(compress(document));
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(document.size()));
}

void compress(benchmark::State& state) {
  NoLog log;
  compressDocument(state, [&](const std::string& document) { return gzipDeflate(document, log); });
}
BENCHMARK(compress)->Name("gzip/deflate")->ArgName("events")->Arg(1)->Arg(kBatchSize);

void compressWithZlib(benchmark::State& state) {
  Deflater deflater;
  compressDocument(state, [&](const std::string& document) { return deflater.deflate(document); });
}
BENCHMARK(compressWithZlib)->Name("gzip/zlib-alone")->ArgName("events")->Arg(1)->Arg(kBatchSize);

}  // namespace
}  // namespace tallyd::bench
