// Who may read the files that the daemon writes.

#include <gtest/gtest.h>

#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <map>
#include <string>

#include "integration/TestDaemon.h"

namespace tallyd::test {
namespace {

using platform::Dictionary;
using std::filesystem::perms;

class FileModeTest : public testing::Test {
 protected:
  FileModeTest() {
    Dictionary section = storebagWithHTTPSPost();
    section.set("power", Dictionary());
    storebags.serve("playhall", section, "max-age=600");
    root.setPreferences("com.quillon.tally", {{"tally_storebag_url", storebags.baseURL()},
                                              {"httpsPostURL", collector.url("/events")}});
    root.setPreferences("com.quillon.diagnostics", {{"DiagnosticLogSubmissionEnabled", true}});
  }

  /// What others than the owner may do with the files that the daemon makes under this umask, by file name.
  std::map<std::string, perms> othersPermissions(mode_t umask) {
    TestDaemon daemon(root, {.umask = umask});
    auto session = daemon.connect();
    session->setSessionInfoSync(sessionInfo(1), std::nullopt);
    EXPECT_TRUE(session->startConfigSync().value);
    EXPECT_TRUE(session->sendMessageSync(3, 0, Dictionary{{"level", 80}}).value);
    std::map<std::string, perms> permissions;
    for (const auto& entry : std::filesystem::recursive_directory_iterator(root.under("/var"))) {
      if (!entry.is_regular_file()) continue;
      const std::string name = entry.path().filename().string();
      const bool isMessageLog = name.ends_with("_messageLog.diag");
      permissions[isMessageLog ? "message log" : name] =
          entry.status().permissions() & (perms::group_all | perms::others_all);
    }
    return permissions;
  }
  /// "UMask=" of the service manager's unit.
  static mode_t umaskOfTheUnit() {
    constexpr std::string_view kKey = "UMask=";
    constexpr int kOctal = 8;
    std::ifstream unit(TALLYD_SOURCE_DIR "/packaging/systemd/tallyd.service");
    for (std::string line; std::getline(unit, line);) {
      if (!line.starts_with(kKey)) continue;
      return static_cast<mode_t>(std::strtoul(line.c_str() + kKey.size(), nullptr, kOctal));
    }
    ADD_FAILURE() << "the unit states none";
    return 0;
  }

  StorebagServer storebags;
  LoopbackServer collector;
  TestRoot root{storebags};
};

TEST_F(FileModeTest, KeepsEveryFileFromOthersAsTheUnitStartsTheDaemon) {
  EXPECT_EQ(othersPermissions(umaskOfTheUnit()),
            (std::map<std::string, perms>{{"message log", perms::none},
                                          {"power.jsonl", perms::none},
                                          {"com.quillon.tallyd.plist", perms::none}}));
}

TEST_F(FileModeTest, LeavesTheMessageLogToAllWhomTheUMaskLetsRead) {
  EXPECT_EQ(othersPermissions(0),
            (std::map<std::string, perms>{{"message log", perms::group_read | perms::others_read},
                                          {"power.jsonl", perms::group_read},
                                          {"com.quillon.tallyd.plist", perms::none}}));
}

}  // namespace
}  // namespace tallyd::test
