#include "platform/property-list/KeyedArchive.h"

#include <bit>
#include <cstdint>
#include <exception>
#include <initializer_list>
#include <map>
#include <stdexcept>
#include <string_view>
#include <tuple>
#include <utility>
#include <vector>

#include "platform/property-list/BinaryObjectWriter.h"
#include "platform/property-list/Limits.h"

namespace tallyd::platform {

namespace {

constexpr std::string_view kNull = "$null";
constexpr std::int64_t kArchiveVersion = 100'000;

/// Dates are counted from 2001-01-01.
constexpr double kEpochSecondsSince1970 = 978'307'200;

/// An object's place in the list of objects.
using UID = std::uint32_t;
constexpr UID kNullUID = 0;

using ClassNames = std::initializer_list<const char*>;  ///< The class, then its ancestors.
constexpr ClassNames kArrayClass = {"NSArray", "NSObject"};
constexpr ClassNames kDictionaryClass = {"NSDictionary", "NSObject"};
constexpr ClassNames kDateClass = {"NSDate", "NSObject"};
constexpr ClassNames kMutableStringClass = {"NSMutableString", "NSString", "NSObject"};

/// What makes two objects one: their kind and their content, or where their content lies.
struct Identity {
  enum class Kind { Integer, UnsignedInteger, Real, Boolean, Date, String, Data, Array, Dictionary, Class };
  Kind kind;
  std::uint64_t bits = 0;
  std::string_view bytes{};
  bool operator<(const Identity& other) const {
    return std::tie(kind, bits, bytes) < std::tie(other.kind, other.bits, other.bytes);
  }
};
using Kind = Identity::Kind;

std::uint64_t address(const void* storage) { return reinterpret_cast<std::uintptr_t>(storage); }

/// Lays a value out as a list of objects. Every operator gives the place of the object that it added, or that
/// was there already; throws std::length_error past a limit.
class Archiver {
 public:
  Archiver() { _list.putString(addPlace(), kNull); }

  std::string archive(const Value& root) {
    const UID rootPlace = add(root);
    const Entries entries{{key("$version"), integer(kArchiveVersion)},
                          {key("$archiver"), text("NSKeyedArchiver")},
                          {key("$top"), dictionary({{key("root"), reference(rootPlace)}})},
                          {key("$objects"), array(_objects)}};
    return _list.finish(dictionary(entries));
  }

  UID operator()(std::monostate) { return kNullUID; }
  UID operator()(bool value) {
    return once({Kind::Boolean, value}, [&](Ref at) { _list.putBoolean(at, value); });
  }
  UID operator()(std::int64_t value) {
    return once({Kind::Integer, static_cast<std::uint64_t>(value)},
                [&](Ref at) { _list.putInteger(at, value); });
  }
  UID operator()(std::uint64_t value) {
    return once({Kind::UnsignedInteger, value}, [&](Ref at) { _list.putInteger(at, value); });
  }
  UID operator()(double value) {
    return once({Kind::Real, std::bit_cast<std::uint64_t>(value)}, [&](Ref at) { _list.putReal(at, value); });
  }
  UID operator()(std::string_view value) {
    return once({Kind::String, 0, value}, [&](Ref at) {
      expectRoomFor(value.size());
      if (value != kNull) return _list.putString(at, value);
      putObject(at, kMutableStringClass, {{key("NS.string"), text(value)}});
    });
  }
  UID operator()(const Data& value) {
    return once({Kind::Data, 0, value.bytes()}, [&](Ref at) {
      expectRoomFor(value.size());
      _list.putData(at, value.bytes());
    });
  }
  UID operator()(Date value) {
    const double seconds = value.secondsSince1970 - kEpochSecondsSince1970;
    return once({Kind::Date, std::bit_cast<std::uint64_t>(seconds)}, [&](Ref at) {
      putObject(at, kDateClass, {{key("NS.time"), real(seconds)}});
    });
  }
  UID operator()(const Array& value) {
    return container({Kind::Array, address(value.begin())}, kArrayClass, [&] {
      Refs elements;
      for (const Value& element : value) elements.push_back(reference(add(element)));
      return Entries{{key("NS.objects"), array(elements)}};
    });
  }
  UID operator()(const Dictionary& value) {
    return container({Kind::Dictionary, address(value.begin())}, kDictionaryClass, [&] {
      Refs keys;
      Refs elements;
      for (const auto& entry : value) {
        keys.push_back(reference((*this)(std::string_view(entry.key))));
        elements.push_back(reference(add(entry.value)));
      }
      return Entries{{key("NS.keys"), array(keys)}, {key("NS.objects"), array(elements)}};
    });
  }

