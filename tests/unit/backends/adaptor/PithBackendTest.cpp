#include "backends/adaptor/PithBackend.h"

#include <gtest/gtest.h>

#include <stdexcept>

#include "adaptors/SampleAdaptors.h"
#include "fakes/FakePlatform.h"
#include "framework/PithAdaptor.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd {
namespace {

using fakes::FakeLog;
using platform::Dictionary;
using platform::LogLevel;
using platform::Value;
using Lines = std::vector<FakeLog::Line>;

struct Received {
  const void* self;
  int method;
  int respCode;
  std::optional<std::string> plist;
  bool operator==(const Received&) const = default;
};

// What the test's adaptor classes have seen; plain functions have nowhere else to put it.
std::vector<Received> received;
int created = 0;
int destroyed = 0;
char instances[8];

void* create() { return &instances[created++]; }
void* createNone() { return nullptr; }
void* createThrowing() { throw std::runtime_error("no adaptor today"); }
void destroy(void*) { ++destroyed; }
void receive(void* self, std::uint16_t method, std::uint16_t respCode, const void* plist,
             std::size_t length) {
  std::optional<std::string> bytes;
  if (plist) bytes.emplace(static_cast<const char*>(plist), length);
  received.push_back({self, method, respCode, std::move(bytes)});
}

constexpr PithAdaptorClass kWhole{1, create, destroy, receive};

class PithBackendTest : public testing::Test {
 protected:
  static constexpr timeval kTime{1'768'478'460, 750'000};
  static constexpr const char* kLoadingSeven =
      "PithBackend(initWithName): Loading Pith adaptor class for client type 7";
  static constexpr const char* kSelector = "sendMessageWithMethod:respCode:dict:";

  PithBackendTest() {
    received.clear();
    created = destroyed = 0;
  }

  std::shared_ptr<PithBackend> made(std::int32_t clientType) {
    return PithBackend::initWithName(fake.platform, "pith", Dictionary(), "Kasten", clientType);
  }
  std::shared_ptr<PithBackend> madeWith(const PithAdaptorClass& adaptorClass) {
    fake.codeBundles.symbols[fake.root.under(test::kPerformanceBundle)]["PithAdaptor"] = &adaptorClass;
    auto backend = made(7);
    EXPECT_NE(backend, nullptr);
    return backend;
  }
  /// Sends twice and expects one error line each, and no call.
  void expectNoResponse(PithBackend& backend, const std::string& adaptor) {
    fake.log.clear();
    EXPECT_EQ(backend.sendMessage(Dictionary{{"a", 1}}, kTime, 1, 0), std::nullopt);
    EXPECT_EQ(backend.sendMessage(std::nullopt, kTime, 1, 0), std::nullopt);
    const FakeLog::Line line{LogLevel::Error, "PithBackend(sendMessage): Pith adaptor " + adaptor +
                                                  " does not respond to forwarding selector " + kSelector};
    EXPECT_EQ(fake.log.lines(), (Lines{line, line}));
    EXPECT_TRUE(received.empty());
  }

