#include "backends/adaptor/AdaptorPayload.h"

#include <gtest/gtest.h>

#include "fakes/FakeLog.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd {
namespace {

using platform::Array;
using platform::Data;
using platform::Date;
using platform::Dictionary;
using platform::LogLevel;
using platform::Value;

class AdaptorPayloadTest : public testing::Test {
 protected:
  /// What an adaptor reads out of the payload.
  Value handedOver(const Dictionary& payload) {
    const auto list = adaptorPayload(payload, log);
    EXPECT_TRUE(list);
    if (!list) return {};
    EXPECT_TRUE(list->starts_with("bplist00"));
    const auto read = platform::propertyListWithData(*list);
    EXPECT_TRUE(read.value) << read.error;
    return read.value ? *read.value : Value();
  }
  void expectDropped(int count) {
    EXPECT_EQ(log.lines(),
              (std::vector<fakes::FakeLog::Line>{
                  {LogLevel::Warning, "PithBackend(sendMessage): Dropping " + std::to_string(count) +
                                          " value(s) of the payload that a property list can't hold"}}));
  }

  fakes::FakeLog log;
};

TEST_F(AdaptorPayloadTest, IsABinaryPropertyListOfEveryKindOfValue) {
  const Dictionary payload{{"text", "t\xC3\xA4xt"},
                           {"integer", -5},
                           {"large", std::uint64_t{1} << 63U},
                           {"real", 2.5},
                           {"yes", true},
                           {"date", Date{1'768'478'400}},
                           {"data", Data(std::string("\0\1", 2))},
                           {"list", Array{1, "two", Array()}},
                           {"dictionary", Dictionary{{"a", 1}}}};
  EXPECT_EQ(handedOver(payload), Value(payload));
  EXPECT_TRUE(log.lines().empty());
}

TEST_F(AdaptorPayloadTest, HoldsAnEmptyPayload) {
  EXPECT_EQ(handedOver({}), Value(Dictionary()));
  EXPECT_TRUE(log.lines().empty());
}

TEST_F(AdaptorPayloadTest, LeavesOutWhatAPropertyListCannotHold) {
  EXPECT_EQ(handedOver({{"null", Value()},
                        {"never", Date{1e18}},
                        {"kept", 1},
                        {"list", Array{Value(), 2, Value(), 3}},
                        {"inner", Dictionary{{"null", Value()}, {"kept", "too"}}}}),
            Value(Dictionary{{"kept", 1}, {"list", Array{2, 3}}, {"inner", Dictionary{{"kept", "too"}}}}));
  expectDropped(5);
}

TEST_F(AdaptorPayloadTest, LeavesOutContainersThatAreNestedTooDeep) {
  Value nested = Dictionary{{"innermost", 1}};
  for (int depth = 1; depth < platform::kMaximumPropertyListDepth; ++depth) nested = Array{nested};
  const std::string read = handedOver({{"deep", nested}, {"flat", 1}}).description();
  EXPECT_EQ(read.find("innermost"), std::string::npos);
  EXPECT_NE(read.find("flat = 1"), std::string::npos);
  expectDropped(1);
}

}  // namespace
}  // namespace tallyd
