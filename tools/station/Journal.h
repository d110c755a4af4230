// Where everything of one kind that the station takes in is kept, shown and published.
#pragma once

#include <filesystem>
#include <mutex>
#include <string>
#include <vector>

#include "station/Feed.h"
#include "station/TerminalView.h"

namespace tallyd::station {

/// One file of JSON lines, with the terminal and the feed behind it.
///
/// Threading: any thread; records reach the file, the terminal and the feed in the same order.
class Journal {
 public:
  struct Item {
    std::string readable;  ///< For people; one line or more.
    std::string record;    ///< One JSON object in one line.
  };

  /// Borrows the view and the feed.
  Journal(std::filesystem::path file, Feed::Kind kind, TerminalView& view, Feed& feed)
      : _file(std::move(file)), _kind(kind), _view(view), _feed(feed) {}

  /// Appends all items at once, then shows and publishes them. Throws std::system_error that names the file
  /// when they can't be kept; then nothing is shown or published.
  void keep(std::vector<Item> items);

  /// Publishes a record of something that did not get here, as if by accident: watchers learn of it, and no
  /// file does.
  void tell(std::string record);

  [[nodiscard]] const std::filesystem::path& file() const { return _file; }

 private:
  const std::filesystem::path _file;
  const Feed::Kind _kind;
  TerminalView& _view;
  Feed& _feed;
  std::mutex _mutex;
};

}  // namespace tallyd::station
