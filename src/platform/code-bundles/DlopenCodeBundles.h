// Code bundles as folders with a shared library in them.
#pragma once

#include <optional>
#include <string>

#include "platform/CodeBundle.h"
#include "platform/Log.h"

namespace tallyd::platform {

/// Loads a bundle's executable with dlopen(3). It is the file of the bundle's folder that
/// "CFBundleExecutable" of its Info.plist names; where that names no file of the folder, the folder's name
/// with its extension replaced by ".so": "Fennel.so" of "Fennel.framework".
///
/// What was once loaded stays for the life of the process, as its threads and exit handlers may. A library
/// must find everything that it needs while it is loaded, and its symbols serve no other library.
///
/// Threading: any thread; blocks on the disk, never on a pipe or device, and runs the library's constructors.
class DlopenCodeBundles final : public CodeBundles {
 public:
  /// Borrows `log`; it must outlive this object.
  explicit DlopenCodeBundles(Log& log) : _log(log) {}

  /// A bundle that can't be loaded costs one warning, which names the file and the reason.
  [[nodiscard]] std::shared_ptr<CodeBundle> load(const std::filesystem::path& path) override;

 private:
  [[nodiscard]] std::filesystem::path executableOf(const std::filesystem::path& path) const;

  Log& _log;
};

}  // namespace tallyd::platform
