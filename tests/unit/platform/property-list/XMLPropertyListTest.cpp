#include "platform/property-list/XMLPropertyList.h"

#include <gtest/gtest.h>

#include <limits>
#include <string>

#include "platform/property-list/PropertyList.h"

namespace tallyd::platform {
namespace {

Value read(std::string_view text) {
  const PropertyListResult result = propertyListWithData(text);
  EXPECT_TRUE(result.value) << text << ": " << result.error;
  if (!result.value) return {};
  return *result.value;
}

Value readElement(std::string_view element) {
  return read("<plist version=\"1.0\">" + std::string(element) + "</plist>");
}

std::string error(std::string_view text) {
  const PropertyListResult result = propertyListWithData(text);
  EXPECT_FALSE(result.value) << text;
  return result.error;
}

TEST(XMLPropertyListTest, ReadsEveryKind) {
  EXPECT_EQ(read(R"(<?xml version="1.0" encoding="UTF-8"?>
<!DOCTYPE plist PUBLIC "-//Example//DTD PLIST 1.0//EN" "http://example.invalid/PropertyList-1.0.dtd">
<plist version="1.0">
<dict>
  <key>string</key><string>a &amp; b &lt;c&gt; &#233;&#x1F600;</string>
  <key>integer</key><integer>-42</integer>
  <key>real</key><real>-1.5e3</real>
  <key>yes</key><true/>
  <key>no</key><false/>
  <key>date</key><date>2020-01-02T03:04:05Z</date>
  <key>data</key><data>
    AAEC
    /w==
  </data>
  <key>array</key><array><integer>1</integer><string>two</string></array>
  <key>empty</key><array><string></string><string/><array/><dict/><data></data><array></array></array>
</dict>
</plist>
)"),
            Value(Dictionary{{"string", "a & b <c> é😀"},
                             {"integer", -42},
                             {"real", -1500.0},
                             {"yes", true},
                             {"no", false},
                             {"date", Date{1577934245}},
                             {"data", Data(std::string("\0\1\2\xFF", 4))},
                             {"array", Array{1, "two"}},
                             {"empty", Array{"", "", Array(), Dictionary(), Data(), Array()}}}));
}

TEST(XMLPropertyListTest, AnyValueMayBeAtTheTop) {
  EXPECT_EQ(readElement("<string>x</string>"), Value("x"));
  EXPECT_EQ(readElement("<true/>"), Value(true));
  EXPECT_EQ(readElement("<array/>"), Value(Array()));
  EXPECT_EQ(readElement("<dict><key/><true/></dict>"), Value(Dictionary{{"", true}}));
  EXPECT_EQ(read("<dict><key>k</key><false/></dict>"), Value(Dictionary{{"k", false}}));
  EXPECT_EQ(read("\xEF\xBB\xBF\n <plist><integer>7</integer></plist>"), Value(7));
}

TEST(XMLPropertyListTest, ReadsIntegersOf64Bits) {
  EXPECT_EQ(readElement("<integer>9223372036854775807</integer>"),
            Value(std::numeric_limits<std::int64_t>::max()));
  EXPECT_EQ(readElement("<integer>-9223372036854775808</integer>"),
            Value(std::numeric_limits<std::int64_t>::min()));
  EXPECT_EQ(readElement("<integer>-1</integer>"), Value(-1));
  EXPECT_EQ(readElement("<integer>18446744073709551615</integer>"),
            Value(std::numeric_limits<std::uint64_t>::max()));
  EXPECT_EQ(readElement("<integer> +7\n</integer>"), Value(7));
  EXPECT_EQ(readElement("<integer>0x10</integer>"), Value(16));
}

TEST(XMLPropertyListTest, ReadsDatesFarAway) {
  EXPECT_EQ(readElement("<date>4001-01-01T00:00:00Z</date>"), Value(Date{64092211200}));
  EXPECT_EQ(readElement("<date>0001-01-01T00:00:00Z</date>"), Value(Date{-62135596800}));
  EXPECT_EQ(readElement("<array><date>1900-03-01T00:00:00Z</date></array>"), Value(Array{Date{-2203891200}}));
  EXPECT_EQ(readElement("<date>1970-01-01T00:00:00Z</date>"), Value(Date{0}));
  EXPECT_EQ(readElement("<date> 1970-01-01T00:00:01.5Z\n</date>"), Value(Date{1.5}));
}

TEST(XMLPropertyListTest, ResolvesCharacterDataAndPassesOverComments) {
  EXPECT_EQ(readElement("<string>a<!-- </string> <dict> -->b<![CDATA[<&>]] ]>]]>c<?pi <array> ?>d</string>"),
            Value("ab<&>]] ]>cd"));
  EXPECT_EQ(read("<!-- <plist> --><plist><array><!-- </array> --><true/></array></plist><!-- end -->"),
            Value(Array{true}));
}

TEST(XMLPropertyListTest, ReplacesWhatIsNoTextAndKeepsBlanks) {
  EXPECT_EQ(readElement("<string> a\xFF\n </string>"), Value(" a\uFFFD\n "));
  EXPECT_EQ(readElement(std::string_view("<string>a\0b</string>", 20)), Value("a\uFFFDb"));
}

TEST(XMLPropertyListTest, SurvivesCharacterReferencesThatAreNone) {
  for (const char* reference : {"&#0;", "&#x0;", "&#xD800;", "&#x110000;", "&#99999999999999999999;", "&#-1;",
                                "&#;", "&;", "&#x;", "&", "&#65", "&amp"}) {
    const std::string text = "a" + std::string(reference) + "b";
    for (const std::string& element :
         {"<string>" + text + "</string>", "<dict><key>" + text + "</key><true/></dict>",
          "<real>" + text + "</real>"}) {
      const PropertyListResult result = propertyListWithData("<plist>" + element + "</plist>");
      EXPECT_NE(result.value.has_value(), !result.error.empty()) << element;
    }
  }
}

TEST(XMLPropertyListTest, OfEqualKeysTheLastStays) {
  EXPECT_EQ(readElement("<dict><key>a</key><true/><key>a</key><false/></dict>"),
            Value(Dictionary{{"a", false}}));
}

TEST(XMLPropertyListTest, ReadsObjectReferencesAsArchivesWriteThem) {
  EXPECT_EQ(readElement("<dict><key>CF$UID</key><integer>3</integer></dict>"),
            Value(Dictionary{{"CF$UID", 3}}));
}

TEST(XMLPropertyListTest, NamesTheErrorAndItsPlace) {
  EXPECT_EQ(error("<plist><dict>"), "XML property list: no element found at byte 13");
  EXPECT_EQ(error("<plist><array></dict></plist>"), "XML property list: mismatched tag at byte 16");
  EXPECT_EQ(error("<plist><foo/></plist>"), "XML property list: unknown element at byte 7");
  EXPECT_EQ(error("<plist><!-- "), "XML property list: unclosed token at byte 7");
  EXPECT_EQ(error("<plist><string>&unknown;</string></plist>"),
            "XML property list: undefined entity at byte 15");
  EXPECT_EQ(error("<plist></plist>"), "XML property list: the list holds no value at byte 15");
  EXPECT_EQ(error("<plist><true/><false/></plist>"), "XML property list: more than one value at byte 22");
  EXPECT_EQ(error("<true/><false/>"), "XML property list: junk after document element at byte 7");
  EXPECT_EQ(error("<plist>text</plist>"), "XML property list: text between elements at byte 7");
  EXPECT_EQ(error("<plist><dict><true/></dict></plist>"), "XML property list: a key is missing at byte 13");
  EXPECT_EQ(error("<plist><dict><key>a</key></dict></plist>"),
            "XML property list: a key without a value at byte 25");
  EXPECT_EQ(error("<dict><key>a</key><key>b</key></dict>"),
            "XML property list: a key with no use at byte 18");
  EXPECT_EQ(error("<array><key>a</key></array>"), "XML property list: a key with no use at byte 7");
  EXPECT_EQ(error("<key>a</key>"), "XML property list: a key with no use at byte 0");
  EXPECT_EQ(error("<string><dict/></string>"),
            "XML property list: element in a place where none may be at byte 8");
  EXPECT_EQ(error("<plist><plist/></plist>"),
            "XML property list: element in a place where none may be at byte 7");
  EXPECT_EQ(error("<html><body/></html>"), "ASCII property list: '>' is missing at byte 1");
}

TEST(XMLPropertyListTest, RefusesTextThatIsNoValueOfItsKind) {
  for (const char* element : {"<integer>abc</integer>",
                              "<integer/>",
                              "<integer>1.5</integer>",
                              "<integer>--1</integer>",
                              "<integer>+-1</integer>",
                              "<integer>18446744073709551616</integer>",
                              "<integer>-9223372036854775809</integer>",
                              "<integer>0x</integer>",
                              "<real>abc</real>",
                              "<real/>",
                              "<real>1e999</real>",
                              "<real>1,5</real>",
                              "<true>1</true>",
                              "<data>AAA</data>",
                              "<date/>",
                              "<date>now</date>",
                              "<date>2020-02-30T00:00:00Z</date>",
                              "<date>2020-01-01T24:00:00Z</date>",
                              "<date>2020-01-01T00:60:00Z</date>",
                              "<date>2020-01-01T00:00:61Z</date>",
                              "<date>2020-01-01T00:00:00</date>",
                              "<date>2020-01-01T00:00:00Z </date>x",
                              "<date>-020-01-01T00:00:00Z</date>",
                              "<date>20000-01-01T00:00:00Z</date>",
                              "<date>2020-01-01T00:00:.Z</date>",
                              "<date>2020-01-01T00:00:1e1Z</date>"}) {
    EXPECT_NE(error("<plist>" + std::string(element) + "</plist>"), "") << element;
  }
}

TEST(XMLPropertyListTest, RefusesDocumentsThatDeclareEntities) {
  EXPECT_EQ(error("<!DOCTYPE plist [<!ENTITY a \"b\">]><plist><string>&a;</string></plist>"),
            "XML property list: the list declares entities at byte 28");
  std::string doubling = "<!DOCTYPE plist [<!ENTITY a0 \"x\">";
  for (int i = 1; i < 64; ++i) {
    const std::string before = "&a" + std::to_string(i - 1) + ";";
    doubling += "<!ENTITY a" + std::to_string(i) + " \"" + before + before + "\">";
  }
  EXPECT_NE(error(doubling + "]><plist><string>&a63;</string></plist>"), "");
}

TEST(XMLPropertyListTest, ReadsNestingUpToItsBoundOnly) {
  const auto nested = [](int depth) {
    std::string open;
    std::string close;
    for (int i = 0; i < depth; ++i) {
      open += "<array>";
      close += "</array>";
    }
    return "<plist>" + open + close + "</plist>";
  };
  EXPECT_TRUE(propertyListWithData(nested(kMaximumPropertyListDepth)).value);
  EXPECT_NE(error(nested(kMaximumPropertyListDepth + 1)).find("nested too deep"), std::string::npos);
  EXPECT_NE(error(nested(100'000)).find("nested too deep"), std::string::npos);
  std::string open = "<plist>";
  for (int i = 0; i < 100'000; ++i) open += "<dict><key>a</key>";
  EXPECT_NE(error(open).find("nested too deep"), std::string::npos);
}

TEST(XMLPropertyListTest, TakesTimeInProportionToTheListsSize) {
  // Each of these costs many minutes when the time grows with the square of the size.
  constexpr int kCount = 500'000;
  std::string text;
  std::string entries;
  for (int i = 0; i < kCount; ++i) {
    text += "&amp;<![CDATA[&]]>";
    entries += "<key>" + std::to_string(i) + "</key><true/>";
  }
  EXPECT_EQ(readElement("<string>" + text + "</string>"), Value(std::string(2 * kCount, '&')));
  EXPECT_EQ(readElement("<dict>" + entries + "</dict>").dictionary()->size(), std::size_t{kCount});
}

}  // namespace
}  // namespace tallyd::platform
