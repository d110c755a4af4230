// What is wrong with a bag, or worth knowing of it.
#pragma once

#include <string>
#include <vector>

namespace tallyd::storebagtool {

enum class Severity {
  Note,     ///< As it may well be meant.
  Warning,  ///< Something is ignored, or read otherwise than it looks.
  Error,    ///< A backend, an entry or the daemon does not do what the bag is there for.
};

[[nodiscard]] constexpr const char* nameOf(Severity severity) {
  switch (severity) {
    case Severity::Note:
      return "note";
    case Severity::Warning:
      return "warning";
    case Severity::Error:
      return "error";
  }
  return "";
}

struct Finding {
  Severity severity = Severity::Note;
  std::string path;    ///< In the bag, such as "release/splunk/clients[2]/filters"; empty for the whole.
  std::string text;    ///< What is there.
  std::string effect;  ///< What the daemon makes of it.
  bool operator==(const Finding&) const = default;
};
using Findings = std::vector<Finding>;

}  // namespace tallyd::storebagtool
