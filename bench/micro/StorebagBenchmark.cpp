#include <benchmark/benchmark.h>

#include <string>

#include "Device.h"
#include "Samples.h"
#include "backends/https-post/ReportingRules.h"
#include "platform/property-list/PropertyList.h"
#include "signing/StorebagSigning.h"
#include "storebag/StorebagRetrieval.h"
#include "storebag/StorebagSignature.h"

namespace tallyd::bench {
namespace {

using platform::PropertyListFormat;

std::size_t entriesOf(const benchmark::State& state) { return static_cast<std::size_t>(state.range(0)); }

/// The signature alone, over the bytes of a bag.
void verify(benchmark::State& state) {
  const auto signer = signing::makeStorebagKey();
  const auto key = StorebagPublicKey::fromDER(signing::publicKeyDER(signer.get()));
  const std::string bag =
      *platform::dataWithPropertyList(storebag(postProfile(entriesOf(state))), PropertyListFormat::XML);
  const std::string signature = signing::storebagSignature(signer.get(), bag);
  for (auto _ : state) {
    if (!verifyStorebagSignature(*key, bag, signature)) state.SkipWithError("the signature does not hold");
  }
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(bag.size()));
}
BENCHMARK(verify)->Name("storebag/verify")->ArgName("entries")->Arg(1)->Arg(1000);

void readKey(benchmark::State& state) {
  const std::string der = signing::publicKeyDER(signing::makeStorebagKey().get());
  for (auto _ : state) benchmark::DoNotOptimize(StorebagPublicKey::fromDER(der));
}
BENCHMARK(readKey)->Name("storebag/read-key");

/// From the response to the section of the environment: envelope, key, signature, bag.
void decode(benchmark::State& state) {
  constexpr std::int32_t kClientType = 5;
  Device device;
  device.serve(storebag(postProfile(entriesOf(state))));
  for (auto _ : state) {
    const StorebagFetch fetch = fetchStorebagForClientType(device.platform(), kClientType);
    if (!fetch.storebag) state.SkipWithError("the bag is refused");
    benchmark::DoNotOptimize(fetch);
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(decode)
    ->Name("storebag/decode")
    ->ArgName("entries")
    ->Arg(1)
    ->Arg(100)
    ->Arg(1000)
    ->Unit(benchmark::kMicrosecond);

/// Of the entries, the last matches.
void decide(benchmark::State& state) {
  const ReportingCircumstances circumstances{.profile = postProfile(entriesOf(state)),
                                             .requireUserInfo = true,
                                             .userInfo = userInfo(),
                                             .consented = true,
                                             .productFamily = "Kasten",
                                             .countryCode = "US"};
  for (auto _ : state) {
    const ReportingDecision decision = decideReporting(circumstances);
    if (decision.eventThreshold != kLastEventThreshold) state.SkipWithError("another entry is chosen");
    benchmark::DoNotOptimize(decision);
  }
  state.SetItemsProcessed(state.iterations() * state.range(0));
}
BENCHMARK(decide)->Name("storebag/decide")->ArgName("entries")->Arg(1)->Arg(100)->Arg(1000);

}  // namespace
}  // namespace tallyd::bench
