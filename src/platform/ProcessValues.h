// What a process decides once and keeps.
#pragma once

#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <variant>

namespace tallyd::platform {

/// A value that is made at its first use. Threading: any thread; concurrent first uses see one value.
template <class T>
class OnceValue {
 public:
  template <class Make>
  const T& get(Make&& make) {
    std::call_once(_once, [&] { _value.emplace(make()); });
    return *_value;
  }

 private:
  std::once_flag _once;
  std::optional<T> _value;
};

/// The once-only values of one process; a test's platform brings new ones.
struct ProcessValues {
  OnceValue<bool> internalBuild;
  OnceValue<std::string> instanceUUID;
  OnceValue<std::uint32_t> environmentType;
  OnceValue<std::optional<std::string>> storebagURLOverride;
  OnceValue<std::monostate> logDirectoryChecked;
};

}  // namespace tallyd::platform
