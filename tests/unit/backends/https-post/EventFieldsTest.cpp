#include "backends/https-post/EventFields.h"

#include <gtest/gtest.h>

namespace tallyd {
namespace {

using platform::Dictionary;
using platform::Value;

TEST(EventFieldsTest, HoldsWhatAnEventHolds) {
  const Dictionary event{{"b", 1}, {"a", "x"}, {"c", platform::Array{1}}};
  const EventFields fields(event);
  EXPECT_EQ(fields.dictionary(), event);
  ASSERT_NE(fields.find("a"), nullptr);
  EXPECT_EQ(fields.find("a")->string(), "x");
  EXPECT_EQ(fields.find("b")->integer(), 1);
  EXPECT_EQ(fields.find("c")->description(), "(1)");
  EXPECT_EQ(fields.find("d"), nullptr);
}

TEST(EventFieldsTest, ReadsATextAsAValueWouldBe) {
  const EventField field{.key = "k", .text = "12 and more"};
  EXPECT_EQ(field.string(), "12 and more");
  EXPECT_EQ(field.description(), "12 and more");
  EXPECT_EQ(field.integer(), Value("12 and more").integerValue());
}

TEST(EventFieldsTest, MergesOverFieldsWithTheSameKeys) {
  const Dictionary event{{"a", 1}, {"c", 3}, {"e", 5}};
  const Dictionary over{{"0", 0}, {"c", "three"}, {"d", 4}, {"f", 6}};
  EventFields fields(event);
  fields.merge(over);
  Dictionary expected = event;
  expected.merge(over);
  EXPECT_EQ(fields.dictionary(), expected);
}

TEST(EventFieldsTest, ForgetsJSONThatAMergeOverwrites) {
  const Dictionary over{{"a", 2}};
  EventFields fields;
  fields.append({.key = "a", .text = "1", .json = R"("a":"1")"});
  fields.merge(over);
  EXPECT_TRUE(fields.find("a")->json.empty());
}

TEST(EventFieldsTest, RemovesAndChangesInOneWalk) {
  const Dictionary event{{"a", 1}, {"b", 2}, {"c", 3}, {"d", 4}};
  EventFields fields(event);
  fields.change([&](EventField& field) {
    if (field.key == "c") fields.setText(field, std::string(100, 'x'));
    return field.key != "a" && field.key != "d";
  });
  EXPECT_EQ(fields.dictionary(), (Dictionary{{"b", 2}, {"c", std::string(100, 'x')}}));
}

TEST(EventFieldsTest, KeepsTextsWhereTheyAreWhenMoreCome) {
  EventFields fields;
  const std::string_view first = fields.keep("short");
  for (int i = 0; i < 1000; ++i) (void)fields.keep(std::to_string(i));
  EXPECT_EQ(first, "short");
}

TEST(EventFieldsTest, IsEmptyAfterClearing) {
  const Dictionary event{{"a", 1}};
  EventFields fields(event);
  fields.clear();
  EXPECT_EQ(fields.dictionary(), Dictionary());
  EXPECT_EQ(fields.begin(), fields.end());
}

}  // namespace
}  // namespace tallyd