  fakes::FakePlatform fake;
};

TEST_F(PithBackendTest, LoadsTheBundleOfTheClientType) {
  EXPECT_NE(made(7), nullptr);
  EXPECT_NE(made(11), nullptr);
  EXPECT_EQ(
      fake.codeBundles.loaded(),
      (std::vector{fake.root.under("/System/Library/PrivateFrameworks/PlayhallServices.framework/Frameworks/"
                                   "PHSPerformance.framework"),
                   fake.root.under("/System/Library/PrivateFrameworks/Fennel.framework")}));
  EXPECT_EQ(
      fake.log.lines(),
      (Lines{{LogLevel::Info, "PithBackend(initWithName): Loading Pith adaptor class for client type 7"},
             {LogLevel::Info, "PithBackend(initWithName): Loading Pith adaptor class for client type 11"}}));
}

TEST_F(PithBackendTest, IsNotMadeForAClientTypeWithoutABundle) {
  for (const std::int32_t clientType : {5, 0, 6, 8, 10, 12, -1}) {
    fake.log.clear();
    EXPECT_EQ(made(clientType), nullptr);
    const std::string number = std::to_string(clientType);
    EXPECT_EQ(fake.log.lines(),
              (Lines{{LogLevel::Info,
                      "PithBackend(initWithName): Loading Pith adaptor class for client type " + number},
                     {LogLevel::Error,
                      "PithBackend(initWithName): No matching bundle found for client type " + number}}));
  }
  EXPECT_TRUE(fake.codeBundles.loaded().empty());
}

TEST_F(PithBackendTest, DrawsItsSamplingFactorBeforeItLooksForTheBundle) {
  fake.randomness.draws = {0.125, 0.25};
  EXPECT_EQ(made(5), nullptr);
  EXPECT_EQ(made(7)->samplingFactor(), 0.25);
}

TEST_F(PithBackendTest, IsNotMadeWithoutAClientType) {
  EXPECT_EQ(PithBackend::initWithName(fake.platform, "pith", Dictionary(), "Kasten"), nullptr);
  EXPECT_TRUE(
      fake.log.has(LogLevel::Error, "PithBackend(initWithName): No matching bundle found for client type 0"));
}

TEST_F(PithBackendTest, ForwardsMethodResponseCodeAndPayload) {
  const auto backend = madeWith(kWhole);
  const Dictionary payload{{"a", 1}, {"b", "two"}};
  EXPECT_EQ(backend->sendMessage(payload, kTime, 65'535, 500), std::nullopt);
  ASSERT_EQ(received.size(), 1U);
  EXPECT_EQ(received[0].self, &instances[0]);
  EXPECT_EQ(received[0].method, 65'535);
  EXPECT_EQ(received[0].respCode, 500);
  EXPECT_EQ(platform::propertyListWithData(received[0].plist.value()).value, Value(payload));
  EXPECT_EQ(fake.log.lines(), (Lines{{LogLevel::Info, kLoadingSeven}}));
}

TEST_F(PithBackendTest, ForwardsAMissingPayloadAsNothingAndAnEmptyOneAsADictionary) {
  const auto backend = madeWith(kWhole);
  backend->sendMessage(std::nullopt, kTime, 1, 0);
  backend->sendMessage(Dictionary(), kTime, 1, 0);
  ASSERT_EQ(received.size(), 2U);
  EXPECT_EQ(received[0].plist, std::nullopt);
  EXPECT_EQ(platform::propertyListWithData(received[1].plist.value()).value, Value(Dictionary()));
}

TEST_F(PithBackendTest, ForwardsNeitherTimestampNorEventID) {
  const auto backend = madeWith(kWhole);
  const TallyBackend::Payload payload = Dictionary{{"a", 1}};
  backend->sendMessage(payload, kTime, 1, 2);
  backend->sendMessage(payload, {5, 0}, 1, 2);
  ASSERT_EQ(received.size(), 2U);
  EXPECT_EQ(received[0], received[1]);
}

TEST_F(PithBackendTest, ForwardsAPayloadWithoutWhatAPropertyListCannotHold) {
  madeWith(kWhole)->sendMessage(Dictionary{{"a", 1}, {"nothing", Value()}}, kTime, 1, 0);
  ASSERT_EQ(received.size(), 1U);
  EXPECT_EQ(platform::propertyListWithData(received[0].plist.value()).value, Value(Dictionary{{"a", 1}}));
}

TEST_F(PithBackendTest, HasOneAdaptorOfItsOwnForLife) {
  auto first = madeWith(kWhole);
  auto second = madeWith(kWhole);
  first->sendMessage(std::nullopt, kTime, 1, 0);
  second->sendMessage(std::nullopt, kTime, 1, 0);
  first->sendMessage(std::nullopt, kTime, 1, 0);
  ASSERT_EQ(received.size(), 3U);
  EXPECT_EQ(received[0].self, received[2].self);
  EXPECT_NE(received[0].self, received[1].self);
  EXPECT_EQ(destroyed, 0);
  EXPECT_EQ(fake.codeBundles.heldCount(), 2U);
  first.reset();
  EXPECT_EQ(destroyed, 1);
  EXPECT_EQ(fake.codeBundles.heldCount(), 1U);
  second.reset();
  EXPECT_EQ(destroyed, 2);
}

TEST_F(PithBackendTest, LivesWithoutAnAdaptorClass) {
  const auto backend = made(7);
  ASSERT_NE(backend, nullptr);
  EXPECT_EQ(fake.log.lines(), (Lines{{LogLevel::Info, kLoadingSeven}}));
  expectNoResponse(*backend, "(null)");
}

TEST_F(PithBackendTest, LivesWithAClassThatMakesNoAdaptor) {
  constexpr PithAdaptorClass kWithoutCreate{1, nullptr, destroy, receive};
  expectNoResponse(*madeWith(kWithoutCreate), "(null)");
  constexpr PithAdaptorClass kMakesNone{1, createNone, destroy, receive};
  expectNoResponse(*madeWith(kMakesNone), "(null)");
  EXPECT_EQ(destroyed, 0);
}

TEST_F(PithBackendTest, NamesTheAdaptorThatDoesNotRespond) {
  constexpr PithAdaptorClass kWithoutSend{1, create, destroy, nullptr};
  expectNoResponse(*madeWith(kWithoutSend), fmt::format("<PithAdaptor: {}>", static_cast<void*>(instances)));
  EXPECT_EQ(destroyed, 1);
}

TEST_F(PithBackendTest, DropsAnAdaptorThatNeedsNoDestruction) {
  constexpr PithAdaptorClass kWithoutDestroy{1, create, nullptr, receive};
  madeWith(kWithoutDestroy)->sendMessage(std::nullopt, kTime, 1, 0);
  EXPECT_EQ(received.size(), 1U);
}

TEST_F(PithBackendTest, CallsNothingInAClassOfAnUnknownVersion) {
  for (const std::uint32_t version : {0U, 2U, 0xFFFF'FFFFU}) {
    const PithAdaptorClass unknown{version, create, destroy, receive};
    fake.log.clear();
    const auto backend = madeWith(unknown);
    EXPECT_EQ(
        fake.log.lines(),
        (Lines{{LogLevel::Info, kLoadingSeven},
               {LogLevel::Warning, "PithBackend(initWithName): Pith adaptor class has the unknown version " +
                                       std::to_string(version)}}));
    expectNoResponse(*backend, "(null)");
  }
  EXPECT_EQ(created, 0);
  EXPECT_EQ(destroyed, 0);
}

TEST_F(PithBackendTest, SurvivesAnAdaptorThatCannotBeMade) {
  constexpr PithAdaptorClass kThrowing{1, createThrowing, destroy, receive};
  const auto backend = madeWith(kThrowing);
  EXPECT_TRUE(fake.log.has(LogLevel::Error, "PithBackend: Pith adaptor threw in create: no adaptor today"));
  expectNoResponse(*backend, "(null)");
}

void throwAlways(void*, std::uint16_t, std::uint16_t, const void*, std::size_t) {
  throw std::runtime_error("not today");
}

TEST_F(PithBackendTest, BooksWhatTheAdaptorTookAndWhyItTookNothing) {
  static constexpr PithAdaptorClass kThrowing{1, create, destroy, throwAlways};
  static constexpr PithAdaptorClass kDeaf{1, create, destroy, nullptr};
  const auto whole = madeWith(kWhole);
  whole->sendMessage(Dictionary{{"a", 1}}, kTime, 1, 0);
  whole->sendMessage(std::nullopt, kTime, 1, 0);
  EXPECT_EQ(whole->account().counts().sent, 2U);
  EXPECT_EQ(received.size(), 2U);
  const auto throwing = madeWith(kThrowing);
  throwing->sendMessage(Dictionary{{"a", 1}}, kTime, 1, 0);
  EXPECT_EQ(*throwing->account().counts().dictionary().dictionary("dropped"),
            (Dictionary{{"adaptor-threw", 1}}));
  const auto deaf = madeWith(kDeaf);
  deaf->sendMessage(Dictionary{{"a", 1}}, kTime, 1, 0);
  EXPECT_EQ(*deaf->account().counts().dictionary().dictionary("dropped"),
            (Dictionary{{"adaptor-unavailable", 1}}));
  for (const auto& backend : {whole, throwing, deaf}) EXPECT_TRUE(backend->account().counts().isBalanced());
}

}  // namespace
}  // namespace tallyd
