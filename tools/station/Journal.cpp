#include "station/Journal.h"

#include <utility>

#include "station/Files.h"

namespace tallyd::station {

void Journal::keep(std::vector<Item> items) {
  if (items.empty()) return;
  std::string lines;
  for (const Item& item : items) lines += item.record + "\n";
  const std::lock_guard lock(_mutex);
  appendToFile(_file, lines);
  for (Item& item : items) {
    _view.showRecord(item.readable, item.record);
    _feed.publish(_kind, std::move(item.record));
  }
}

void Journal::tell(std::string record) {
  const std::lock_guard lock(_mutex);
  _feed.publish(_kind, std::move(record));
}

}  // namespace tallyd::station
