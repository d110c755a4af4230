#include <cstdio>

#include "IPCTest.h"

namespace tallyd::platform {
namespace {

/// The system's own D-Bus tools, as an administrator uses them.
class ToolsTest : public IPCTest {
 protected:
  /// What the command writes; the test fails when it fails.
  std::string run(const std::string& command) {
    FILE* pipe = ::popen(("timeout 60 " + command + " 2>&1").c_str(), "re");
    EXPECT_NE(pipe, nullptr);
    std::string output;
    std::array<char, 4096> part{};
    while (const auto size = ::fread(part.data(), 1, part.size(), pipe)) output.append(part.data(), size);
    EXPECT_EQ(::pclose(pipe), 0) << command << "\n" << output;
    return output;
  }
  std::string busctl(const std::string& words) {
    return run("busctl --address=unix:path=" + _socketPath.string() + " " + words);
  }
  std::string gdbus(const std::string& command, const std::string& words) {
    return run("gdbus " + command + " --address unix:path=" + _socketPath.string() + " " + words);
  }
};

TEST_F(ToolsTest, BusctlCallsAMethod) {
  EXPECT_EQ(busctl("call com.example.any /com/example/test com.example.Test Echo v s text"),
            "v s \"text\"\n");
  EXPECT_EQ(busctl("call :1.5 /com/example/test com.example.Test Sum ynqiuxt 1 2 3 4 5 6 7"), "x 28\n");
  EXPECT_TRUE(_service.events.waitFor("invalidated", 2));
  EXPECT_EQ(_service.events.count("interrupted"), 0U);
}

TEST_F(ToolsTest, BusctlShowsTheInterface) {
  const auto shown = busctl("introspect com.example.any /com/example/test com.example.Test");
  for (const auto& method : testInterface().methods)
    EXPECT_NE(shown.find("." + method.name + " "), std::string::npos);
  const auto xml = busctl("introspect --xml-interface com.example.any /com/example/test");
  EXPECT_NE(xml.find("<arg type=\"aa{sv}\" name=\"dictionary\" direction=\"in\"/>"), std::string::npos)
      << xml;
  EXPECT_NE(xml.find("name=\"contents\" direction=\"out\""), std::string::npos) << xml;
}

TEST_F(ToolsTest, BusctlShowsTheTreeOfObjects) {
  EXPECT_NE(busctl("tree com.example.any").find("/com/example/test"), std::string::npos);
}

TEST_F(ToolsTest, BusctlReportsWrongArguments) {
  FILE* pipe = ::popen(("busctl --address=unix:path=" + _socketPath.string() +
                        " call a.b /com/example/test com.example.Test Echo s text 2>&1")
                           .c_str(),
                       "re");
  ASSERT_NE(pipe, nullptr);
  std::array<char, 1024> output{};
  EXPECT_GT(::fread(output.data(), 1, output.size() - 1, pipe), 0U);
  EXPECT_NE(::pclose(pipe), 0);
  EXPECT_NE(std::string(output.data()).find("Invalid arguments"), std::string::npos) << output.data();
  EXPECT_EQ(_service.events.count("Echo"), 0U);
}

TEST_F(ToolsTest, GdbusCallsAMethod) {
  EXPECT_EQ(
      gdbus("call", "--dest a.b --object-path /com/example/test --method com.example.Test.Sum 1 2 3 4 5 6 7"),
      "(int64 28,)\n");
  EXPECT_EQ(
      gdbus("call", "--dest a.b --object-path /com/example/test --method com.example.Test.Echo '<true>'"),
      "(<true>,)\n");
}

TEST_F(ToolsTest, GdbusShowsTheInterface) {
  const auto shown = gdbus("introspect", "--dest a.b --object-path /com/example/test");
  EXPECT_NE(shown.find("interface com.example.Test {"), std::string::npos) << shown;
  EXPECT_NE(shown.find("in  aa{sv} dictionary"), std::string::npos) << shown;
}

}  // namespace
}  // namespace tallyd::platform
