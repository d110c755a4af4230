#include <systemd/sd-bus.h>

#include <limits>

#include "IPCTest.h"
#include "SdBusHandles.h"
#include "SdBusValueReader.h"

namespace tallyd::platform {
namespace {

class ValuesTest : public IPCTest {
 protected:
  /// What a value is after two journeys, there and back.
  Value echo(Value value) {
    auto reply = call(*_client, kEcho, {std::move(value)});
    EXPECT_FALSE(reply.error) << *reply.error;
    return reply.results.empty() ? Value("no answer") : reply.results[0];
  }

  std::shared_ptr<DBusClientConnection> _client = makeClient();
};

TEST_F(ValuesTest, EveryKindOfValueComesBackTheSame) {
  const std::vector<Value> values{
      Value(),
      Value(true),
      Value(false),
      Value(0),
      Value(-1),
      Value(std::numeric_limits<std::int64_t>::min()),
      Value(std::numeric_limits<std::int64_t>::max()),
      Value(std::numeric_limits<std::uint64_t>::max()),
      Value(0.5),
      Value(-1e300),
      Value(""),
      Value("Grüße, 世界"),
      Value(Date{1.5e9 + 0.25}),
      Value(Date{-1}),
      Value(Data()),
      Value(Data(std::string("\0\1\xFF", 3))),
      Value(Array()),
      Value(Array{Value(1), Value("two"), Value(), Value(Array{Value(3.0)})}),
      Value(Dictionary()),
      Value(Dictionary{{"a", Value(1)}, {"", Value("empty key")}, {"d", Value(Dictionary{{"n", Value()}})}}),
  };
  for (const auto& value : values) EXPECT_EQ(echo(value), value) << value.description();
}

TEST_F(ValuesTest, TextThatIsNotUTF8GetsReplacementCharacters) {
  EXPECT_EQ(echo(Value("a\xFFz")), Value("a\xEF\xBF\xBDz"));
  EXPECT_EQ(echo(Value(std::string("a\0z", 3))), Value("a\xEF\xBF\xBDz"));
  EXPECT_EQ(echo(Value(Dictionary{{"k\xC3", Value(1)}})), Value(Dictionary{{"k\xEF\xBF\xBD", Value(1)}}));
}

TEST_F(ValuesTest, ResultsFollowTheMethodsSignature) {
  const Value dictionary(Array{Value(Dictionary{{"k", Value(1)}})});
  const Value strings(Array{Value("a"), Value("b")});
  const auto reply = call(*_client, kMixed, {Value(65'535), dictionary, strings});
  ASSERT_FALSE(reply.error) << *reply.error;
  EXPECT_EQ(reply.results,
            (std::vector<Value>{Value(true), Value(Array()), Value(Array{strings}), Value(2.5), dictionary}));
}

TEST_F(ValuesTest, IntegersOfEveryWidthAreRead) {
  const auto reply = call(*_client, kSum,
                          {Value(255), Value(-32'768), Value(65'535), Value(-2'147'483'647 - 1),
                           Value(std::int64_t{4'294'967'295}), Value(1), Value(2)});
  ASSERT_FALSE(reply.error) << *reply.error;
  EXPECT_EQ(reply.results[0],
            Value(std::int64_t{255} - 32'768 + 65'535 - 2'147'483'648 + 4'294'967'295 + 1 + 2));
}

TEST_F(ValuesTest, ADeeplyNestedValueArrives) {
  Value value("bottom");
  for (int i = 0; i < 40; ++i) value = Value(Array{value});
  EXPECT_EQ(echo(value), value);
}

TEST_F(ValuesTest, AValueNestedTooDeeplyIsNotSent) {
  Value value("bottom");
  for (int i = 0; i < 10'000; ++i) value = Value(Array{value});
  EXPECT_TRUE(call(*_client, kEcho, {value}).error);
  EXPECT_FALSE(call(*_client, kNothing).error);
}

/// Speaks through the D-Bus library itself, so that it can send what the project's own writer never would.
class ForeignValuesTest : public IPCTest {
 protected:
  ForeignValuesTest() {
    sd_bus* bus = nullptr;
    sd_bus_new(&bus);
    _bus.reset(bus);
    sd_bus_set_address(bus, ("unix:path=" + _socketPath.string()).c_str());
    EXPECT_GE(sd_bus_start(bus), 0);
  }

  BusMessage newCall(const char* member) {
    sd_bus_message* message = nullptr;
    EXPECT_GE(sd_bus_message_new_method_call(_bus.get(), &message, nullptr, "/com/example/test",
                                             "com.example.Test", member),
              0);
    return adoptMessage(message);
  }

  /// The name of the error that comes back, or "" for none; `reply` gets the answer's own contents.
  std::string outcome(const BusMessage& message, std::vector<Value>* results = nullptr) {
    sd_bus_error error = SD_BUS_ERROR_NULL;
    sd_bus_message* reply = nullptr;
    constexpr std::uint64_t kMicroseconds = 60'000'000;
    sd_bus_call(_bus.get(), message.get(), kMicroseconds, &error, &reply);
    const std::string name = error.name ? error.name : "";
    sd_bus_error_free(&error);
    const auto answer = adoptMessage(reply);
    if (reply && results) *results = readValues(reply, sd_bus_message_get_signature(reply, 1)).values;
    return name;
  }

  template <class... Arguments>
  Value echoed(const char* types, Arguments... arguments) {
    const auto message = newCall("Echo");
    EXPECT_GE(sd_bus_message_append(message.get(), types, arguments...), 0);
    std::vector<Value> results;
    EXPECT_EQ(outcome(message, &results), "") << types;
    return results.empty() ? Value("no answer") : results[0];
  }

  template <class... Arguments>
  std::string errorOf(const char* member, const char* types, Arguments... arguments) {
    const auto message = newCall(member);
    EXPECT_GE(sd_bus_message_append(message.get(), types, arguments...), 0) << types;
    return outcome(message);
  }

  BusHandle _bus;
};

constexpr const char* kInvalid = "org.freedesktop.DBus.Error.InvalidArgs";

TEST_F(ForeignValuesTest, ReadsEveryIntegerTypeWithinAVariant) {
  EXPECT_EQ(echoed("v", "y", 200), Value(200));
  EXPECT_EQ(echoed("v", "n", -5), Value(-5));
  EXPECT_EQ(echoed("v", "q", 60'000), Value(60'000));
  EXPECT_EQ(echoed("v", "i", -70'000), Value(-70'000));
  EXPECT_EQ(echoed("v", "u", 4'000'000'000U), Value(std::int64_t{4'000'000'000}));
  EXPECT_EQ(echoed("v", "x", std::int64_t{-1}), Value(-1));
  EXPECT_EQ(echoed("v", "t", std::uint64_t{1} << 63), Value(std::uint64_t{1} << 63));
  EXPECT_EQ(echoed("v", "t", std::uint64_t{5}), Value(5));
}

TEST_F(ForeignValuesTest, ReadsArraysOfEveryKindOfElement) {
  EXPECT_EQ(echoed("v", "as", 2, "a", "b"), Value(Array{Value("a"), Value("b")}));
  EXPECT_EQ(echoed("v", "ai", 2, 1, 2), Value(Array{Value(1), Value(2)}));
  EXPECT_EQ(echoed("v", "aai", 1, 1, 7), Value(Array{Value(Array{Value(7)})}));
  EXPECT_EQ(echoed("v", "a(d)", 1, 1.5), Value(Array{Value(Date{1.5})}));
  EXPECT_EQ(echoed("v", "aa{sv}", 1, 1, "k", "b", 1), Value(Array{Value(Dictionary{{"k", Value(true)}})}));
  EXPECT_EQ(echoed("v", "as", 0), Value(Array()));
  EXPECT_EQ(echoed("v", "ay", 2, 1, 2), Value(Data("\1\2")));
}

TEST_F(ForeignValuesTest, ReadsDictionariesWithValuesOfOneType) {
  EXPECT_EQ(echoed("v", "a{si}", 1, "k", 3), Value(Dictionary{{"k", Value(3)}}));
  EXPECT_EQ(echoed("v", "a{ss}", 1, "k", "v"), Value(Dictionary{{"k", Value("v")}}));
  EXPECT_EQ(echoed("v", "a{sv}", 0), Value(Dictionary()));
  EXPECT_EQ(echoed("v", "v", "s", "within"), Value("within"));
}

TEST_F(ForeignValuesTest, WrongArgumentTypesAreInvalidAndTheObjectIsNotCalled) {
  EXPECT_EQ(errorOf("Echo", "s", "text"), kInvalid);
  EXPECT_EQ(errorOf("Echo", ""), kInvalid);
  EXPECT_EQ(errorOf("Echo", "vv", "s", "a", "s", "b"), kInvalid);
  EXPECT_EQ(errorOf("Length", "as", 0), kInvalid);
  EXPECT_EQ(errorOf("Nothing", "s", "text"), kInvalid);
  EXPECT_EQ(errorOf("NoSuchMethod", ""), "org.freedesktop.DBus.Error.UnknownMethod");
  EXPECT_EQ(errorOf("Nothing", ""), "");
  EXPECT_EQ(_service.events.count("Echo"), 0U);
  EXPECT_EQ(_service.events.count("Length"), 0U);
  EXPECT_EQ(_service.events.count("Nothing"), 1U);
}

TEST_F(ForeignValuesTest, ValuesThatCannotBeReadAreInvalidAndTheObjectIsNotCalled) {
  EXPECT_EQ(errorOf("Echo", "v", "o", "/path"), kInvalid);
  EXPECT_EQ(errorOf("Echo", "v", "g", "s"), kInvalid);
  EXPECT_EQ(errorOf("Echo", "v", "(ds)", 1.0, "x"), kInvalid);
  EXPECT_EQ(errorOf("Echo", "v", "(s)", "x"), kInvalid);
  EXPECT_EQ(errorOf("Echo", "v", "a{is}", 1, 1, "x"), kInvalid);
  EXPECT_EQ(errorOf("Echo", "v", "a{ov}", 1, "/a", "s", "x"), kInvalid);
  EXPECT_EQ(errorOf("Echo", "v", "ao", 1, "/path"), kInvalid);
  EXPECT_EQ(errorOf("Echo", "v", "av", 1, "o", "/path"), kInvalid);
  EXPECT_EQ(errorOf("Echo", "v", "a{sv}", 1, "k", "(ii)", 1, 2), kInvalid);
  EXPECT_EQ(errorOf("Echo", "v", "h", 0), kInvalid);
  EXPECT_EQ(errorOf("Echo", "v", "ah", 1, 0), kInvalid);
  EXPECT_EQ(_service.events.count("Echo"), 0U);
  EXPECT_EQ(errorOf("Nothing", ""), "");
}

TEST_F(ForeignValuesTest, VariantsNestedTooDeeplyAreInvalid) {
  constexpr int kDeep = 120;
  const auto message = newCall("Echo");
  ASSERT_GE(sd_bus_message_open_container(message.get(), 'v', "v"), 0);
  for (int i = 1; i < kDeep; ++i) ASSERT_GE(sd_bus_message_open_container(message.get(), 'v', "v"), 0);
  ASSERT_GE(sd_bus_message_append(message.get(), "v", "s", "bottom"), 0);
  for (int i = 0; i < kDeep; ++i) ASSERT_GE(sd_bus_message_close_container(message.get()), 0);
  EXPECT_EQ(outcome(message), "");  // Within the limit.

  // The library does not write deeper ones.
  std::string body;
  constexpr int kTooDeep = 200;
  for (int i = 0; i < kTooDeep; ++i) body += std::string("\1v\0", 3);
  body += std::string("\1y\0x", 4);
  RawClient client(_socketPath);
  client.authenticate();
  client.send(rawCall(1, "Echo", "v", body));
  const auto answer = client.receiveMessage();
  ASSERT_TRUE(answer);
  EXPECT_NE(answer->find(kInvalid), std::string::npos);
}

TEST_F(ForeignValuesTest, AMessageOfVeryManyValuesIsInvalid) {
  constexpr std::size_t kBytes = (dbus::kMaximumValuesInMessage + 1) * sizeof(std::int16_t);
  const auto message = newCall("Echo");
  void* space = nullptr;
  ASSERT_GE(sd_bus_message_open_container(message.get(), 'v', "an"), 0);
  ASSERT_GE(sd_bus_message_append_array_space(message.get(), 'n', kBytes, &space), 0);
  std::memset(space, 0, kBytes);
  ASSERT_GE(sd_bus_message_close_container(message.get()), 0);
  EXPECT_EQ(outcome(message), kInvalid);
}

}  // namespace
}  // namespace tallyd::platform
