// Clients that know nothing of the framework: standard D-Bus tools.

#include <gtest/gtest.h>

#include "integration/TestDaemon.h"

namespace tallyd::test {
namespace {

constexpr const char* kInterface = "com.quillon.tallyd.ClientSessionInterface";

class ForeignClientTest : public testing::Test {
 protected:
  std::string busctl(std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), {"/usr/bin/busctl", "--address=unix:path=" + root.socket().string()});
    WatchedProcess process({.arguments = std::move(arguments)});
    EXPECT_EQ(process.wait().code, 0) << process.output();
    return process.output();
  }

  StorebagServer storebags;
  TestRoot root{storebags};
  TestDaemon daemon{root};
};

TEST_F(ForeignClientTest, BusctlSeesTheInterface) {
  const std::string shown = busctl({"introspect", "com.quillon.tallyd", "/com/quillon/tallyd"});
  for (const std::string method :
       {"SetSessionInfo", "StartConfig", "FetchStates", "FetchDisplayURL", "SendMessageWithCategory",
        "FlushMessages", "UploadFileAtPath", "UploadLogData", "SendMessageWithSessionInfo"}) {
    EXPECT_NE(shown.find("." + method), std::string::npos) << method;
  }
}

TEST_F(ForeignClientTest, BusctlCallsTheDaemonUnderAnyName) {
  EXPECT_EQ(busctl({"call", "any.name.at.all", "/com/quillon/tallyd", kInterface, "SetSessionInfo",
                    "aa{sv}aa{sv}as", "1", "2", "SessionID", "u", "7", "ClientType", "i", "5", "0", "0"}),
            "s \"received\"\n");
  EXPECT_EQ(
      busctl({"call", "com.quillon.tallyd", "/com/quillon/tallyd", kInterface, "FetchStates", "aa{sv}", "0"}),
      "aas 0\n");
}

TEST_F(ForeignClientTest, GdbusCallsTheDaemon) {
  WatchedProcess process(
      {.arguments = {"/usr/bin/gdbus", "call", "--address", "unix:path=" + root.socket().string(), "--dest",
                     "com.quillon.tallyd", "--object-path", "/com/quillon/tallyd", "--method",
                     std::string(kInterface) + ".FetchDisplayURL"}});
  EXPECT_EQ(process.wait().code, 0);
  EXPECT_EQ(process.output(), "('URL not available',)\n");
}

}  // namespace
}  // namespace tallyd::test
