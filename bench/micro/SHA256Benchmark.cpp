#include <benchmark/benchmark.h>

#include <string>

#include "backends/TallyBackend.h"

namespace tallyd::bench {
namespace {

/// Of a text of as many bytes as the argument says: an identifier, a URL, a page.
void hash(benchmark::State& state, const std::string& letter) {
  std::string text;
  while (text.size() < static_cast<std::size_t>(state.range(0))) text += letter;
  for (auto _ : state) benchmark::DoNotOptimize(TallyBackend::convertIntoSHA256(text));
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(text.size()));
}
BENCHMARK_CAPTURE(hash, ascii, "a")->Name("sha256/ascii")->ArgName("bytes")->Arg(16)->Arg(64)->Arg(4096);
/// UTF-16 units have to be counted.
BENCHMARK_CAPTURE(hash, umlaut, "ö")->Name("sha256/umlauts")->ArgName("bytes")->Arg(16)->Arg(64)->Arg(4096);

}  // namespace
}  // namespace tallyd::bench
