// The files that an operator writes, or whoever got at them: preferences, device.plist, sandbox profiles, and
// the system's own texts.

#include <algorithm>
#include <filesystem>
#include <string>

#include "FuzzTarget.h"
#include "platform/property-list/PropertyList.h"
#include "platform/sandbox/SandboxErrors.h"
#include "platform/sandbox/SandboxProfile.h"
#include "platform/settings/MachineFacts.h"
#include "platform/settings/PropertyListFile.h"

namespace tallyd::fuzz {
namespace {

using namespace platform;

void checkDictionary(std::string_view bytes) {
  const auto read = dictionaryWithData(bytes);
  FUZZ_CHECK(read.dictionary.has_value() == read.error.empty());
  const auto list = propertyListWithData(bytes);
  FUZZ_CHECK(read.dictionary.has_value() == (list.value && list.value->dictionary()));
  if (!read.dictionary) return;
  for (const auto& [key, value] : *read.dictionary) {
    // What the daemon asks of a preference, whatever its kind.
    (void)value.booleanValue();
    (void)value.integerValue();
    FUZZ_CHECK(read.dictionary->find(key) == &value);
  }
}

void checkProfile(std::string_view bytes) {
  try {
    const SandboxProfile profile = sandboxProfileWithData(bytes, Root("/below"));
    FUZZ_CHECK(!profile.systemCalls.empty());
    for (const auto* paths : {&profile.read, &profile.write, &profile.remove}) {
      for (const std::filesystem::path& path : *paths) FUZZ_CHECK(path.is_absolute());
    }
  } catch (const ProfileError& error) {
    FUZZ_CHECK(!std::string_view(error.what()).empty());
  }
}

void checkShellText(std::string_view text) {
  for (const std::string_view variable : {"VERSION_ID", "BUILD_ID", "CHASSIS"}) {
    const auto value = shellVariable(text, variable);
    if (!value) continue;
    FUZZ_CHECK(!value->empty() && value->size() <= 3 * text.size());  // U+FFFD is three bytes.
    FUZZ_CHECK(text.find(variable) != std::string_view::npos);
    FUZZ_CHECK(value->find('\n') == std::string::npos);
  }
}

}  // namespace
}  // namespace tallyd::fuzz

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  const auto bytes = Input(data, size).takeRest();
  checkDictionary(bytes);
  checkProfile(bytes);
  checkShellText(bytes);
  return 0;
}
