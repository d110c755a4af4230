// Bundles of code that are loaded while the process runs.
#pragma once

#include <filesystem>
#include <memory>

namespace tallyd::platform {

/// A bundle whose executable has been loaded, or could not be; stays loaded at least as long as this object.
/// Threading: any thread.
class CodeBundle {
 public:
  virtual ~CodeBundle() = default;
  /// The address of an exported symbol; null when the bundle could not be loaded or has none of this name.
  [[nodiscard]] virtual const void* symbol(const char* name) const = 0;
};

/// Threading: any thread.
class CodeBundles {
 public:
  virtual ~CodeBundles() = default;
  /// Opens and loads the bundle at `path`. Never null: what could not be loaded has no symbols, and one line
  /// says why.
  [[nodiscard]] virtual std::shared_ptr<CodeBundle> load(const std::filesystem::path& path) = 0;
};

}  // namespace tallyd::platform
