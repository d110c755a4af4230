// A link with the thread that serves it.
#pragma once

#include <memory>

#include "framework/ServiceLink.h"
#include "framework/TallyConnectionOptions.h"
#include "platform/SerialQueue.h"

namespace tallyd {

/// Owns one thread, on which no signal of the program is delivered. Throws as TallyConnection's constructor
/// does; the destructor closes the link.
class LinkThread {
 public:
  explicit LinkThread(const TallyConnectionOptions& options);
  ~LinkThread();
  LinkThread(const LinkThread&) = delete;
  LinkThread& operator=(const LinkThread&) = delete;

  [[nodiscard]] ServiceLink& link() { return *_link; }

 private:
  const std::chrono::milliseconds _closeTimeout;
  const std::unique_ptr<platform::Queues> _queues;
  std::shared_ptr<ServiceLink> _link;
};

}  // namespace tallyd
