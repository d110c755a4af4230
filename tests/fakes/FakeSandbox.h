// A sandbox that lets everything through and counts what is handed in.
#pragma once

#include <fcntl.h>

#include <map>

#include "platform/Sandbox.h"

namespace tallyd::fakes {

class FakeSandbox : public platform::Sandbox {
 public:
  std::optional<std::string> sandbox_init(std::string_view profileName) override {
    profile = profileName;
    return initError;
  }
  std::unique_ptr<Grant> offerGrant(std::string_view token, std::vector<platform::FileDescriptor>) override {
    offered.emplace_back(token);
    return std::make_unique<Grant>();
  }
  ExtensionHandle sandbox_extension_consume(std::string_view token) override {
    consumed.emplace_back(token);
    return ++_handles;
  }
  void sandbox_extension_release(ExtensionHandle handle) override { released.push_back(handle); }
  platform::FileDescriptor openForReading(std::string_view path) override {
    return platform::FileDescriptor(::open(std::string(path).c_str(), O_RDONLY | O_CLOEXEC));
  }

  std::string profile;
  std::optional<std::string> initError;
  std::vector<std::string> offered;
  std::vector<std::string> consumed;
  std::vector<ExtensionHandle> released;

 private:
  ExtensionHandle _handles = 0;
};

}  // namespace tallyd::fakes
