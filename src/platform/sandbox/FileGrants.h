// Files that clients opened for the daemon.
#pragma once

#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <thread>
#include <vector>

#include "platform/FileDescriptor.h"
#include "platform/Sandbox.h"

namespace tallyd::platform {

/// The grants on offer and those in use. Several clients may offer files under one path, which need not be
/// the same file; a thread that offers, consumes and opens gets its own.
///
/// Holds as many descriptors as clients' calls in flight brought. Threading: any thread.
class FileGrants {
 public:
  using Handle = Sandbox::ExtensionHandle;

  /// The grant borrows this object, which must outlive it.
  [[nodiscard]] std::unique_ptr<Sandbox::Grant> offer(std::string_view token,
                                                      std::vector<FileDescriptor> descriptors);

  /// May be done several times with one offer.
  Handle consume(std::string_view token);
  void release(Handle handle);

  /// Reads a regular file from its start. EACCES when the grant's descriptor can't be read or is no regular
  /// file, ENOENT when no grant in use has this path.
  ///
  /// Where the sandbox lets it, the file is opened anew; else the descriptor is a duplicate of the client's,
  /// with which it shares its position.
  [[nodiscard]] FileDescriptor open(std::string_view path);

 private:
  using Descriptors = std::vector<FileDescriptor>;
  struct Entry {
    std::string token;
    std::thread::id thread;
    std::shared_ptr<const Descriptors> descriptors;
  };
  using Entries = std::map<Handle, Entry>;
  class Offer;

  [[nodiscard]] static Entries::const_iterator find(const Entries& entries, std::string_view token);
  void withdraw(Handle offer);

  std::mutex _mutex;
  Handle _nextHandle = 1;  ///< Guarded by `_mutex`, as are the entries.
  Entries _offered;
  Entries _consumed;
};

}  // namespace tallyd::platform
