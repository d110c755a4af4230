#include <benchmark/benchmark.h>

#include <bit>
#include <string>
#include <vector>

#include "Events.h"
#include "platform/dbus/BodyReader.h"
#include "platform/dbus/BodyWriter.h"
#include "platform/dbus/Message.h"

namespace tallyd::bench {
namespace {

using platform::Array;
using platform::Value;
namespace dbus = platform::dbus;

constexpr std::string_view kSignature = "qqaa{sv}";  ///< Of SendMessageWithCategory.

std::vector<Value> arguments() { return {kCategory, kType, Array{payload(0)}}; }

std::string bodyOf(const std::vector<Value>& values) {
  std::string bytes;
  dbus::ByteWriter writer(bytes);
  static_cast<void>(dbus::writeBody(writer, kSignature, values, 0));
  return bytes;
}

void countIn(benchmark::State& state, std::size_t bytes) {
  state.SetBytesProcessed(state.iterations() * static_cast<std::int64_t>(bytes));
}

void writeBody(benchmark::State& state) {
  const std::vector<Value> values = arguments();
  for (auto _ : state) benchmark::DoNotOptimize(bodyOf(values));
  countIn(state, bodyOf(values).size());
}
BENCHMARK(writeBody)->Name("dbus/write-body");

void readBody(benchmark::State& state) {
  const std::string body = bodyOf(arguments());
  for (auto _ : state) {
    const dbus::ReadValues read = dbus::readBody(body, std::endian::native, kSignature, {});
    if (read.problem) state.SkipWithError(read.problem->c_str());
    benchmark::DoNotOptimize(read);
  }
  countIn(state, body.size());
}
BENCHMARK(readBody)->Name("dbus/read-body");

std::string message() {
  std::string bytes;
  dbus::MessageBuilder builder(bytes, {.type = dbus::MessageType::MethodCall,
                                       .serial = 7,
                                       .path = "/com/quillon/tallyd",
                                       .interface = "com.quillon.tallyd.ClientSessionInterface",
                                       .member = "SendMessageWithCategory",
                                       .signature = kSignature});
  static_cast<void>(dbus::writeBody(builder.body(), kSignature, arguments(), 0));
  builder.finish();
  return bytes;
}

void writeMessage(benchmark::State& state) {
  for (auto _ : state) benchmark::DoNotOptimize(message());
  countIn(state, message().size());
}
BENCHMARK(writeMessage)->Name("dbus/write-message");

void readHeader(benchmark::State& state) {
  const std::string bytes = message();
  for (auto _ : state) benchmark::DoNotOptimize(dbus::parseMessage(bytes));
}
BENCHMARK(readHeader)->Name("dbus/read-header");

}  // namespace
}  // namespace tallyd::bench
