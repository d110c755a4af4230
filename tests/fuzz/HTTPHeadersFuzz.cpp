// The headers of a server's answer: joined by name, and the storebag's age among them.

#include <algorithm>
#include <limits>
#include <string>

#include "FuzzTarget.h"
#include "platform/HTTPClient.h"
#include "platform/Value.h"
#include "storebag/StorebagRetrieval.h"

namespace tallyd::fuzz {
namespace {

using platform::HTTPResponse;

constexpr std::string_view kName = "Cache-Control";

std::string asciiLowercased(std::string_view text) {
  std::string result(text);
  std::transform(result.begin(), result.end(), result.begin(),
                 [](char c) { return c >= 'A' && c <= 'Z' ? static_cast<char>(c + 32) : c; });
  return result;
}

HTTPResponse responseFrom(Input& input) {
  HTTPResponse response;
  response.status = 200;
  while (!input.isEmpty()) {
    const auto line = input.takeLine();
    const auto colon = std::min(line.find(':'), line.size());
    const auto value = line.substr(std::min(colon + 1, line.size()));
    response.headers.emplace_back(line.substr(0, colon),
                                  value.substr(std::min(value.find_first_not_of(' '), value.size())));
  }
  return response;
}

/// The first component that is just "max-age", said in another way than the reader says it.
void checkAge(std::string_view header) {
  const CacheAge age = cacheAgeFromHeader(header);
  std::string separated(header);
  std::replace(separated.begin(), separated.end(), ' ', '=');
  const auto found = ("=" + separated + "=").find("=max-age=");
  if (found == std::string::npos) {
    FUZZ_CHECK(!age.endsInMaxAge && age.maxAgeSeconds == 86'400);
    return;
  }
  const bool isLast = found + 7 == separated.size();
  FUZZ_CHECK(age.endsInMaxAge == isLast);
  if (isLast) return;
  const auto number = separated.substr(found + 8);
  const auto wanted = std::clamp<std::int64_t>(platform::leadingInteger(number.substr(0, number.find('='))),
                                               std::numeric_limits<std::int32_t>::min(),
                                               std::numeric_limits<std::int32_t>::max());
  FUZZ_CHECK(age.maxAgeSeconds == wanted);
}

}  // namespace
}  // namespace tallyd::fuzz

/// Lines "NAME: VALUE".
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  Input input(data, size);
  const HTTPResponse response = responseFrom(input);
  std::optional<std::string> joined;
  for (const auto& [name, value] : response.headers) {
    if (asciiLowercased(name) != asciiLowercased(kName)) continue;
    joined = joined ? *joined + ", " + value : value;
  }
  FUZZ_CHECK(response.header(kName) == joined);
  FUZZ_CHECK(response.header(asciiLowercased(kName)) == joined);
  if (joined) checkAge(*joined);
  FUZZ_CHECK(tallyd::cacheAgeFromHeader(std::nullopt).maxAgeSeconds == 0);
  return 0;
}
