// A file descriptor that is closed with its owner.
#pragma once

#include <unistd.h>

#include <utility>

namespace tallyd::platform {

class FileDescriptor {
 public:
  FileDescriptor() = default;
  explicit FileDescriptor(int descriptor) : _descriptor(descriptor) {}
  FileDescriptor(FileDescriptor&& other) noexcept : _descriptor(std::exchange(other._descriptor, -1)) {}
  FileDescriptor& operator=(FileDescriptor&& other) noexcept {
    if (this != &other) {
      reset();
      _descriptor = std::exchange(other._descriptor, -1);
    }
    return *this;
  }
  FileDescriptor(const FileDescriptor&) = delete;
  FileDescriptor& operator=(const FileDescriptor&) = delete;
  ~FileDescriptor() { reset(); }

  [[nodiscard]] int get() const { return _descriptor; }
  explicit operator bool() const { return _descriptor >= 0; }
  /// Gives the descriptor away unclosed.
  [[nodiscard]] int release() { return std::exchange(_descriptor, -1); }
  void reset() {
    if (_descriptor >= 0) ::close(std::exchange(_descriptor, -1));
  }

 private:
  int _descriptor = -1;
};

}  // namespace tallyd::platform
