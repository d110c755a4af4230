// Property lists of all three forms: read, written as XML and as binary, and read again.

#include <string>

#include "FuzzTarget.h"
#include "ValueDepth.h"
#include "platform/property-list/KeyedArchive.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::fuzz {
namespace {

using namespace platform;

/// What was written can be read, and what was read back reads the same ever after. Once it may change: what a
/// form can't carry is replaced, and keys that this changes are sorted anew. The values count, not the bytes:
/// after other inputs in one process, these have been seen to differ.
void checkRoundTrip(const Value& value, PropertyListFormat format) {
  const auto once = dataWithPropertyList(value, format);
  if (!once) return;  // A date may lie outside the years that can be written.
  const auto read = propertyListWithData(*once);
  FUZZ_CHECK(read.value && read.error.empty());
  const auto settled = dataWithPropertyList(*read.value, format);
  FUZZ_CHECK(settled.has_value());
  const auto reread = propertyListWithData(*settled);
  FUZZ_CHECK(reread.value.has_value());
  FUZZ_CHECK(reread.value->description() == read.value->description());  // NaN equals nothing.
}

}  // namespace
}  // namespace tallyd::fuzz

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  const auto read = propertyListWithData(Input(data, size).takeRest());
  FUZZ_CHECK(read.value.has_value() == read.error.empty());
  if (!read.value) return 0;
  FUZZ_CHECK(depthOf(*read.value) <= kMaximumPropertyListDepth);
  FUZZ_CHECK(!read.value->isNull());
  (void)read.value->description();
  checkRoundTrip(*read.value, PropertyListFormat::XML);
  checkRoundTrip(*read.value, PropertyListFormat::Binary);
  return 0;
}
