// Settings that the test fills in.
#pragma once

#include <map>
#include <mutex>
#include <string>

#include "platform/Settings.h"

namespace tallyd::fakes {

class FakePreferences : public platform::Preferences {
 public:
  [[nodiscard]] std::optional<platform::Value> value(std::string_view suite,
                                                     std::string_view key) const override {
    const auto found = values.find(std::string(suite) + "/" + std::string(key));
    return found == values.end() ? std::nullopt : std::optional(found->second);
  }
  void set(std::string_view suite, std::string_view key, platform::Value value) {
    values.insert_or_assign(std::string(suite) + "/" + std::string(key), std::move(value));
  }

  std::map<std::string, platform::Value> values;  ///< By "SUITE/KEY".
};

class FakeUserDefaults : public platform::UserDefaults {
 public:
  [[nodiscard]] std::optional<platform::Value> value(std::string_view key) const override {
    const std::lock_guard lock(_mutex);
    const auto found = _values.find(key);
    return found == _values.end() ? std::nullopt : std::optional(found->second);
  }
  void setValue(std::string_view key, std::optional<platform::Value> value) override {
    const std::lock_guard lock(_mutex);
    if (value) {
      _values.insert_or_assign(std::string(key), std::move(*value));
    } else if (const auto found = _values.find(key); found != _values.end()) {
      _values.erase(found);
    }
  }

 private:
  mutable std::mutex _mutex;
  std::map<std::string, platform::Value, std::less<>> _values;
};

class FakeDeviceProperties : public platform::DeviceProperties {
 public:
  [[nodiscard]] std::optional<std::string> GNCopyAnswer(std::string_view question) const override {
    ++questionsAsked;
    const auto found = answers.find(question);
    return found == answers.end() ? std::nullopt : std::optional(found->second);
  }
  [[nodiscard]] std::optional<platform::UUIDBytes> machineIdentifier(
      std::string_view purpose) const override {
    if (!hasMachineID) return std::nullopt;
    platform::UUIDBytes bytes{};
    for (std::size_t i = 0; i < purpose.size(); ++i) {
      bytes[i % bytes.size()] = static_cast<std::uint8_t>(bytes[i % bytes.size()] * 31 + purpose[i]);
    }
    return bytes;
  }

  std::map<std::string, std::string, std::less<>> answers;
  bool hasMachineID = true;
  mutable std::size_t questionsAsked = 0;
};

class FakeBundle : public platform::Bundle {
 public:
  [[nodiscard]] std::optional<platform::Value> infoValue(std::string_view key) const override {
    const platform::Value* value = info.find(key);
    return value ? std::optional(*value) : std::nullopt;
  }
  [[nodiscard]] std::optional<platform::Data> resource(std::string_view name,
                                                       std::string_view type) const override {
    const auto found = resources.find(std::string(name) + "." + std::string(type));
    return found == resources.end() ? std::nullopt : std::optional(platform::Data(found->second));
  }

  platform::Dictionary info;
  std::map<std::string, std::string> resources;  ///< By "NAME.TYPE".
};

}  // namespace tallyd::fakes
