#include <gtest/gtest.h>

#include "backends/TallyBackend.h"
#include "backends/adaptor/PithBackend.h"
#include "backends/dashboard/DashboardBackend.h"
#include "backends/https-post/HTTPSPostBackend.h"
#include "backends/power-log/WattbookBackend.h"
#include "backends/upload/UploadBackend.h"
#include "fakes/FakePlatform.h"

namespace tallyd {
namespace {

using fakes::FakePlatform;
using platform::Dictionary;
using platform::LogLevel;

struct TallyBackendFactoryTest : testing::Test {
  /// What a backend still had to do on its queue when it went.
  void TearDown() override { fake.queues.run(); }
  std::shared_ptr<TallyBackend> made(std::string_view name, const TallyBackend::Payload& profile = Dictionary{
                                                                {"clients", platform::Array()}}) {
    return TallyBackend::newBackendWithName(fake.platform, name, profile, "Kasten", 7);
  }

  FakePlatform fake;
};

TEST_F(TallyBackendFactoryTest, ExportsTheStorebagNames) {
  EXPECT_EQ(kTallyBackendDashboard, "dashboard");
  EXPECT_EQ(kTallyBackendUploadServer, "upload_server");
  EXPECT_EQ(kTallyBackendHTTPPost, "splunk");
  EXPECT_EQ(kTallyBackendWattbook, "power");
  EXPECT_EQ(kTallyBackendPith, "pith");
}

TEST_F(TallyBackendFactoryTest, MakesThePostBackendUnderBothItsNames) {
  for (const std::string_view name : {"splunk", "https_post"}) {
    const auto backend = made(name);
    ASSERT_NE(dynamic_cast<HTTPSPostBackend*>(backend.get()), nullptr) << name;
    EXPECT_EQ(backend->name(), name);
    EXPECT_EQ(backend->productFamily(), "Kasten");
  }
  EXPECT_TRUE(fake.log.lines().empty());
}

TEST_F(TallyBackendFactoryTest, MakesTheDashboardBackend) {
  const auto backend = made("dashboard", Dictionary{{"ip", "127.0.0.1"}, {"port", 9}});
  ASSERT_NE(dynamic_cast<DashboardBackend*>(backend.get()), nullptr);
  EXPECT_EQ(backend->name(), "dashboard");
  EXPECT_EQ(backend->productFamily(), "Kasten");
  backend->cleanup();
}

TEST_F(TallyBackendFactoryTest, PassesOnThatAKindRefused) {
  EXPECT_EQ(made("splunk", Dictionary()), nullptr);
  EXPECT_EQ(fake.log.lines(),
            (std::vector<fakes::FakeLog::Line>{
                {LogLevel::Error, "Tally(HTTPSPostBackend): can't find the client list."}}));
}

TEST_F(TallyBackendFactoryTest, KnowsNoNameInAnotherCaseNorAPartOfOne) {
  for (const std::string name :
       {"Dashboard", "DASHBOARD", "Splunk", "splunk ", "splun", "", "Pith", "HTTPS_post"}) {
    fake.log.clear();
    EXPECT_EQ(made(name), nullptr) << name;
    EXPECT_EQ(
        fake.log.lines(),
        (std::vector<fakes::FakeLog::Line>{{LogLevel::Error, "TallyBackend(newBackendWithName): " + name}}));
  }
}

TEST_F(TallyBackendFactoryTest, MakesTheUploadBackend) {
  const auto backend = made("upload_server", Dictionary{{"post_url", "https://upload.example/"}});
  ASSERT_NE(dynamic_cast<UploadBackend*>(backend.get()), nullptr);
  EXPECT_EQ(backend->name(), "upload_server");
  EXPECT_EQ(made("upload_server"), nullptr);
}

TEST_F(TallyBackendFactoryTest, MakesThePowerLogBackend) {
  const auto backend = made("power");
  ASSERT_NE(dynamic_cast<WattbookBackend*>(backend.get()), nullptr);
  EXPECT_EQ(backend->name(), "power");
  EXPECT_EQ(backend->productFamily(), "Kasten");
}

TEST_F(TallyBackendFactoryTest, MakesTheAdaptorBackendForItsClientTypes) {
  const auto backend = made("pith");  // Of client type 7.
  ASSERT_NE(dynamic_cast<PithBackend*>(backend.get()), nullptr);
  EXPECT_EQ(backend->name(), "pith");
  EXPECT_EQ(TallyBackend::newBackendWithName(fake.platform, "pith", Dictionary(), "Kasten", 5), nullptr);
  EXPECT_TRUE(
      fake.log.has(LogLevel::Error, "PithBackend(initWithName): No matching bundle found for client type 5"));
}

TEST_F(TallyBackendFactoryTest, MakesTheAdaptorBackendOnADeviceWithoutAProductType) {
  fake.device.answers.erase("ProductType");
  EXPECT_NE(made("pith"), nullptr);
}

TEST_F(TallyBackendFactoryTest, MakesNoAdaptorOnADeskframe) {
  fake.device.answers["ProductType"] = "Deskframe";
  EXPECT_EQ(made("pith"), nullptr);
  EXPECT_EQ(fake.log.lines(),
            (std::vector<fakes::FakeLog::Line>{{LogLevel::Error, "TallyBackend(newBackendWithName): pith"}}));
}

TEST_F(TallyBackendFactoryTest, DrawsASamplingFactorOnlyForABackendThatIsMade) {
  fake.randomness.draws = {0.125, 0.25};
  made("unknown");
  made("splunk", Dictionary());
  EXPECT_EQ(made("splunk")->samplingFactor(), 0.125);
  EXPECT_EQ(made("splunk")->samplingFactor(), 0.25);
}

}  // namespace
}  // namespace tallyd
