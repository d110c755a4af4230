// The command-line tool as a process, against the real daemon.

#include <gtest/gtest.h>

#include <fstream>

#include "integration/TestDaemon.h"
#include "platform/JSON.h"
#include "platform/property-list/PropertyList.h"
#include "unit/backends/dashboard/LoopbackDashboard.h"

namespace tallyd::test {
namespace {

using platform::Array;
using platform::Dictionary;

struct Finished {
  std::optional<int> code;
  std::string output;
};

class TallyctlTest : public testing::Test {
 protected:
  static constexpr const char* kProgram = TALLYD_BIN_DIR "/tallyctl";

  TallyctlTest() {
    storebags.serve("playhall",
                    {{"upload_server", Dictionary{{"post_url", uploads.url("/in")}}},
                     {"dashboard", Dictionary{{"ip", "127.0.0.1"},
                                              {"port", dashboard.port()},
                                              {"display_url", "https://show.example/"},
                                              {"post_url", logs.url("/logs")}}}},
                    "max-age=600");
  }

  [[nodiscard]] Finished run(std::vector<std::string> arguments, const std::string& input = "") const {
    arguments.insert(arguments.begin(), {kProgram, "--root", root.under("/").string()});
    return runProgram({.arguments = std::move(arguments), .input = input});
  }
  /// `script` finds the tool with its root as $tallyctl.
  [[nodiscard]] Finished runScript(const std::string& script) const {
    return runProgram({.arguments = {"/bin/bash", "-c", script},
                       .environment = {{"tallyctl", kProgram}, {"TALLY_ROOT", root.under("/").string()}}});
  }
  static Finished runProgram(const WatchedProcess::Options& options) {
    WatchedProcess process(options);
    const auto status = process.wait();
    EXPECT_EQ(status.signal, std::nullopt);
    return {status.code, process.output()};
  }
  static Dictionary objectIn(const std::string& output) {
    const auto value = platform::valueFromJSON(output).value;
    EXPECT_TRUE(value && value->dictionary()) << output;
    return value && value->dictionary() ? *value->dictionary() : Dictionary();
  }

  StorebagServer storebags;
  std::string answer = "{\"success\": true}";
  LoopbackServer uploads{[this](const ReceivedRequest&) { return ServedResponse{.body = answer}; }};
  LoopbackServer logs{
      [](const ReceivedRequest&) { return ServedResponse{.body = "https://logs.example/7"}; }};
  LoopbackDashboard dashboard;
  TestRoot root{storebags};
};

TEST_F(TallyctlTest, UploadsAFileWhichTheDaemonRemovesOnceTheServerHasIt) {
  TestDaemon daemon(root);
  root.write("/var/mobile/a b.log", "text");
  const auto path = root.under("/var/mobile/a b.log").string();
  const auto finished = run({"--json", "upload", "--session-id", "42", path});
  EXPECT_EQ(finished.code, 0) << finished.output;
  Dictionary result = objectIn(finished.output);
  result.remove("seconds");
  EXPECT_EQ(result, (Dictionary{{"ok", true}, {"file", path}, {"bytes", 4}, {"removed", true}}));
  ASSERT_EQ(uploads.requests().size(), 1U);
  EXPECT_EQ(uploads.requests()[0].body, "text");
  EXPECT_NE(uploads.requests()[0].target.find("&sequence=42&"), std::string::npos);
}

TEST_F(TallyctlTest, UploadsAFileOfAnyFolderByItsRelativePath) {
  TestDaemon daemon(root);
  fakes::TemporaryFolder outside;
  std::ofstream(outside.path() / "far.log") << "far";
  const auto finished = runScript("cd '" + outside.path().string() + "' && exec $tallyctl upload ./far.log");
  EXPECT_EQ(finished.code, 0) << finished.output;
  EXPECT_NE(finished.output.find("; the file is still there\n"), std::string::npos) << finished.output;
  ASSERT_EQ(uploads.requests().size(), 1U);
  EXPECT_EQ(uploads.requests()[0].body, "far");
}

TEST_F(TallyctlTest, FailsWhenNoBackendUploadsTheFile) {
  storebags.serve("playhall", {}, "max-age=600");
  TestDaemon daemon(root);
  root.write("/var/mobile/a.log", "text");
  const auto finished = run({"upload", root.under("/var/mobile/a.log").string()});
  EXPECT_EQ(finished.code, 1);
  EXPECT_TRUE(finished.output.ends_with(": the daemon did not send it; the daemon's log says why\n"))
      << finished.output;
}

TEST_F(TallyctlTest, UploadsLogDataOfSeveralForms) {
  TestDaemon daemon(root);
  root.write("/list", "{ key = value; }");
  const auto finished = run({"upload-log", "-", root.under("/list").string()}, "{\"a\":1}\n[true]\n");
  EXPECT_EQ(finished.code, 0) << finished.output;
  EXPECT_TRUE(finished.output.starts_with("uploaded 3 log data elements, ")) << finished.output;
  ASSERT_EQ(logs.requests().size(), 1U);
  const auto archive = platform::propertyListWithData(logs.requests()[0].body).value;
  ASSERT_TRUE(archive && archive->dictionary());
  EXPECT_EQ(archive->dictionary()->string("$archiver"), "NSKeyedArchiver");
}

TEST_F(TallyctlTest, FailsWhenTheLogDataIsNotUploaded) {
  storebags.serve("playhall", {{"upload_server", Dictionary{{"post_url", uploads.url("/in")}}}},
                  "max-age=600");
  TestDaemon daemon(root);
  const auto finished = run({"upload-log", "-"}, "[1]");
  EXPECT_EQ(finished.code, 1);
  EXPECT_EQ(finished.output, "tallyctl: the daemon did not upload the log data; the daemon's log says why\n");
}

TEST_F(TallyctlTest, PrintsTheURLThatShowsASessionsReports) {
  TestDaemon daemon(root);
  const auto finished = run({"display-url", "--session-id", "42"});
  EXPECT_EQ(finished.code, 0);
  EXPECT_EQ(finished.output, "https://show.example/?sequences=42&override=yes\n");
  const auto none = run({"display-url", "--client-type", "7"});
  EXPECT_EQ(none.code, 1);
  EXPECT_EQ(none.output, "tallyctl: URL not available\n");
}

TEST_F(TallyctlTest, EndsQuietlyAndInOrderWhenItsReaderHasGone) {
  TestDaemon daemon(root);
  const auto finished =
      runScript("$tallyctl watch --interval 0.1 --session-id 5 | head -n 1; exit ${PIPESTATUS[0]}");
  EXPECT_EQ(finished.code, 141);
  EXPECT_EQ(finished.output, "session 5, states: dashboard, upload_server\n");
  EXPECT_TRUE(daemon.process().waitForLineStartingWith("<7>TallydSession dealloc"));
}

TEST_F(TallyctlTest, FailsWhenItsOutputTakesNothing) {
  EXPECT_EQ(runScript("exec $tallyctl --version >/dev/full").output,
            "tallyctl: standard output: No space left on device\n");
  EXPECT_EQ(runScript("exec $tallyctl --version >/dev/full").code, 1);
  TestDaemon daemon(root);
  const auto closed = runScript("exec $tallyctl states >&-");
  EXPECT_EQ(closed.code, 1);
  EXPECT_EQ(closed.output, "tallyctl: standard output: Bad file descriptor\n");
}

}  // namespace
}  // namespace tallyd::test
