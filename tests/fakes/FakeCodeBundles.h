// Bundles whose symbols the test provides.
#pragma once

#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "platform/CodeBundle.h"

namespace tallyd::fakes {

/// Loads any path; a bundle that the test did not fill has no symbols.
class FakeCodeBundles : public platform::CodeBundles {
 public:
  using Symbols = std::map<std::string, const void*>;  ///< Addresses that the test owns, by name.

  std::shared_ptr<platform::CodeBundle> load(const std::filesystem::path& path) override {
    const std::lock_guard lock(_mutex);
    _loaded.push_back(path);
    auto bundle = std::make_shared<Bundle>();
    bundle->symbols = symbols[path];
    _bundles.push_back(bundle);
    return bundle;
  }

  [[nodiscard]] std::vector<std::filesystem::path> loaded() const {
    const std::lock_guard lock(_mutex);
    return _loaded;
  }
  /// How many bundles someone still holds.
  [[nodiscard]] std::size_t heldCount() const {
    const std::lock_guard lock(_mutex);
    std::size_t held = 0;
    for (const auto& bundle : _bundles) held += bundle.expired() ? 0 : 1;
    return held;
  }

  std::map<std::filesystem::path, Symbols> symbols;  ///< By the bundle's path; set before it is loaded.

 private:
  struct Bundle : platform::CodeBundle {
    [[nodiscard]] const void* symbol(const char* name) const override {
      const auto found = symbols.find(name);
      return found == symbols.end() ? nullptr : found->second;
    }
    Symbols symbols;
  };

  mutable std::mutex _mutex;
  std::vector<std::filesystem::path> _loaded;
  std::vector<std::weak_ptr<Bundle>> _bundles;
};

}  // namespace tallyd::fakes
