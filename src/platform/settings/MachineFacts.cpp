#include "platform/settings/MachineFacts.h"

#include <algorithm>
#include <charconv>

#include "platform/UTF8.h"
#include "platform/settings/FileReading.h"

namespace tallyd::platform {

namespace {

/// Far more than any of these files has.
constexpr std::size_t kMaximumFactBytes = 64 << 10;

constexpr std::string_view kBlanks = " \t\r\n";

std::string_view trimmed(std::string_view text) {
  const std::size_t first = text.find_first_not_of(kBlanks);
  if (first == std::string_view::npos) return {};
  return text.substr(first, text.find_last_not_of(kBlanks) - first + 1);
}

std::optional<std::string> nonEmpty(std::string_view text) {
  text = trimmed(text);
  return text.empty() ? std::nullopt : std::optional(withBrokenUTF8Replaced(text));
}

/// The word that a shell would make of `text`, up to the first unquoted blank.
std::string unquoted(std::string_view text) {
  std::string word;
  char quote = 0;
  for (std::size_t i = 0; i < text.size(); ++i) {
    const char c = text[i];
    if (c == '\\' && quote != '\'' && i + 1 < text.size()) {
      word += text[++i];
    } else if (c == quote) {
      quote = 0;
    } else if (quote == 0 && (c == '"' || c == '\'')) {
      quote = c;
    } else if (quote == 0 && kBlanks.find(c) != std::string_view::npos) {
      break;
    } else {
      word += c;
    }
  }
  return word;
}

std::string_view chassisOfEnclosure(int kind) {
  switch (kind) {
    case 0x03:  // Desktop
    case 0x04:  // Low profile desktop
    case 0x06:  // Mini tower
    case 0x07:  // Tower
    case 0x0D:  // All in one
    case 0x18:  // Sealed-case PC
    case 0x23:  // Mini PC
    case 0x24:  // Stick PC
      return "desktop";
    case 0x08:  // Portable
    case 0x09:  // Laptop
    case 0x0A:  // Notebook
    case 0x0E:  // Sub notebook
      return "laptop";
    case 0x0B:  // Hand held
      return "handset";
    case 0x11:  // Main server chassis
    case 0x17:  // Rack mount chassis
    case 0x1C:  // Blade
    case 0x1D:  // Blade enclosure
      return "server";
    case 0x1E:
      return "tablet";
    case 0x1F:  // Convertible
    case 0x20:  // Detachable
      return "convertible";
    case 0x22:  // Embedded PC
    case 0x21:  // IoT gateway
      return "embedded";
    default:
      return {};
  }
}

int hexDigit(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  return c >= 'a' && c <= 'f' ? c - 'a' + 10 : -1;
}

}  // namespace

std::optional<std::string> MachineFacts::text(std::string_view relativePath) const {
  return readFile(_root / relativePath, kMaximumFactBytes).bytes;
}

std::optional<MachineID> MachineFacts::machineID() const {
  const auto file = text("etc/machine-id");
  MachineID id{};
  if (!file) return std::nullopt;
  std::string_view digits = *file;
  if (digits.ends_with('\n')) digits.remove_suffix(1);
  if (digits.size() != 2 * id.size()) return std::nullopt;
  for (std::size_t i = 0; i < id.size(); ++i) {
    const int high = hexDigit(digits[2 * i]);
    const int low = hexDigit(digits[2 * i + 1]);
    if (high < 0 || low < 0) return std::nullopt;
    id[i] = static_cast<std::uint8_t>(high << 4 | low);
  }
  return id == MachineID{} ? std::nullopt : std::optional(id);
}

std::optional<std::string> MachineFacts::osRelease(std::string_view variable) const {
  auto file = text("etc/os-release");
  if (!file) file = text("usr/lib/os-release");
  return file ? shellVariable(*file, variable) : std::nullopt;
}

std::optional<std::string> MachineFacts::dmi(std::string_view field) const {
  constexpr std::string_view kUnfilled[] = {
      "To Be Filled By O.E.M.", "To be filled by O.E.M.", "Default string",       "Not Specified",
      "Not Applicable",         "System Product Name",    "System Serial Number", "None"};
  const auto file = text("sys/class/dmi/id/" + std::string(field));
  auto answer = file ? nonEmpty(*file) : std::nullopt;
  if (answer && std::find(std::begin(kUnfilled), std::end(kUnfilled), *answer) != std::end(kUnfilled))
    answer.reset();
  return answer;
}

std::optional<std::string> MachineFacts::deviceTree(std::string_view property) const {
  const auto file = text("sys/firmware/devicetree/base/" + std::string(property));
  return file ? nonEmpty(std::string_view(*file).substr(0, file->find('\0'))) : std::nullopt;
}

std::optional<std::string> MachineFacts::chassis() const {
  if (const auto file = text("etc/machine-info")) {
    if (auto stated = shellVariable(*file, "CHASSIS")) return stated;
  }
  if (auto stated = deviceTree("chassis-type")) return stated;
  const auto enclosure = dmi("chassis_type");
  if (!enclosure) return std::nullopt;
  int kind = 0;
  std::from_chars(enclosure->data(), enclosure->data() + enclosure->size(), kind);
  return nonEmpty(chassisOfEnclosure(kind));
}

std::optional<std::string> shellVariable(std::string_view text, std::string_view variable) {
  std::optional<std::string> value;
  while (!text.empty()) {
    const std::size_t end = std::min(text.find('\n'), text.size());
    const std::string_view line = trimmed(text.substr(0, end));
    text.remove_prefix(std::min(end + 1, text.size()));
    // As in a shell, the last assignment counts.
    if (line.starts_with(variable) && line.substr(variable.size()).starts_with('=')) {
      value = nonEmpty(unquoted(line.substr(variable.size() + 1)));
    }
  }
  return value;
}

}  // namespace tallyd::platform
