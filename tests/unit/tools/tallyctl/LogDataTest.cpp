#include "tallyctl/LogData.h"

#include <gtest/gtest.h>

#include <system_error>

#include "InputFile.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::tallyctl {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::PropertyListFormat;
using platform::Value;
using Elements = std::vector<Value>;

Elements elementsIn(std::string_view content) {
  auto parsed = logDataFromContent(content);
  EXPECT_EQ(parsed.error, "") << content;
  return parsed.value.value_or(Elements());
}

std::string failureOf(const std::vector<std::string>& files, int standardInput = -1) {
  try {
    static_cast<void>(readLogData(files, standardInput));
  } catch (const std::exception& error) {
    return error.what();
  }
  return "no failure";
}

TEST(LogDataTest, TakesAPropertyListOfAnyFormAsOneElement) {
  const Value list = Dictionary{{"when", platform::Date{12}}, {"bytes", platform::Data("\x01")}};
  for (const auto format : {PropertyListFormat::XML, PropertyListFormat::Binary}) {
    EXPECT_EQ(elementsIn(platform::dataWithPropertyList(list, format).value()), Elements{list});
  }
  EXPECT_EQ(elementsIn("{ key = value; }\n"), Elements{Value(Dictionary{{"key", "value"}})});
  EXPECT_EQ(elementsIn("(\n a,\n b\n)\n"), Elements{Value(Array{"a", "b"})});
}

TEST(LogDataTest, TakesJSONAsOneElement) {
  EXPECT_EQ(elementsIn("{\n  \"a\": [1,\n 2]\n}\n"), Elements{Value(Dictionary{{"a", Array{1, 2}}})});
  EXPECT_EQ(elementsIn("[1, 2]"), Elements{Value(Array{1, 2})});
  EXPECT_EQ(elementsIn("\xEF\xBB\xBF\"text\""), Elements{"text"});
}

TEST(LogDataTest, TakesEachOfSeveralJSONLinesAsAnElement) {
  EXPECT_EQ(elementsIn("\n{\"a\":1}\r\n\n[2]\n3\n\"four\""),
            (Elements{Dictionary{{"a", 1}}, Array{2}, 3, "four"}));
}

TEST(LogDataTest, NamesTheLineThatIsNoJSON) {
  EXPECT_TRUE(logDataFromContent("{\"a\":1}\n\n{\"a\":\n").error.starts_with("3: Invalid value."));
  EXPECT_EQ(logDataFromContent("{\"a\":1}\n{\"b\":1,\"b\":1}\n").error, "2: the key \"b\" comes twice");
  EXPECT_EQ(logDataFromContent("{\"b\":1,\n\"b\":1}\n").error, " the key \"b\" comes twice");
}

TEST(LogDataTest, SaysWhatIsWrongWithWhatItDoesNotUnderstand) {
  EXPECT_EQ(logDataFromContent("").error, " is empty");
  EXPECT_EQ(logDataFromContent(" \n\t\r\n").error, " is empty");
  EXPECT_TRUE(logDataFromContent("{\"a\": [1,\n").error.starts_with(" no JSON: Invalid value."));
  EXPECT_FALSE(logDataFromContent("<plist><dict></plist>").value);
  EXPECT_FALSE(logDataFromContent("bplist00garbage").value);
}

TEST(LogDataTest, GathersAllFilesInTheirOrder) {
  const InputFile first("{\"a\":1}\n{\"a\":2}\n");
  const InputFile second("( x )");
  const LogData data = readLogData({"-", second.path()}, first.descriptor());
  EXPECT_EQ(data.elements, (Array{Dictionary{{"a", 1}}, Dictionary{{"a", 2}}, Array{"x"}}));
  EXPECT_EQ(data.bytes, 16U + 5U);
}

TEST(LogDataTest, NamesTheFileThatFails) {
  const fakes::TemporaryFolder folder;
  EXPECT_EQ(failureOf({folder.path()}), folder.path().string() + ": Is a directory");
  EXPECT_EQ(failureOf({"/nonexistent/data"}), "/nonexistent/data: No such file or directory");
  const InputFile lines("1\n2\n[");
  EXPECT_TRUE(failureOf({lines.path()}).starts_with(lines.path().string() + ":3: "))
      << failureOf({lines.path()});
  const InputFile empty("");
  EXPECT_EQ(failureOf({"-"}, empty.descriptor()), "standard input: is empty");
}

TEST(LogDataTest, RefusesMoreThanACallCanCarry) {
  const std::string half(kMaximumLogDataBytes / 2 - 2, 'x');
  const InputFile first("\"" + half + "\"");
  EXPECT_EQ(readLogData({first.path(), first.path()}, -1).elements.size(), 2U);
  const InputFile more("1");
  EXPECT_EQ(failureOf({first.path(), first.path(), more.path()}), more.path().string() + ": File too large");
}

}  // namespace
}  // namespace tallyd::tallyctl
