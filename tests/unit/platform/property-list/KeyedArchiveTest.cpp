#include "platform/property-list/KeyedArchive.h"

#include <gtest/gtest.h>
#include <plist/plist.h>

#include <limits>
#include <memory>
#include <string>

#include "platform/property-list/PropertyList.h"

namespace tallyd::platform {
namespace {

using namespace std::string_literals;

constexpr double kSecondsFrom1970To2001 = 978'307'200;

/// The archive as its reader gets it; a reference is {"CF$UID": place}.
Dictionary archived(const Value& root) {
  const auto bytes = archivedDataWithRootObject(root);
  EXPECT_TRUE(bytes);
  const auto read = propertyListWithData(bytes.value_or(""));
  EXPECT_TRUE(read.value) << read.error;
  return read.value && read.value->dictionary() ? *read.value->dictionary() : Dictionary();
}

Array objectsOf(const Value& root) {
  const Dictionary archive = archived(root);
  const Array* objects = archive.array("$objects");
  EXPECT_TRUE(objects);
  return objects ? *objects : Array();
}

Value uid(int place) { return Dictionary{{"CF$UID", place}}; }

Value classObject(const Array& names) { return Dictionary{{"$classname", names[0]}, {"$classes", names}}; }
const Array kArrayNames{"NSArray", "NSObject"};
const Array kDictionaryNames{"NSDictionary", "NSObject"};

/// What an unarchiver makes of it.
Value unarchived(const Array& objects, const Value& reference) {
  const auto place = reference.dictionary()->integer("CF$UID").value_or(-1);
  const Value& object = objects[static_cast<std::size_t>(place)];
  const Dictionary* keyed = object.dictionary();
  if (!keyed) return place == 0 ? Value() : object;
  const auto at = [&](std::string_view key) { return *keyed->find(key); };
  const Value named = objects[static_cast<std::size_t>(*at("$class").dictionary()->integer("CF$UID"))];
  const auto name = named.dictionary()->string("$classname");
  if (name == "NSDate") return Date{at("NS.time").realValue().value_or(0) + kSecondsFrom1970To2001};
  if (name == "NSMutableString") return at("NS.string");
  std::vector<Value> elements;
  for (const Value& element : *keyed->array("NS.objects")) elements.push_back(unarchived(objects, element));
  if (name == "NSArray") return Array(std::move(elements));
  EXPECT_EQ(name, "NSDictionary");
  std::vector<Dictionary::Entry> entries;
  std::size_t next = 0;
  for (const Value& key : *keyed->array("NS.keys")) {
    entries.push_back({std::string(*unarchived(objects, key).string()), elements.at(next++)});
  }
  return Dictionary(std::move(entries));
}

Value roundTrip(const Value& root) {
  const Dictionary archive = archived(root);
  return unarchived(*archive.array("$objects"), *archive.dictionary("$top")->find("root"));
}

Value nestedArrays(int depth) {
  Value value = Array();
  for (int i = 1; i < depth; ++i) value = Array{std::move(value)};
  return value;
}

TEST(KeyedArchiveTest, LaysOutAnArchive) {
  EXPECT_EQ(
      archived(Array{"a", Dictionary{{"k", 5}}, nullptr}),
      (Dictionary{
          {"$archiver", "NSKeyedArchiver"},
          {"$version", 100'000},
          {"$top", Dictionary{{"root", uid(1)}}},
          {"$objects",
           Array{"$null", Dictionary{{"$class", uid(7)}, {"NS.objects", Array{uid(2), uid(3), uid(0)}}}, "a",
                 Dictionary{{"$class", uid(6)}, {"NS.keys", Array{uid(4)}}, {"NS.objects", Array{uid(5)}}},
                 "k", 5, classObject(kDictionaryNames), classObject(kArrayNames)}}}));
}

TEST(KeyedArchiveTest, IsABinaryPropertyListWithReferences) {
  const std::string bytes = archivedDataWithRootObject(Array{1}).value_or("");
  EXPECT_TRUE(bytes.starts_with("bplist00"));
  plist_t list = nullptr;
  plist_from_bin(bytes.data(), static_cast<std::uint32_t>(bytes.size()), &list);
  const std::unique_ptr<void, void (*)(plist_t)> owner(list, plist_free);
  ASSERT_NE(list, nullptr);
  const plist_t root = plist_access_path(list, 2, "$top", "root");
  ASSERT_EQ(plist_get_node_type(root), PLIST_UID);
  std::uint64_t place = 0;
  plist_get_uid_val(root, &place);
  EXPECT_EQ(place, 1U);
}

TEST(KeyedArchiveTest, CarriesEveryKindOfValue) {
  const Value all =
      Dictionary{{"strings", Array{"", "text", "é😀", "$null", "$class", std::string(100'000, 'x')}},
                 {"integers",
                  Array{0, 1, -1, 255, 65'536, std::numeric_limits<std::int64_t>::min(),
                        std::numeric_limits<std::int64_t>::max(), std::numeric_limits<std::uint64_t>::max()}},
                 {"reals", Array{0.0, 1.0, -2.5, 1e300}},
                 {"booleans", Array{true, false}},
                 {"dates", Array{Date{0}, Date{-1e10}, Date{kSecondsFrom1970To2001 + 0.25}}},
                 {"data", Array{Data(), Data(std::string("\0\xFF", 2))}},
                 {"null", Array{Value(), "after"}},
                 {"empty", Array{Array(), Dictionary()}},
                 {"", Dictionary{{"$null", Array{Dictionary{{"deeper", Array{1, "two"}}}}}}}};
  EXPECT_EQ(roundTrip(all), all);
  for (const auto& [key, value] : *all.dictionary()) EXPECT_EQ(roundTrip(value), value) << key;
}

TEST(KeyedArchiveTest, TakesAnyValueAtTheTop) {
  for (const Value& root : {Value(), Value(5), Value("text"), Value(Date{5}), Value(Dictionary())}) {
    EXPECT_EQ(roundTrip(root), root);
  }
  EXPECT_EQ(archived(Value()).dictionary("$top")->find("root")->dictionary()->integer("CF$UID"), 0);
}

TEST(KeyedArchiveTest, CountsDatesFromTheYear2001) {
  EXPECT_EQ(objectsOf(Date{kSecondsFrom1970To2001 + 1.5}),
            (Array{"$null", Dictionary{{"$class", uid(2)}, {"NS.time", 1.5}},
                   classObject({"NSDate", "NSObject"})}));
}

TEST(KeyedArchiveTest, TellsTheTextNullFromNull) {
  EXPECT_EQ(objectsOf("$null"), (Array{"$null", Dictionary{{"$class", uid(2)}, {"NS.string", "$null"}},
                                       classObject({"NSMutableString", "NSString", "NSObject"})}));
}

TEST(KeyedArchiveTest, HoldsEqualObjectsOnce) {
  EXPECT_EQ(objectsOf(Array{"a", "a", 1, 1, 1.0, 1.0, true, true, Data("a"), Data("a"), nullptr, nullptr}),
            (Array{"$null",
                   Dictionary{{"$class", uid(7)},
                              {"NS.objects", Array{uid(2), uid(2), uid(3), uid(3), uid(4), uid(4), uid(5),
                                                   uid(5), uid(6), uid(6), uid(0), uid(0)}}},
                   "a", 1, 1.0, true, Data("a"), classObject(kArrayNames)}));
  // One date, one class of dates; the array and its class; null.
  EXPECT_EQ(objectsOf(Array{Date{1}, Date{1}}).size(), 5U);
  // A key and a value are one.
  EXPECT_EQ(objectsOf(Dictionary{{"k", "k"}}).size(), 4U);
}

TEST(KeyedArchiveTest, HoldsSharedContainersOnce) {
  const Value shared = Array{1, 2, 3};
  EXPECT_EQ(objectsOf(Array{shared, shared, shared}).size(), 1U + 1 + 1 + 3 + 1);
  const Value dictionary = Dictionary{{"k", shared}};
  EXPECT_EQ(roundTrip(Array{dictionary, shared, dictionary}), Value(Array{dictionary, shared, dictionary}));
}

TEST(KeyedArchiveTest, TakesSharingThatDoublesAtEveryLevel) {
  Value value = Array{"bottom"};
  for (int depth = 2; depth <= kMaximumValueDepth; ++depth) value = Array{value, value};
  EXPECT_EQ(objectsOf(value).size(), static_cast<std::size_t>(1 + kMaximumValueDepth + 1 + 1));
}

TEST(KeyedArchiveTest, NestsAsDeepAsValuesMayAndNoDeeper) {
  EXPECT_EQ(roundTrip(nestedArrays(kMaximumValueDepth)), nestedArrays(kMaximumValueDepth));
  EXPECT_EQ(archivedDataWithRootObject(nestedArrays(kMaximumValueDepth + 1)), std::nullopt);
  EXPECT_EQ(archivedDataWithRootObject(Array{Dictionary{{"k", nestedArrays(kMaximumValueDepth - 1)}}}),
            std::nullopt);
  EXPECT_EQ(archivedDataWithRootObject(nestedArrays(5000)), std::nullopt);
  // Depth is not length.
  EXPECT_TRUE(archivedDataWithRootObject(Array{nestedArrays(127), nestedArrays(127), nestedArrays(127)}));
}

TEST(KeyedArchiveTest, ReplacesWhatIsNoUTF8) {
  EXPECT_EQ(roundTrip("a\xFF"
                      "b\xED\xA0\x80"),
            Value("a\xEF\xBF\xBD"
                  "b\xEF\xBF\xBD\xEF\xBF\xBD\xEF\xBF\xBD"));
}

TEST(KeyedArchiveTest, WritesTextBeyondASCIIAsUTF16) {
  for (const char* text :
       {"\u00e9", "\u20ac", "\ud7ff", "\uffff", "\U00010000", "\U0001F600", "\U0010FFFF"}) {
    EXPECT_EQ(roundTrip(text), Value(text)) << text;
  }
  EXPECT_NE(archivedDataWithRootObject("\u20ac\U0001F600").value_or("").find("\x63\x20\xAC\xD8\x3D\xDE\x00"s),
            std::string::npos);
}

TEST(KeyedArchiveTest, CountsFrom15OnApartFromTheKind) {
  for (const std::size_t size : {0U, 14U, 15U, 16U, 255U, 256U, 70'000U}) {
    const std::vector<Value> elements(size, Value("x"));
    EXPECT_EQ(roundTrip(Array(elements)), Value(Array(elements))) << size;
    const Value texts = Array{std::string(size, 'x'), Data(std::string(size, 'x'))};
    EXPECT_EQ(roundTrip(texts), texts) << size;
  }
}

TEST(KeyedArchiveTest, TakesManyObjects) {
  std::vector<Value> lines;
  for (int i = 0; i < 100'000; ++i) lines.push_back(Dictionary{{"line", std::to_string(i)}, {"n", i}});
  const Value many = Array(std::move(lines));
  EXPECT_EQ(roundTrip(many), many);
}

}  // namespace
}  // namespace tallyd::platform
