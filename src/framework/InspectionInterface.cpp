#include "framework/InspectionInterface.h"

namespace tallyd {

const platform::Interface& inspectionInterface() {
  static const platform::Interface kInterface{
      .objectPath = "/com/quillon/tallyd",
      .name = "com.quillon.tallyd.InspectionInterface",
      .methods = {{"Stats", "", {}, "a{sv}", {"stats"}}, {"Tap", "h", {"output"}, "", {}}}};
  return kInterface;
}

std::filesystem::path inspectionSocketPath(const platform::Root& root) {
  return root.under("/run/tallyd/com.quillon.tallyd.inspection");
}

}  // namespace tallyd
