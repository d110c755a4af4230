#include "station/KeyedArchiveReader.h"

#include <fmt/format.h>

#include <algorithm>
#include <cstdint>
#include <exception>
#include <stdexcept>
#include <utility>
#include <vector>

#include "platform/property-list/PropertyList.h"
#include "station/Limits.h"

namespace tallyd::station {

using platform::Array;
using platform::Date;
using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::string_view kNull = "$null";
/// Dates are counted from 2001-01-01.
constexpr double kEpochSecondsSince1970 = 978'307'200;
/// A record has some levels of its own, and data within it one more.
constexpr int kMaximumDepth = platform::kMaximumValueDepth - 8;

/// The number of the object that a value refers to; nothing when it is no reference.
std::optional<std::int64_t> referenceIn(const Value& value) {
  const Dictionary* dictionary = value.dictionary();
  if (dictionary == nullptr || dictionary->size() != 1) return std::nullopt;
  return dictionary->integer("CF$UID");
}

struct Object {
  Value value;
  int depth = 0;            ///< Levels of containers.
  std::uint64_t bytes = 0;  ///< With everything in it written out.
};

/// Turns numbered objects into values, each once.
class Unarchiver {
 public:
  explicit Unarchiver(const Array& objects) : _objects(objects), _places(objects.size()) {}

  /// What `value` refers to; throws std::runtime_error.
  const Object& resolve(const Value& value) {
    const auto reference = referenceIn(value);
    if (!reference) throw std::runtime_error("it has a value where a reference should be");
    return objectAt(*reference);
  }

 private:
  struct Place {
    enum class State { Unread, BeingRead, Read };
    State state = State::Unread;
    Object object;
  };

  const Object& objectAt(std::int64_t number) {
    if (number < 0 || static_cast<std::uint64_t>(number) >= _places.size()) {
      throw std::runtime_error(fmt::format("it has no object {}", number));
    }
    Place& place = _places[static_cast<std::size_t>(number)];
    if (place.state == Place::State::Read) return place.object;
    if (place.state == Place::State::BeingRead) {
      throw std::runtime_error(fmt::format("object {} holds itself", number));
    }
    place.state = Place::State::BeingRead;
    enter();
    place.object = read(_objects[static_cast<std::size_t>(number)]);
    leave();
    place.state = Place::State::Read;
    if (place.object.depth > kMaximumDepth) throw std::runtime_error("it is nested too deeply");
    if (place.object.bytes > kMaximumExpandedArchiveBytes) {
      throw std::runtime_error("it comes to too much with its shared objects written out");
    }
    return place.object;
  }

  Object read(const Value& stored) {
    if (const auto text = stored.string())
      return *text == kNull ? scalar({}, 0) : scalar(*text, text->size());
    if (const auto* data = stored.data()) return scalar(stored, data->size());
    const Dictionary* members = stored.dictionary();
    if (members == nullptr) return scalar(stored, 0);
    return readInstance(*members, classNameOf(*members));
  }

  Object readInstance(const Dictionary& members, const std::string& className) {
    const auto isKind = [&className](std::string_view kind) { return className.ends_with(kind); };
    if (isKind("Null")) return scalar({}, 0);
    if (isKind("String")) {
      if (const auto text = members.string("NS.string")) return scalar(*text, text->size());
    }
    if (isKind("Data")) {
      const Value* data = members.find("NS.data");
      if (data != nullptr && data->data() != nullptr) return scalar(*data, data->data()->size());
    }
    if (isKind("Date")) {
      if (const auto time = members.real("NS.time")) return scalar(Date{*time + kEpochSecondsSince1970}, 0);
    }
    const Array* objects = members.array("NS.objects");
    const Array* keys = members.array("NS.keys");
    if (objects != nullptr && keys != nullptr) return readDictionary(*keys, *objects);
    if (objects != nullptr) return readArray(*objects);
    return readUnknown(members, className);
  }

  Object readArray(const Array& references) {
    Object container = scalar({}, 0);
    std::vector<Value> elements;
    for (const Value& reference : references) elements.push_back(add(container, resolve(reference)));
    return finished(container, Array(std::move(elements)));
  }

