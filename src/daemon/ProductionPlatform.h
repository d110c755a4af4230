// The platform's production services, wired together.
#pragma once

#include <memory>

#include "platform/Platform.h"

namespace tallyd {

/// Owns every service but those that exist before the sandbox is entered. Its threads start when it is used,
/// so it is made after that.
class ProductionPlatform {
 public:
  /// Borrows all four; they must outlive this object.
  /// @param retryPosts  how many more attempts a post gets that failed for a while.
  ProductionPlatform(const platform::Root& root, platform::Log& log, const platform::Clock& clock,
                     platform::Sandbox& sandbox, unsigned retryPosts = 0);
  ~ProductionPlatform();

  [[nodiscard]] const platform::Platform& platform() const;

 private:
  struct Services;
  std::unique_ptr<Services> _services;
};

}  // namespace tallyd
