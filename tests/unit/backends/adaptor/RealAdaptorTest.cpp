// Backends with adaptors out of real libraries.

#include <gtest/gtest.h>

#include <cstdlib>
#include <fstream>
#include <sstream>

#include "adaptors/SampleAdaptors.h"
#include "backends/adaptor/PithBackend.h"
#include "fakes/FakePlatform.h"
#include "platform/code-bundles/DlopenCodeBundles.h"

namespace tallyd {
namespace {

using platform::Dictionary;
using platform::LogLevel;

class RealAdaptorTest : public testing::Test {
 protected:
  RealAdaptorTest() { ::setenv("TALLYD_TEST_RECORD", record.c_str(), 1); }
  ~RealAdaptorTest() override { ::unsetenv("TALLYD_TEST_RECORD"); }

  std::shared_ptr<PithBackend> madeFrom(const std::string& sample) {
    test::installBundle(fake.root.under(test::kFennelBundle), sample, "Fennel.so");
    return PithBackend::initWithName(platform, "pith", std::nullopt, std::nullopt, 11);
  }
  TallyBackend::Result send(TallyBackend& backend, const TallyBackend::Payload& payload,
                            std::uint16_t method) {
    return backend.sendMessage(payload, timeval{1, 2}, method, 0);
  }
  [[nodiscard]] std::string recorded() const {
    std::ostringstream text;
    text << std::ifstream(record).rdbuf();
    return text.str();
  }

  fakes::FakePlatform fake;
  std::filesystem::path record = fake.folder.path() / "record";
  platform::DlopenCodeBundles bundles{fake.log};
  platform::Platform platform{
      fake.root,     fake.log,         fake.clock,    fake.randomness, fake.locale,          fake.queues,
      fake.http,     fake.preferences, fake.defaults, fake.device,     fake.frameworkBundle, fake.sandbox,
      fake.powerLog, bundles,          fake.process};
};

TEST_F(RealAdaptorTest, GetsTheMessages) {
  auto backend = madeFrom("RecordingAdaptor");
  send(*backend, std::nullopt, 9);
  send(*backend, Dictionary{{"a", 1}}, 10);
  backend.reset();
  const std::string text = recorded();
  EXPECT_TRUE(text.starts_with("create 1\nmessage 1 9 0 nothing \nmessage 1 10 0 payload 62706c6973743030"))
      << text;  // "bplist00"
  EXPECT_TRUE(text.ends_with("\ndestroy 1\n")) << text;
}

TEST_F(RealAdaptorTest, MayThrowAnything) {
  auto backend = madeFrom("ThrowingAdaptor");
  EXPECT_EQ(send(*backend, std::nullopt, 9), std::nullopt);
  EXPECT_TRUE(fake.log.has(LogLevel::Error,
                           "PithBackend: Pith adaptor threw in sendMessageWithMethod:respCode:dict:: no room "
                           "for method 9"));
  backend.reset();
  EXPECT_TRUE(fake.log.has(LogLevel::Error, "PithBackend: Pith adaptor threw in destroy"));
}

TEST_F(RealAdaptorTest, NeedsNeitherClassNorLibrary) {
  for (const std::string sample : {"NoAdaptor", "UnresolvedAdaptor", "FutureAdaptor"}) {
    fake.log.clear();
    const auto backend = madeFrom(sample);
    ASSERT_NE(backend, nullptr) << sample;
    EXPECT_EQ(send(*backend, std::nullopt, 9), std::nullopt);
    EXPECT_TRUE(fake.log.has(LogLevel::Error,
                             "PithBackend(sendMessage): Pith adaptor (null) does not respond to forwarding "
                             "selector sendMessageWithMethod:respCode:dict:"))
        << sample;
    std::filesystem::remove_all(fake.root.under(test::kFennelBundle));
  }
}

}  // namespace
}  // namespace tallyd