  Object readDictionary(const Array& keys, const Array& references) {
    if (keys.size() != references.size()) throw std::runtime_error("a dictionary lacks keys or values");
    Object container = scalar({}, 0);
    std::vector<Dictionary::Entry> entries;
    for (std::size_t i = 0; i < keys.size(); ++i) {
      const Value key = add(container, resolve(keys[i]));
      entries.push_back({key.description(), add(container, resolve(references[i]))});
    }
    return finished(container, Dictionary(std::move(entries)));
  }

  Object readUnknown(const Dictionary& members, const std::string& className) {
    Object container = scalar({}, 0);
    std::vector<Dictionary::Entry> entries{{"$class", className}};
    for (const auto& [key, value] : members) {
      if (key == "$class") continue;
      container.bytes += key.size();
      entries.push_back({key, add(container, readMember(value))});
    }
    return finished(container, Dictionary(std::move(entries)));
  }

  /// Members are references or, where the class has it so, values; those may be lists of references.
  Object readMember(const Value& member) {
    if (referenceIn(member)) return resolve(member);
    Object container = scalar({}, 0);
    if (const Array* elements = member.array()) {
      enter();
      std::vector<Value> values;
      for (const Value& element : *elements) values.push_back(add(container, readMember(element)));
      leave();
      return finished(container, Array(std::move(values)));
    }
    if (const Dictionary* members = member.dictionary()) {
      enter();
      std::vector<Dictionary::Entry> entries;
      for (const auto& [key, value] : *members) entries.push_back({key, add(container, readMember(value))});
      leave();
      return finished(container, Dictionary(std::move(entries)));
    }
    const auto text = member.string();
    return scalar(member, text ? text->size() : member.data() != nullptr ? member.data()->size() : 0);
  }

  void enter() {
    if (_level == kMaximumDepth) throw std::runtime_error("it is nested too deeply");
    ++_level;
  }
  void leave() { --_level; }

  std::string classNameOf(const Dictionary& members) const {
    const Value* reference = members.find("$class");
    const auto number = reference != nullptr ? referenceIn(*reference) : std::nullopt;
    if (!number || *number < 0 || static_cast<std::uint64_t>(*number) >= _objects.size()) {
      throw std::runtime_error("an object has no class");
    }
    const Dictionary* description = _objects[static_cast<std::size_t>(*number)].dictionary();
    const auto name = description != nullptr ? description->string("$classname") : std::nullopt;
    if (!name) throw std::runtime_error("an object has no class");
    return std::string(*name);
  }

  static Object scalar(Value value, std::uint64_t bytes) {
    return {std::move(value), 0, kBytesPerValue + bytes};
  }
  /// Counts `element` as the container's; its value.
  static Value add(Object& container, const Object& element) {
    container.depth = std::max(container.depth, element.depth);
    container.bytes += element.bytes;
    return element.value;
  }
  static Object finished(Object container, Value value) {
    container.value = std::move(value);
    ++container.depth;
    return container;
  }

  const Array& _objects;
  std::vector<Place> _places;
  int _level = 0;  ///< Of the object that is being read.
};

ArchiveResult problem(std::string text) { return {std::nullopt, std::move(text)}; }

}  // namespace

ArchiveResult readKeyedArchive(std::string_view bytes) {
  const platform::PropertyListResult list = platform::propertyListWithData(bytes);
  if (!list.value) return problem(fmt::format("not a property list: {}", list.error));
  const Dictionary* archive = list.value->dictionary();
  if (archive == nullptr || archive->string("$archiver") != "NSKeyedArchiver") {
    return problem("a property list, but no keyed archive");
  }
  const Dictionary* top = archive->dictionary("$top");
  const Array* objects = archive->array("$objects");
  const Value* root = top != nullptr ? top->find("root") : nullptr;
  if (root == nullptr || objects == nullptr) return problem("a keyed archive without a root object");
  try {
    return {Unarchiver(*objects).resolve(*root).value, {}};
  } catch (const std::exception& exception) {
    return problem(fmt::format("a keyed archive that can't be read: {}", exception.what()));
  }
}

}  // namespace tallyd::station
