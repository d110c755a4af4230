// Keyed archives as the station reads them, and those of values that come from property lists.

#include <string>

#include "FuzzTarget.h"
#include "platform/property-list/KeyedArchive.h"
#include "platform/property-list/PropertyList.h"
#include "station/KeyedArchiveReader.h"
#include "station/Limits.h"
#include "station/ReadableText.h"

namespace tallyd::fuzz {
namespace {

using namespace platform;
using station::readKeyedArchive;

/// What the daemon archives, the station reads.
void checkRoundTrip(const Value& value) {
  const auto archive = archivedDataWithRootObject(value);
  if (!archive) return;
  const auto read = readKeyedArchive(*archive);
  if (!read.root) {
    // Objects of classes that are not known come out as dictionaries, which are larger.
    FUZZ_CHECK(read.problem.find("comes to too much") != std::string::npos);
    return;
  }
  // What containers share may differ, and so may the archive; what it says must not.
  const auto again = archivedDataWithRootObject(*read.root);
  FUZZ_CHECK(again.has_value());
  const auto reread = readKeyedArchive(*again);
  FUZZ_CHECK(reread.root && reread.root->description() == read.root->description());
}

}  // namespace
}  // namespace tallyd::fuzz

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  const auto bytes = Input(data, size).takeRest();
  const auto archived = readKeyedArchive(bytes);
  FUZZ_CHECK(archived.root.has_value() == archived.problem.empty());
  if (archived.root) {
    (void)tallyd::station::readableValue(&*archived.root);
    checkRoundTrip(*archived.root);
    return 0;
  }
  const auto list = propertyListWithData(bytes);
  if (list.value) checkRoundTrip(*list.value);
  return 0;
}
