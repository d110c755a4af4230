#include "tallyctl/Options.h"

#include <gtest/gtest.h>

#include <cstdlib>
#include <sstream>
#include <vector>

namespace tallyd::tallyctl {
namespace {

using platform::Array;
using platform::Dictionary;

class OptionsTest : public testing::Test {
 protected:
  OptionsTest() { ::unsetenv("TALLY_ROOT"); }
  ~OptionsTest() override { ::unsetenv("TALLY_ROOT"); }

  ParsedOptions parse(std::vector<const char*> arguments) {
    arguments.insert(arguments.begin(), "tallyctl");
    _out.str("");
    _err.str("");
    return parseOptions(static_cast<int>(arguments.size()), arguments.data(), "1.2.3", _out, _err);
  }

  template <class Command>
  Command parsed(std::vector<const char*> arguments) {
    const auto result = parse(std::move(arguments));
    EXPECT_TRUE(result.options) << _err.str();
    return result.options ? std::get<Command>(result.options->command) : Command();
  }

  /// What is said of a wrong command line.
  std::string complaint(std::vector<const char*> arguments) {
    const auto result = parse(std::move(arguments));
    EXPECT_FALSE(result.options);
    EXPECT_EQ(result.exitStatus, kWrongUsage);
    EXPECT_EQ(_out.str(), "");
    const std::string text = _err.str();
    return text.substr(0, text.find('\n'));
  }

