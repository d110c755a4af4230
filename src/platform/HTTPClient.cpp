#include "platform/HTTPClient.h"

#include <strings.h>

namespace tallyd::platform {

std::optional<std::string> HTTPResponse::header(std::string_view name) const {
  std::optional<std::string> joined;
  for (const auto& [key, value] : headers) {
    if (key.size() != name.size() || strncasecmp(key.data(), name.data(), name.size()) != 0) continue;
    joined = joined ? *joined + ", " + value : value;
  }
  return joined;
}

}  // namespace tallyd::platform
