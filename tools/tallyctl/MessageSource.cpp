#include "tallyctl/MessageSource.h"

#include <fcntl.h>
#include <fmt/format.h>
#include <sys/stat.h>

#include <algorithm>
#include <cerrno>
#include <system_error>
#include <utility>

namespace tallyd::tallyctl {

namespace {

platform::FileDescriptor openFile(const std::string& path) {
  if (path == "-") return {};
  platform::FileDescriptor file(::open(path.c_str(), O_RDONLY | O_CLOEXEC));
  if (!file) throw std::system_error(errno, std::generic_category(), path);
  return file;
}

std::uint64_t lengthOf(int descriptor) {
  struct stat status {};
  if (::fstat(descriptor, &status) != 0 || !S_ISREG(status.st_mode)) return 0;
  return static_cast<std::uint64_t>(status.st_size);
}

bool isBlank(const std::string& line) { return line.find_first_not_of(" \t\r") == std::string::npos; }

}  // namespace

MessageSource::MessageSource(const std::string& path, int standardInput)
    : _name(path == "-" ? "standard input" : path),
      _file(openFile(path)),
      _lines(_file ? _file.get() : standardInput),
      _lengthBytes(lengthOf(_file ? _file.get() : standardInput)) {}

std::optional<std::variant<Message, MessageSource::Fault>> MessageSource::next() {
  using Status = LineReader::Status;
  Status status = nextLine();
  while (status == Status::Line && isBlank(_line)) status = nextLine();
  if (status == Status::End) return std::nullopt;
  const auto fault = [this](std::string_view text) {
    return Fault{fmt::format("{}: {}", placeOf(lineNumber()), text)};
  };
  if (status == Status::TooLong) {
    return fault(fmt::format("longer than {} bytes", LineReader::kMaximumLineBytes));
  }
  auto parsed = messageFromJSON(_line);
  if (!parsed.value) return fault(parsed.error);
  return std::move(*parsed.value);
}

std::string MessageSource::placeOf(std::uint64_t lineNumber) const {
  return fmt::format("{}:{}", _name, lineNumber);
}

std::optional<double> MessageSource::share() const {
  if (_lengthBytes == 0) return std::nullopt;
  return std::min(1.0, static_cast<double>(_lines.bytesRead()) / static_cast<double>(_lengthBytes));
}

LineReader::Status MessageSource::nextLine() {
  try {
    return _lines.next(_line);
  } catch (const std::system_error& error) {
    throw std::system_error(error.code(), placeOf(lineNumber() + 1));
  }
}

}  // namespace tallyd::tallyctl
