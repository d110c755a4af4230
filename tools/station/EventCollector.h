// Takes posted events, shows them and keeps them.
#pragma once

#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"
#include "station/Answer.h"
#include "station/Journal.h"
#include "station/TerminalView.h"

namespace tallyd::station {

/// One post's contents.
struct Post {
  std::string postTime;
  std::optional<std::string> clientId;  ///< Missing where the machine has no ID.
  std::vector<platform::Dictionary> events;
};

struct PostResult {
  std::optional<Post> post;
  std::string problem;  ///< What is wrong; empty when there is a post.
};

/// Reads and checks the JSON text of a post: an object of "postTime", a string, "clientId", a string or
/// missing, and "events", an array of objects.
[[nodiscard]] PostResult parsePost(std::string_view json);

/// Every event becomes one record: {"clientId" (null when the post has none), "postTime", "encoding" ("gzip",
/// or "identity" for a plain body), "event"}, the event as it came.
///
/// Threading: any thread.
class EventCollector {
 public:
  struct Totals {
    std::uint64_t posts = 0;
    std::uint64_t events = 0;
    std::uint64_t refused = 0;
  };

  /// Borrows the others.
  EventCollector(Journal& journal, TerminalView& view) : _journal(journal), _view(view) {}

  /// Takes a post's decoded body: 200, or 400 for what is no post, 500 when the events can't be kept; none of
  /// them is then shown or counted.
  [[nodiscard]] Answer collect(std::string_view json, const std::string& encoding);
  /// Counts a post that was not taken, and shows why; the answer to it.
  Answer refuse(int status, const std::string& problem);

  [[nodiscard]] Totals totals() const;

 private:
  Journal& _journal;
  TerminalView& _view;
  mutable std::mutex _mutex;  ///< Guards the totals.
  Totals _totals;
};

}  // namespace tallyd::station
