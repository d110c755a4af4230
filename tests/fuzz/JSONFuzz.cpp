// JSON: the reader and the writer, tallyctl's lines and assignments, and files of log data.

#include <sys/mman.h>
#include <unistd.h>

#include <stdexcept>
#include <string>
#include <variant>

#include "FuzzTarget.h"
#include "platform/FileDescriptor.h"
#include "platform/JSON.h"
#include "tallyctl/LogData.h"
#include "tallyctl/Message.h"
#include "tallyctl/MessageSource.h"
#include "tallyctl/StrictJSON.h"

namespace tallyd::fuzz {
namespace {

using platform::FileDescriptor;
using platform::jsonFromValue;
using platform::valueFromJSON;
using tallyctl::MessageSource;
using tallyctl::parseAssignment;
using tallyctl::valueFromStrictJSON;

void checkJSON(std::string_view text) {
  const auto read = valueFromJSON(text);
  FUZZ_CHECK(read.value.has_value() == read.error.empty());
  const auto strict = valueFromStrictJSON(text);
  FUZZ_CHECK(strict.value.has_value() == strict.error.empty());
  if (!read.value) {
    FUZZ_CHECK(!strict.value);
    return;
  }
  if (strict.value) FUZZ_CHECK(*strict.value == *read.value);
  const auto once = jsonFromValue(*read.value);
  FUZZ_CHECK(once.has_value());  // JSON has no number that is none.
  const auto again = valueFromStrictJSON(*once);
  FUZZ_CHECK(again.value.has_value());
  FUZZ_CHECK(*again.value == *read.value);
}

void checkAssignment(std::string_view text) {
  const auto entry = parseAssignment(text);
  FUZZ_CHECK(entry.value.has_value() == entry.error.empty());
  if (entry.value) FUZZ_CHECK(text.substr(0, entry.value->key.size()) == entry.value->key);
}

/// The file that the lines come from.
int inputFile() {
  static const FileDescriptor file(::memfd_create("lines", MFD_CLOEXEC));
  if (!file) throw std::runtime_error("no memory file");
  return file.get();
}

void checkLines(std::string_view text) {
  const int file = inputFile();
  FUZZ_CHECK(::ftruncate(file, 0) == 0);
  FUZZ_CHECK(::pwrite(file, text.data(), text.size(), 0) == static_cast<ssize_t>(text.size()));
  FUZZ_CHECK(::lseek(file, 0, SEEK_SET) == 0);
  MessageSource source("-", file);
  std::uint64_t line = 0;
  while (const auto next = source.next()) {
    FUZZ_CHECK(source.lineNumber() > line);
    line = source.lineNumber();
    if (const auto* fault = std::get_if<MessageSource::Fault>(&*next)) FUZZ_CHECK(!fault->text.empty());
  }
}

}  // namespace
}  // namespace tallyd::fuzz

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  const auto text = Input(data, size).takeRest();
  checkJSON(text);
  checkAssignment(text);
  checkLines(text);
  const auto elements = tallyd::tallyctl::logDataFromContent(text);
  FUZZ_CHECK(elements.value.has_value() == elements.error.empty());
  return 0;
}