 private:
  using Ref = BinaryObjectWriter::Ref;
  using Refs = std::vector<Ref>;
  using Entries = std::vector<std::pair<Ref, Ref>>;

  UID add(const Value& value) { return value.visit(*this); }

  void expectRoomFor(std::size_t bytes) const {
    if (_list.byteCount() + bytes > kMaximumPropertyListBytes) throw std::length_error("too large");
  }

  Ref addPlace() {
    _objects.push_back(_list.reserve());
    _references.push_back(kNoReference);
    return _objects.back();
  }

  /// The place of the object, which is put when it is not there yet. What it refers to comes behind it.
  template <class Put>
  UID once(const Identity& identity, Put&& put) {
    const auto [known, isNew] = _places.try_emplace(identity, static_cast<UID>(_objects.size()));
    const UID place = known->second;
    if (!isNew) return place;
    put(addPlace());
    expectRoomFor(0);
    return place;
  }

  template <class MakeEntries>
  UID container(const Identity& identity, ClassNames classNames, MakeEntries&& makeEntries) {
    return once(identity, [&](Ref at) {
      if (_depth == kMaximumValueDepth) throw std::length_error("too deep");
      ++_depth;
      putObject(at, classNames, makeEntries());
      --_depth;
    });
  }

  void putObject(Ref at, ClassNames classNames, Entries entries) {
    entries.emplace_back(key("$class"), reference(classObject(classNames)));
    _list.putDictionary(at, entries);
  }

  UID classObject(ClassNames classNames) {
    return once({Kind::Class, 0, *classNames.begin()}, [&](Ref at) {
      Refs names;
      for (const char* name : classNames) names.push_back(text(name));
      _list.putDictionary(at,
                          {{key("$classname"), text(*classNames.begin())}, {key("$classes"), array(names)}});
    });
  }

  /// What refers to the object at this place.
  Ref reference(UID place) {
    if (_references[place] == kNoReference) {
      _references[place] = _list.reserve();
      _list.putUID(_references[place], place);
    }
    return _references[place];
  }

  Ref key(const char* name) {
    const auto [known, isNew] = _keys.try_emplace(name, kNoReference);
    if (isNew) known->second = text(name);
    return known->second;
  }

  // Objects of the property list that are none of the archive's.
  Ref text(std::string_view value) {
    const Ref at = _list.reserve();
    _list.putString(at, value);
    return at;
  }
  Ref integer(std::int64_t value) {
    const Ref at = _list.reserve();
    _list.putInteger(at, value);
    return at;
  }
  Ref real(double value) {
    const Ref at = _list.reserve();
    _list.putReal(at, value);
    return at;
  }
  Ref array(const Refs& elements) {
    const Ref at = _list.reserve();
    _list.putArray(at, elements);
    return at;
  }
  Ref dictionary(const Entries& entries) {
    const Ref at = _list.reserve();
    _list.putDictionary(at, entries);
    return at;
  }

  /// The number of "$null", which nothing but the list of objects refers to by number.
  static constexpr Ref kNoReference = 0;

  BinaryObjectWriter _list;
  Refs _objects;     ///< By place.
  Refs _references;  ///< By place; kNoReference until there is one.
  std::map<std::string_view, Ref> _keys;
  std::map<Identity, UID> _places;
  int _depth = 0;
};

}  // namespace

std::optional<std::string> archivedDataWithRootObject(const Value& root) {
  try {
    return Archiver().archive(root);
  } catch (const std::exception&) {  // Past a limit, or no memory.
    return std::nullopt;
  }
}

}  // namespace tallyd::platform
