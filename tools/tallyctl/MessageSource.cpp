#include "tallyctl/MessageSource.h"

#include <fmt/format.h>

#include <algorithm>
#include <system_error>
#include <utility>

namespace tallyd::tallyctl {

namespace {

bool isBlank(const std::string& line) { return line.find_first_not_of(" \t\r") == std::string::npos; }

}  // namespace

MessageSource::MessageSource(const std::string& path, int standardInput)
    : _input(path, standardInput), _lines(_input.descriptor()) {}

std::optional<std::variant<Message, MessageSource::Fault>> MessageSource::next() {
  using Status = LineReader::Status;
  Status status = nextLine();
  while (status == Status::Line && isBlank(_line)) status = nextLine();
  if (status == Status::End) return std::nullopt;
  const auto fault = [this](std::string_view text) {
    return Fault{placeOf(lineNumber()), std::string(text)};
  };
  if (status == Status::TooLong) {
    return fault(fmt::format("longer than {} bytes", LineReader::kMaximumLineBytes));
  }
  auto parsed = messageFromJSON(_line);
  if (!parsed.value) return fault(parsed.error);
  return std::move(*parsed.value);
}

std::string MessageSource::placeOf(std::uint64_t lineNumber) const {
  return fmt::format("{}:{}", _input.name(), lineNumber);
}

std::optional<double> MessageSource::share() const {
  if (_input.lengthBytes() == 0) return std::nullopt;
  return std::min(1.0, static_cast<double>(_lines.bytesRead()) / static_cast<double>(_input.lengthBytes()));
}

LineReader::Status MessageSource::nextLine() {
  try {
    return _lines.next(_line);
  } catch (const std::system_error& error) {
    throw std::system_error(error.code(), placeOf(lineNumber() + 1));
  }
}

}  // namespace tallyd::tallyctl
