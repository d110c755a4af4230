// The web page's files, which the build puts into the program.
#pragma once

#include <span>
#include <string_view>

namespace tallyd::station {

struct PageFile {
  std::string_view name;  ///< As in tools/station/page.
  std::string_view bytes;
  std::string_view tag;  ///< Differs when the bytes differ.
};

[[nodiscard]] std::span<const PageFile> pageFiles();

}  // namespace tallyd::station
