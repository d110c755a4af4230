// Bundles made of the sample adaptor libraries.
#pragma once

#include <filesystem>
#include <fstream>
#include <string>

namespace tallyd::test {

inline constexpr const char* kPerformanceBundle =
    "/System/Library/PrivateFrameworks/PlayhallServices.framework/Frameworks/PHSPerformance.framework";
inline constexpr const char* kFennelBundle = "/System/Library/PrivateFrameworks/Fennel.framework";

/// Where the library of the sample `name` was built.
inline std::filesystem::path sampleLibrary(const std::string& name) {
  return std::filesystem::path(TALLYD_ADAPTOR_DIR) / (name + ".so");
}

/// Makes the bundle a folder whose only file is a copy of the sample's library, as `executable`.
inline void installBundle(const std::filesystem::path& bundle, const std::string& sample,
                          const std::string& executable) {
  std::filesystem::create_directories(bundle);
  std::filesystem::copy_file(sampleLibrary(sample), bundle / executable);
}

/// An information dictionary that names the executable.
inline void writeBundleInfo(const std::filesystem::path& bundle, const std::string& executable) {
  std::ofstream(bundle / "Info.plist") << "<plist version=\"1.0\"><dict><key>CFBundleExecutable</key><string>"
                                       << executable << "</string></dict></plist>";
}

}  // namespace tallyd::test
