// Takes posted events, shows them and keeps them.
#pragma once

#include <cstdint>
#include <filesystem>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/Value.h"
#include "station/TerminalView.h"

namespace tallyd::station {

/// One post's contents.
struct Post {
  std::string postTime;
  std::string clientId;
  std::vector<platform::Dictionary> events;
};

struct PostResult {
  std::optional<Post> post;
  std::string problem;  ///< What is wrong; empty when there is a post.
};

/// Reads and checks the JSON text of a post: an object of "postTime" and "clientId", both strings, and
/// "events", an array of objects.
[[nodiscard]] PostResult parsePost(std::string_view json);

/// Every event is shown, and appended to a file as one line of JSON: {"clientId", "postTime", "encoding"
/// ("gzip", or "identity" for a plain body), "event"}, the event as it came.
///
/// Threading: any thread; posts are taken one at a time.
class EventCollector {
 public:
  struct Totals {
    std::uint64_t posts = 0;
    std::uint64_t events = 0;
    std::uint64_t refused = 0;
  };

  /// Borrows the view.
  EventCollector(std::filesystem::path file, TerminalView& view) : _file(std::move(file)), _view(view) {}

  /// Takes a post's decoded body; what is wrong with it, or nothing. Problems with the file are shown, not
  /// returned.
  [[nodiscard]] std::optional<std::string> collect(std::string_view json, const std::string& encoding);
  /// Counts a post that could not even be decoded, and shows why.
  void refuse(const std::string& problem);

  [[nodiscard]] Totals totals() const;

 private:
  void keep(const Post& post, const std::string& encoding);

  const std::filesystem::path _file;
  TerminalView& _view;
  mutable std::mutex _mutex;
  Totals _totals;
};

}  // namespace tallyd::station
