// Confinement of the process, and the access to single files that clients hand in.
#pragma once

#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/FileDescriptor.h"

namespace tallyd::platform {

/// Extension tokens of files are this and the file's path.
inline constexpr std::string_view kFileTokenPrefix = "tally.file:";

/// Threading: enter before any thread starts; the rest from any thread.
class Sandbox {
 public:
  using ExtensionHandle = std::int64_t;
  static constexpr ExtensionHandle kNoExtension = -1;

  virtual ~Sandbox() = default;

  /// Confines the process, for good, by the named profile. The error's text when it could not be done; the
  /// process is then in no known state and should end.
  [[nodiscard]] virtual std::optional<std::string> sandbox_init(std::string_view profileName) = 0;

  /// Descriptors that came with an extension token, kept for who consumes it. Destroying it withdraws what
  /// was not consumed.
  class Grant {
   public:
    virtual ~Grant() = default;
  };
  /// `descriptors`: the file, then its folder.
  [[nodiscard]] virtual std::unique_ptr<Grant> offerGrant(std::string_view token,
                                                          std::vector<FileDescriptor> descriptors) = 0;

  /// Makes the token's path readable through its grant until the handle is released. `kNoExtension` for a
  /// token that no grant was offered for.
  virtual ExtensionHandle sandbox_extension_consume(std::string_view token) = 0;
  virtual void sandbox_extension_release(ExtensionHandle handle) = 0;

  /// Opens a file for reading: through a consumed grant when there is one, else as it stands. An invalid
  /// descriptor and errno when it can't be.
  [[nodiscard]] virtual FileDescriptor openForReading(std::string_view path) = 0;
};

}  // namespace tallyd::platform