  std::ostringstream _out;
  std::ostringstream _err;
};

TEST_F(OptionsTest, FindsTheSocketBelowTheRoot) {
  EXPECT_EQ(parse({"states"}).options->connection.socket, "/run/tallyd/com.quillon.tallyd");
  EXPECT_EQ(parse({"--root", "/a", "states"}).options->connection.socket, "/a/run/tallyd/com.quillon.tallyd");
  EXPECT_EQ(parse({"states", "--root", "/a"}).options->connection.socket, "/a/run/tallyd/com.quillon.tallyd");
  EXPECT_EQ(parse({"--root", "/a", "--socket", "/s", "states"}).options->connection.socket, "/s");
  ::setenv("TALLY_ROOT", "/b", 1);
  EXPECT_EQ(parse({"states"}).options->connection.socket, "/b/run/tallyd/com.quillon.tallyd");
  EXPECT_EQ(parse({"--root", "/a", "states"}).options->connection.socket, "/a/run/tallyd/com.quillon.tallyd");
}

TEST_F(OptionsTest, TakesFractionsOfSeconds) {
  EXPECT_EQ(parse({"states"}).options->connection.timeout, std::chrono::seconds(60));
  EXPECT_EQ(parse({"--timeout", "0.25", "states"}).options->connection.timeout,
            std::chrono::milliseconds(250));
  EXPECT_EQ(parsed<WatchOptions>({"watch", "--interval", "2.5"}).interval, std::chrono::milliseconds(2500));
}

TEST_F(OptionsTest, DescribesASession) {
  const auto session =
      parsed<StatesOptions>(
          {"states", "--client-type",       "7",       "--session-id",  "4294967295", "--client-version",
           "3",      "--require-user-info", "--batch", "--client-name", "5",          "--service-name",
           "calls",  "--user-info",         "a=1",     "--user-info",   "b:=[2]",     "--framework",
           "F",      "--framework",         "G"})
          .session;
  EXPECT_EQ(sessionInfo(session, *session.sessionID), (Dictionary{{"SessionID", 4294967295U},
                                                                  {"ClientType", 7},
                                                                  {"ClientVersion", 3},
                                                                  {"RequireUserInfo", true},
                                                                  {"BatchEvent", true}}));
  EXPECT_EQ(userInfo(session),
            (Dictionary{{"ClientName", "5"}, {"ServiceName", "calls"}, {"a", 1}, {"b", Array{2}}}));
  EXPECT_EQ(session.frameworks, (std::vector<std::string>{"F", "G"}));
}

TEST_F(OptionsTest, SaysNothingThatTheCommandLineDoesNotSay) {
  const auto session = parsed<FlushOptions>({"flush"}).session;
  EXPECT_FALSE(session.sessionID);
  EXPECT_EQ(sessionInfo(session, 9), (Dictionary{{"SessionID", 9}, {"ClientType", 5}}));
  EXPECT_FALSE(userInfo(session));
}

TEST_F(OptionsTest, ChoosesSessionNumbersThatAlsoReadAsSigned) {
  const auto first = randomSessionID();
  EXPECT_GE(first, 1U);
  EXPECT_LT(first, 1U << 31);
  bool differs = false;
  for (int i = 0; i < 8; ++i) differs = differs || randomSessionID() != first;
  EXPECT_TRUE(differs);
}

TEST_F(OptionsTest, ReadsOneMessageFromTheCommandLine) {
  const auto report = parsed<ReportOptions>({"report", "--category", "300", "--user-info", "u=1", "--type",
                                             "2", "rtt=12.5", "codec=opus", "l:=[1]"});
  EXPECT_EQ(report.message, (Message{300, 2, Dictionary{{"rtt", 12.5}, {"codec", "opus"}, {"l", Array{1}}}}));
  EXPECT_EQ(report.session.furtherUserInfo, (Dictionary{{"u", 1}}));
  EXPECT_FALSE(report.messagesFile);
  const auto once = parsed<OnceOptions>({"once", "--category", "1", "--type", "0"});
  EXPECT_EQ(once.message, (Message{1, 0, std::nullopt}));
}

TEST_F(OptionsTest, ReadsMessagesFromAFile) {
  const auto report = parsed<ReportOptions>({"report", "--messages", "-", "--flush-every", "10", "--strict"});
  EXPECT_EQ(report.messagesFile, "-");
  EXPECT_FALSE(report.message);
  EXPECT_EQ(report.flushEvery, 10U);
  EXPECT_EQ(report.atFault, AtFault::Stop);
}

TEST_F(OptionsTest, WatchesAsClientTypeFive) {
  const auto watch = parsed<WatchOptions>({"watch", "--count", "3", "--client-name", "n"});
  EXPECT_EQ(watch.session.clientType, 5);
  EXPECT_EQ(watch.count, 3U);
  EXPECT_EQ(watch.interval, std::chrono::seconds(1));
  EXPECT_EQ(complaint({"watch", "--client-type", "6"}), "tallyctl: watch has no option --client-type");
}

TEST_F(OptionsTest, TakesFilesToUpload) {
  EXPECT_EQ(parsed<UploadOptions>({"upload", "a", "--session-id", "9"}).file, "a");
  EXPECT_EQ(parsed<UploadOptions>({"upload", "--session-id", "9", "a"}).session.sessionID, 9U);
  EXPECT_EQ(parsed<UploadLogOptions>({"upload-log", "a", "-", "--batch", "b"}).files,
            (std::vector<std::string>{"a", "-", "b"}));
  EXPECT_EQ(complaint({"upload"}), "tallyctl: file is required");
  EXPECT_EQ(complaint({"upload", "a", "b"}), "tallyctl: upload takes no argument \"b\"");
  EXPECT_EQ(complaint({"upload-log"}), "tallyctl: files is required");
}

TEST_F(OptionsTest, ChoosesTheOutputsFormBeforeOrAfterTheCommand) {
  EXPECT_EQ(parse({"states"}).options->form, OutputForm::Text);
  EXPECT_EQ(parse({"--json", "states"}).options->form, OutputForm::JSON);
  EXPECT_EQ(parse({"watch", "--json"}).options->form, OutputForm::JSON);
}

TEST_F(OptionsTest, NamesWhatIsUnknown) {
  EXPECT_TRUE(complaint({"bogus"}).starts_with("tallyctl: there is no command \"bogus\"; the commands are "));
  EXPECT_TRUE(complaint({}).starts_with("tallyctl: a command is missing; the commands are report, "));
  EXPECT_EQ(complaint({"--bogus"}), "tallyctl: there is no option --bogus");
  EXPECT_EQ(complaint({"states", "--bogus"}), "tallyctl: states has no option --bogus");
  EXPECT_EQ(complaint({"states", "extra"}), "tallyctl: states takes no argument \"extra\"");
  EXPECT_EQ(complaint({"--messages", "f", "report"}), "tallyctl: --messages must stand behind report");
}

TEST_F(OptionsTest, NamesWhatIsWrong) {
  EXPECT_EQ(complaint({"report"}), "tallyctl: --category is required");
  EXPECT_EQ(complaint({"report", "--category", "1"}), "tallyctl: --type is required");
  EXPECT_EQ(complaint({"once", "--type", "1"}), "tallyctl: --category is required");
  EXPECT_EQ(complaint({"report", "--messages", "f", "--type", "1"}), "tallyctl: --type excludes --messages");
  EXPECT_EQ(complaint({"report", "--messages", "f", "a=1"}), "tallyctl: payload excludes --messages");
  EXPECT_EQ(complaint({"once", "--category", "1", "--type", "1", "a"}),
            "tallyctl: payload: \"a\" is neither KEY=VALUE nor KEY:=JSON");
  EXPECT_EQ(complaint({"once", "--category", "1", "--type", "1", "a=1", "a=1"}),
            "tallyctl: payload: the key \"a\" comes twice");
  EXPECT_EQ(complaint({"states", "--user-info", "=1"}), "tallyctl: --user-info: \"=1\" has no key");
  EXPECT_EQ(complaint({"--socket", "", "states"}), "tallyctl: --socket: must not be empty");
  EXPECT_EQ(complaint({"--root", "", "states"}), "tallyctl: --root: must not be empty");
}

TEST_F(OptionsTest, NamesTheRangeOfANumber) {
  const auto once = [this](const char* category) {
    return complaint({"once", "--category", category, "--type", "1"});
  };
  EXPECT_EQ(once("70000"), "tallyctl: --category 70000: must be 0 to 65535");
  for (const char* number : {"-1", "65536", "x", "1.5", "+1", "0x10", "1 ", "99999999999999999999"}) {
    EXPECT_EQ(once(number), std::string("tallyctl: --category ") + number + ": must be 0 to 65535");
  }
  EXPECT_EQ(parsed<OnceOptions>({"once", "--category", "010", "--type", "65535"}).message,
            (Message{10, 65535, std::nullopt}));
  EXPECT_EQ(complaint({"states", "--session-id", "4294967296"}),
            "tallyctl: --session-id 4294967296: must be 0 to 4294967295");
  EXPECT_EQ(complaint({"states", "--client-type", "2147483648"}),
            "tallyctl: --client-type 2147483648: must be -2147483648 to 2147483647");
  EXPECT_EQ(complaint({"states", "--client-version", "-1"}),
            "tallyctl: --client-version -1: must be 0 to 65535");
  EXPECT_EQ(complaint({"watch", "--count", "0"}), "tallyctl: --count 0: must be 1 to 9223372036854775807");
  EXPECT_EQ(complaint({"report", "--messages", "f", "--flush-every", "-1"}),
            "tallyctl: --flush-every -1: must be 1 to 9223372036854775807");
}

TEST_F(OptionsTest, NamesTheRangeOfATime) {
  EXPECT_EQ(complaint({"watch", "--interval", "0.05"}),
            "tallyctl: --interval 0.05: must be 0.1 to 86400 seconds");
  EXPECT_EQ(complaint({"--timeout", "0", "states"}), "tallyctl: --timeout 0: must be 0.001 to 86400 seconds");
  for (const char* seconds : {"nan", "inf", "-1", "1e9", "1s", ""}) {
    EXPECT_EQ(complaint({"watch", "--interval", seconds}),
              std::string("tallyctl: --interval ") + seconds + ": must be 0.1 to 86400 seconds");
  }
}

TEST_F(OptionsTest, ShowsAnExampleInTheHelpOfEveryCommand) {
  for (const char* command :
       {"report", "once", "states", "flush", "display-url", "upload", "upload-log", "watch"}) {
    const auto result = parse({command, "--help"});
    EXPECT_FALSE(result.options);
    EXPECT_EQ(result.exitStatus, kSucceeded);
    EXPECT_NE(_out.str().find(std::string(" ") + command + " "), std::string::npos) << _out.str();
    EXPECT_NE(_out.str().find("\n  tallyctl "), std::string::npos) << _out.str();
    EXPECT_EQ(_err.str(), "");
  }
  EXPECT_EQ(parse({"--help"}).exitStatus, kSucceeded);
  EXPECT_NE(_out.str().find("\n  tallyctl report"), std::string::npos);
}

TEST_F(OptionsTest, TellsItsVersion) {
  EXPECT_EQ(parse({"--version"}).exitStatus, kSucceeded);
  EXPECT_EQ(_out.str(), "tallyctl 1.2.3\n");
}

}  // namespace
}  // namespace tallyd::tallyctl
