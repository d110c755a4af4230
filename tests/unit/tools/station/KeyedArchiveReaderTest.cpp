#include "station/KeyedArchiveReader.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include "platform/property-list/KeyedArchive.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::station {

using platform::Array;
using platform::Data;
using platform::Date;
using platform::Dictionary;
using platform::PropertyListFormat;
using platform::Value;
using testing::HasSubstr;

namespace {

Value reference(int number) { return Dictionary{{"CF$UID", number}}; }

/// The bytes of an archive with these objects, whose root is the second.
std::string archive(const Array& objects) {
  const Dictionary list{{"$archiver", "NSKeyedArchiver"},
                        {"$version", 100'000},
                        {"$top", Dictionary{{"root", reference(1)}}},
                        {"$objects", objects}};
  return platform::dataWithPropertyList(list, PropertyListFormat::XML).value();
}

Value instanceClass(const char* name) {
  return Dictionary{{"$classname", name}, {"$classes", Array{name, "NSObject"}}};
}

Value unarchived(const std::string& bytes) {
  const ArchiveResult result = readKeyedArchive(bytes);
  EXPECT_TRUE(result.root) << result.problem;
  return result.root.value_or(Value());
}

}  // namespace

TEST(KeyedArchiveReaderTest, ReadsWhatTheDaemonWrites) {
  const Array shared{"twice", 2};
  const Array logData{"line",
                      Dictionary{{"integer", -5},
                                 {"large", std::uint64_t{18'446'744'073'709'551'615ULL}},
                                 {"real", 0.25},
                                 {"flag", true},
                                 {"none", nullptr},
                                 {"bytes", Data(std::string("\0\x1\xFF", 3))},
                                 {"date", Date{1'772'366'401.25}},
                                 {"text", "$null"},
                                 {"umlaut", "ü"},
                                 {"empty", Dictionary()}},
                      shared, shared, Array()};
  EXPECT_EQ(unarchived(platform::archivedDataWithRootObject(logData).value()), Value(logData));
  EXPECT_EQ(unarchived(platform::archivedDataWithRootObject(Array()).value()), Value(Array()));
  EXPECT_EQ(unarchived(platform::archivedDataWithRootObject("just text").value()), Value("just text"));
}

TEST(KeyedArchiveReaderTest, ReadsSetsMutableObjectsAndNulls) {
  EXPECT_EQ(unarchived(archive(
                {"$null",
                 Dictionary{{"$class", reference(2)},
                            {"NS.objects", Array{reference(3), reference(5), reference(6), reference(0)}}},
                 instanceClass("NSMutableSet"), Dictionary{{"$class", reference(4)}, {"NS.string", "text"}},
                 instanceClass("NSMutableString"), Dictionary{{"$class", reference(7)}},
                 Dictionary{{"$class", reference(8)}, {"NS.data", Data("bytes")}}, instanceClass("NSNull"),
                 instanceClass("NSMutableData")})),
            Value(Array{"text", nullptr, Data("bytes"), nullptr}));
}

TEST(KeyedArchiveReaderTest, ShowsObjectsOfOtherClassesByTheirMembers) {
  EXPECT_EQ(unarchived(archive({"$null",
                                Dictionary{{"$class", reference(2)},
                                           {"name", reference(3)},
                                           {"count", 5},
                                           {"places", Array{reference(3), 1}},
                                           {"inline", Dictionary{{"k", reference(3)}}}},
                                instanceClass("Measurement"), "text"})),
            Value(Dictionary{{"$class", "Measurement"},
                             {"name", "text"},
                             {"count", 5},
                             {"places", Array{"text", 1}},
                             {"inline", Dictionary{{"k", "text"}}}}));
}

TEST(KeyedArchiveReaderTest, SaysWhatIsNoArchive) {
  EXPECT_THAT(readKeyedArchive("").problem, HasSubstr("not a property list"));
  EXPECT_THAT(readKeyedArchive("bplist00junk").problem, HasSubstr("not a property list"));
  EXPECT_THAT(readKeyedArchive("{ a = b; }").problem, HasSubstr("no keyed archive"));
  EXPECT_THAT(readKeyedArchive("( a )").problem, HasSubstr("no keyed archive"));
  EXPECT_THAT(readKeyedArchive("{ \"$archiver\" = NSKeyedArchiver; }").problem,
              HasSubstr("without a root object"));
  EXPECT_THAT(readKeyedArchive(archive({})).problem, HasSubstr("no object 1"));
  EXPECT_THAT(readKeyedArchive(archive({"$null", Dictionary{{"NS.objects", Array()}}})).problem,
              HasSubstr("no class"));
}

TEST(KeyedArchiveReaderTest, RefusesDictionariesWithoutAValueForEachKey) {
  EXPECT_THAT(readKeyedArchive(archive({"$null",
                                        Dictionary{{"$class", reference(2)},
                                                   {"NS.keys", Array{reference(0)}},
                                                   {"NS.objects", Array()}},
                                        instanceClass("NSDictionary")}))
                  .problem,
              HasSubstr("lacks keys or values"));
}

TEST(KeyedArchiveReaderTest, RefusesObjectsThatHoldThemselves) {
  EXPECT_THAT(readKeyedArchive(
                  archive({"$null", Dictionary{{"$class", reference(2)}, {"NS.objects", Array{reference(3)}}},
                           instanceClass("NSArray"),
                           Dictionary{{"$class", reference(2)}, {"NS.objects", Array{reference(1)}}}}))
                  .problem,
              HasSubstr("holds itself"));
}

TEST(KeyedArchiveReaderTest, RefusesSharingThatComesToTooMuch) {
  Array objects{"$null"};
  for (int level = 0; level < 40; ++level) {
    objects.append(Dictionary{{"$class", reference(42)},
                              {"NS.objects", Array{reference(level + 2), reference(level + 2)}}});
  }
  objects.append("leaf");
  objects.append(instanceClass("NSArray"));
  EXPECT_THAT(readKeyedArchive(archive(objects)).problem, HasSubstr("comes to too much"));
}

TEST(KeyedArchiveReaderTest, RefusesDeepNesting) {
  constexpr int kLevels = 5000;
  Array objects{"$null"};
  for (int level = 0; level < kLevels; ++level) {
    objects.append(
        Dictionary{{"$class", reference(kLevels + 1)}, {"NS.objects", Array{reference(level + 2)}}});
  }
  objects.append(instanceClass("NSArray"));
  EXPECT_THAT(readKeyedArchive(archive(objects)).problem, HasSubstr("nested too deeply"));
}

}  // namespace tallyd::station
