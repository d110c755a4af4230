#include <benchmark/benchmark.h>

#include <string>

#include "Samples.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::bench {
namespace {

using platform::PropertyListFormat;
using platform::Value;

/// With as many client entries as the argument says.
Value bagOf(const benchmark::State& state) {
  return storebag(postProfile(static_cast<std::size_t>(state.range(0))));
}

void countIn(benchmark::State& state, std::size_t bytes) {
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(bytes));
}

void writeList(benchmark::State& state, PropertyListFormat format) {
  const Value bag = bagOf(state);
  for (auto _ : state) benchmark::DoNotOptimize(platform::dataWithPropertyList(bag, format));
  countIn(state, platform::dataWithPropertyList(bag, format)->size());
}
BENCHMARK_CAPTURE(writeList, xml, PropertyListFormat::XML)
    ->Name("property-list/write-xml")
    ->ArgName("entries")
    ->Arg(1)
    ->Arg(100);
BENCHMARK_CAPTURE(writeList, binary, PropertyListFormat::Binary)
    ->Name("property-list/write-binary")
    ->ArgName("entries")
    ->Arg(1)
    ->Arg(100);

void readList(benchmark::State& state, PropertyListFormat format) {
  const std::string bytes = *platform::dataWithPropertyList(bagOf(state), format);
  for (auto _ : state) benchmark::DoNotOptimize(platform::propertyListWithData(bytes));
  countIn(state, bytes.size());
}
BENCHMARK_CAPTURE(readList, xml, PropertyListFormat::XML)
    ->Name("property-list/read-xml")
    ->ArgName("entries")
    ->Arg(1)
    ->Arg(100);
BENCHMARK_CAPTURE(readList, binary, PropertyListFormat::Binary)
    ->Name("property-list/read-binary")
    ->ArgName("entries")
    ->Arg(1)
    ->Arg(100);

}  // namespace
}  // namespace tallyd::bench
