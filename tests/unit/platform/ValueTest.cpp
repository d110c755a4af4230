#include "platform/Value.h"

#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <thread>

namespace tallyd::platform {
namespace {

constexpr auto kMaximum = std::numeric_limits<std::int64_t>::max();
constexpr auto kMinimum = std::numeric_limits<std::int64_t>::min();

TEST(ValueTest, KnowsItsKind) {
  EXPECT_TRUE(Value().isNull());
  EXPECT_TRUE(Value(nullptr).isNull());
  EXPECT_TRUE(Value("a").isString());
  EXPECT_TRUE(Value(true).isBoolean());
  EXPECT_TRUE(Value(1).isInteger());
  EXPECT_TRUE(Value(std::numeric_limits<std::uint64_t>::max()).isInteger());
  EXPECT_TRUE(Value(1.0).isReal());
  EXPECT_TRUE(Value(true).isNumber());
  EXPECT_FALSE(Value("1").isNumber());
  EXPECT_TRUE(Value(Date{5}).date());
  EXPECT_TRUE(Value(Data("a")).data());
  EXPECT_TRUE(Value(Array()).array());
  EXPECT_TRUE(Value(Dictionary()).dictionary());
  EXPECT_FALSE(Value(1).string());
  EXPECT_FALSE(Value(1).array());
}

TEST(ValueTest, AnUnsignedIntegerThatFitsIsSigned) {
  EXPECT_EQ(Value(std::uint64_t{5}), Value(5));
  EXPECT_EQ(Value(static_cast<std::uint64_t>(kMaximum)), Value(kMaximum));
  EXPECT_NE(Value(static_cast<std::uint64_t>(kMaximum) + 1), Value(kMinimum));
}

TEST(ValueTest, ComparesByKindAndContents) {
  EXPECT_EQ(Value("a"), Value(std::string("a")));
  EXPECT_NE(Value("a"), Value("b"));
  EXPECT_NE(Value("1"), Value(1));
  EXPECT_NE(Value(1), Value("1"));
  EXPECT_NE(Value(1), Value(1.0));
  EXPECT_NE(Value(1), Value(true));
  EXPECT_NE(Value(""), Value());
  EXPECT_NE(Value(Array()), Value(Dictionary()));
  EXPECT_EQ(Value(), Value());
  EXPECT_EQ(Value(Data()), Value(Data("")));
  EXPECT_EQ(Value(Array{1, Array{"x"}}), Value(Array{1, Array{"x"}}));
  EXPECT_NE(Value(Array{1}), Value(Array{1, 2}));
  EXPECT_EQ(Value(Dictionary{{"a", 1}, {"b", 2}}), Value(Dictionary{{"b", 2}, {"a", 1}}));
  EXPECT_NE(Value(Dictionary{{"a", 1}}), Value(Dictionary{{"a", 2}}));
}

TEST(ValueTest, IntegerValueReadsEveryNumber) {
  EXPECT_EQ(Value(-3).integerValue(), -3);
  EXPECT_EQ(Value(true).integerValue(), 1);
  EXPECT_EQ(Value(false).integerValue(), 0);
  EXPECT_EQ(Value(2.9).integerValue(), 2);
  EXPECT_EQ(Value(-2.9).integerValue(), -2);
  EXPECT_EQ(Value(1e30).integerValue(), kMaximum);
  EXPECT_EQ(Value(-1e30).integerValue(), kMinimum);
  EXPECT_EQ(Value(9223372036854775808.0).integerValue(), kMaximum);
  EXPECT_EQ(Value(-9223372036854775808.0).integerValue(), kMinimum);
  EXPECT_EQ(Value(std::nan("")).integerValue(), 0);
  EXPECT_EQ(Value(std::numeric_limits<double>::infinity()).integerValue(), kMaximum);
  EXPECT_EQ(Value(std::numeric_limits<std::uint64_t>::max()).integerValue(), -1);
  EXPECT_EQ(Value("42 apples").integerValue(), 42);
}

TEST(ValueTest, KindsThatAreNoNumberHaveNoNumberAndNoTruth) {
  for (const Value& value :
       {Value(), Value(Date{1}), Value(Data("1")), Value(Array{1}), Value(Dictionary{{"a", 1}})}) {
    EXPECT_FALSE(value.integerValue());
    EXPECT_FALSE(value.realValue());
    EXPECT_FALSE(value.booleanValue());
  }
}

TEST(ValueTest, LeadingIntegerPassesOverBlanksAndClamps) {
  EXPECT_EQ(leadingInteger(""), 0);
  EXPECT_EQ(leadingInteger("  \t12x"), 12);
  EXPECT_EQ(leadingInteger("+7"), 7);
  EXPECT_EQ(leadingInteger("-7"), -7);
  EXPECT_EQ(leadingInteger("+-7"), 0);
  EXPECT_EQ(leadingInteger("--7"), 0);
  EXPECT_EQ(leadingInteger("+"), 0);
  EXPECT_EQ(leadingInteger("x1"), 0);
  EXPECT_EQ(leadingInteger("3.9"), 3);
  EXPECT_EQ(leadingInteger("99999999999999999999"), kMaximum);
  EXPECT_EQ(leadingInteger("-99999999999999999999"), kMinimum);
  EXPECT_EQ(leadingInteger(" +99999999999999999999"), kMaximum);
}

TEST(ValueTest, RealValueReadsEveryNumber) {
  EXPECT_EQ(Value(2.5).realValue(), 2.5);
  EXPECT_EQ(Value(-3).realValue(), -3.0);
  EXPECT_EQ(Value(true).realValue(), 1.0);
  EXPECT_EQ(Value(std::numeric_limits<std::uint64_t>::max()).realValue(), 18446744073709551615.0);
  EXPECT_EQ(Value(" 1.5e2kg").realValue(), 150.0);
  EXPECT_EQ(Value("+0.25").realValue(), 0.25);
  EXPECT_EQ(Value("-.5").realValue(), -0.5);
  EXPECT_EQ(Value("inf").realValue(), 0.0);
  EXPECT_EQ(Value("nan1").realValue(), 0.0);
  EXPECT_EQ(Value("text").realValue(), 0.0);
  EXPECT_EQ(Value("").realValue(), 0.0);
}

TEST(ValueTest, BooleanValueReadsWordsAndNumbers) {
  for (const char* text : {"YES", "yes", "Y", "true", "T", "1", " 5", "-1", "+2", "01"}) {
    EXPECT_TRUE(Value(text).booleanValue()) << text;
  }
  for (const char* text : {"NO", "no", "false", "F", "0", "", " ", "00", "x", "on"}) {
    EXPECT_FALSE(Value(text).booleanValue()) << text;
  }
  EXPECT_TRUE(Value(0.5).booleanValue());
  EXPECT_FALSE(Value(0.0).booleanValue());
  EXPECT_TRUE(Value(-1).booleanValue());
  EXPECT_FALSE(Value(0).booleanValue());
  EXPECT_TRUE(Value(true).booleanValue());
}

TEST(ValueTest, DescribesEveryKind) {
  EXPECT_EQ(Value().description(), "(null)");
  EXPECT_EQ(Value(true).description(), "1");
  EXPECT_EQ(Value(false).description(), "0");
  EXPECT_EQ(Value(-12).description(), "-12");
  EXPECT_EQ(Value(std::numeric_limits<std::uint64_t>::max()).description(), "18446744073709551615");
  EXPECT_EQ(Value(0.1).description(), "0.1");
  EXPECT_EQ(Value("a b").description(), "a b");
  EXPECT_EQ(Value(Data("\x01\xAB")).description(), "<01ab>");
  EXPECT_EQ(Value(Date{0}).description(), "1970-01-01 00:00:00 +0000");
  EXPECT_EQ(Value(Date{1582934399.9}).description(), "2020-02-28 23:59:59 +0000");
  EXPECT_EQ(Value(Date{-0.5}).description(), "1969-12-31 23:59:59 +0000");
  EXPECT_EQ(Value(Date{std::nan("")}).description(), "nan");
  EXPECT_EQ(Value(Array()).description(), "()");
  EXPECT_EQ(Value(Array{1, "b"}).description(), "(1, b)");
  EXPECT_EQ(Value(Dictionary()).description(), "{}");
  EXPECT_EQ(Value(Dictionary{{"b", Array{1}}, {"a", true}}).description(), "{a = 1; b = (1); }");
}

TEST(ArrayTest, AChangedCopyLeavesTheOriginalAsItWas) {
  Array original{1, 2};
  Array copy = original;
  copy.append(3);
  copy.replace(0, "one");
  EXPECT_EQ(original, (Array{1, 2}));
  EXPECT_EQ(copy, (Array{"one", 2, 3}));
}

TEST(ArrayTest, AnEmptyOneHasNothingToEnumerate) {
  const Array empty;
  EXPECT_EQ(empty.size(), 0U);
  EXPECT_TRUE(empty.begin() == empty.end());
  EXPECT_EQ(empty, Array(std::vector<Value>()));
}

TEST(DictionaryTest, KeepsItsEntriesInTheByteOrderOfTheirKeys) {
  Dictionary dictionary{{"b", 1}, {"é", 2}, {"", 3}, {"a", 4}};
  dictionary.set("aa", 5);
  std::string order;
  for (const auto& [key, value] : dictionary) order += key + ",";
  EXPECT_EQ(order, ",a,aa,b,é,");
}

TEST(DictionaryTest, OfEqualKeysTheLastStays) {
  const Dictionary dictionary{{"a", 1}, {"b", 2}, {"a", 3}, {"b", 4}, {"a", 5}};
  EXPECT_EQ(dictionary, (Dictionary{{"a", 5}, {"b", 4}}));
  EXPECT_EQ(dictionary.size(), 2U);
}

TEST(DictionaryTest, FindsSetsAndRemoves) {
  Dictionary dictionary;
  EXPECT_EQ(dictionary.find("a"), nullptr);
  dictionary.remove("a");
  dictionary.set("a", 1);
  dictionary.set("a", 2);
  ASSERT_NE(dictionary.find("a"), nullptr);
  EXPECT_EQ(*dictionary.find("a"), Value(2));
  EXPECT_FALSE(dictionary.contains("A"));
  dictionary.remove("b");
  EXPECT_EQ(dictionary.size(), 1U);
  dictionary.remove("a");
  EXPECT_TRUE(dictionary.empty());
}

TEST(DictionaryTest, AChangedCopyLeavesTheOriginalAsItWas) {
  const Dictionary original{{"a", 1}};
  Dictionary changed = original;
  changed.set("a", 2);
  Dictionary shrunk = original;
  shrunk.remove("a");
  EXPECT_EQ(original, (Dictionary{{"a", 1}}));
  EXPECT_EQ(changed, (Dictionary{{"a", 2}}));
  EXPECT_TRUE(shrunk.empty());
}

TEST(DictionaryTest, MergesWithTheOtherOnesEntriesOnTop) {
  Dictionary dictionary{{"a", 1}, {"c", 3}, {"e", 5}};
  dictionary.merge(Dictionary{{"b", 20}, {"c", 30}, {"f", 60}});
  EXPECT_EQ(dictionary, (Dictionary{{"a", 1}, {"b", 20}, {"c", 30}, {"e", 5}, {"f", 60}}));
  dictionary.merge(Dictionary());
  EXPECT_EQ(dictionary.size(), 5U);
  Dictionary empty;
  empty.merge(dictionary);
  EXPECT_EQ(empty, dictionary);
  dictionary.merge(Dictionary(dictionary));
  EXPECT_EQ(empty, dictionary);
}

TEST(DictionaryTest, TypedLookUpsTakeTheirKindOnly) {
  const Dictionary dictionary{
      {"s", "7"}, {"i", 5}, {"b", true}, {"a", Array{1}}, {"d", Dictionary{{"k", 1}}}};
  EXPECT_EQ(dictionary.string("s"), "7");
  EXPECT_FALSE(dictionary.string("i"));
  EXPECT_FALSE(dictionary.string("missing"));
  EXPECT_EQ(dictionary.integer("i"), 5);
  EXPECT_EQ(dictionary.integer("s"), 7);
  EXPECT_FALSE(dictionary.integer("a"));
  EXPECT_EQ(dictionary.real("i"), 5.0);
  EXPECT_TRUE(dictionary.boolean("b"));
  EXPECT_FALSE(dictionary.boolean("missing"));
  ASSERT_TRUE(dictionary.array("a"));
  EXPECT_FALSE(dictionary.array("d"));
  ASSERT_TRUE(dictionary.dictionary("d"));
  EXPECT_FALSE(dictionary.dictionary("a"));
}

TEST(ValueTest, CopiesMayBeChangedOnOtherThreads) {
  const Value shared = Dictionary{{"list", Array{1, 2, 3}}, {"text", "unchanged"}};
  std::vector<std::thread> threads;
  for (int number = 0; number < 4; ++number) {
    threads.emplace_back([copy = shared, number] {
      for (int i = 0; i < 1000; ++i) {
        Dictionary mine = *copy.dictionary();
        Array list = *mine.array("list");
        list.append(number);
        mine.set("list", std::move(list));
        ASSERT_EQ(mine.array("list")->size(), 4U);
      }
    });
  }
  for (auto& thread : threads) thread.join();
  EXPECT_EQ(shared, Value(Dictionary{{"list", Array{1, 2, 3}}, {"text", "unchanged"}}));
}

}  // namespace
}  // namespace tallyd::platform
