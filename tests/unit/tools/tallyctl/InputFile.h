// A file whose content a test reads through a descriptor.
#pragma once

#include <fcntl.h>

#include <filesystem>
#include <fstream>
#include <stdexcept>
#include <string_view>

#include "fakes/TemporaryFolder.h"
#include "platform/FileDescriptor.h"

namespace tallyd::tallyctl {

inline void writeFile(const std::filesystem::path& path, std::string_view content) {
  std::filesystem::create_directories(path.parent_path());
  std::ofstream file(path, std::ios::binary | std::ios::trunc);
  file << content << std::flush;
  if (!file) throw std::runtime_error("cannot write " + path.string());
}

class InputFile {
 public:
  explicit InputFile(std::string_view content) {
    writeFile(path(), content);
    _descriptor = platform::FileDescriptor(::open(path().c_str(), O_RDONLY | O_CLOEXEC));
  }

  [[nodiscard]] std::filesystem::path path() const { return _folder.path() / "input"; }
  [[nodiscard]] int descriptor() const { return _descriptor.get(); }

 private:
  fakes::TemporaryFolder _folder;
  platform::FileDescriptor _descriptor;
};

}  // namespace tallyd::tallyctl
