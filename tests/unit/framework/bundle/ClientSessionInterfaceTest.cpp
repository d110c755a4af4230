#include "framework/ClientSessionInterface.h"

#include <gtest/gtest.h>

#include <string>
#include <tuple>

namespace tallyd {
namespace {

TEST(ClientSessionInterfaceTest, LiesUnderItsNameAtItsPath) {
  EXPECT_EQ(clientSessionInterface().objectPath, "/com/quillon/tallyd");
  EXPECT_EQ(clientSessionInterface().name, "com.quillon.tallyd.ClientSessionInterface");
}

TEST(ClientSessionInterfaceTest, HasTheNineMethodsInTheirOrderWithTheirTypes) {
  using Method = ClientSessionMethod;
  const std::tuple<Method, const char*, const char*, const char*> table[] = {
      {Method::SetSessionInfo, "SetSessionInfo", "aa{sv}aa{sv}as", "s"},
      {Method::StartConfig, "StartConfig", "", "aas"},
      {Method::FetchStates, "FetchStates", "aa{sv}", "aas"},
      {Method::FetchDisplayURL, "FetchDisplayURL", "", "s"},
      {Method::SendMessageWithCategory, "SendMessageWithCategory", "qqaa{sv}", "as"},
      {Method::FlushMessages, "FlushMessages", "", "as"},
      {Method::UploadFileAtPath, "UploadFileAtPath", "ssah", "b"},
      {Method::UploadLogData, "UploadLogData", "av", "bas"},
      {Method::SendMessageWithSessionInfo, "SendMessageWithSessionInfo", "aa{sv}aa{sv}qqaa{sv}", "s"},
  };
  const auto& methods = clientSessionInterface().methods;
  ASSERT_EQ(methods.size(), std::size(table));
  for (const auto& [method, name, in, out] : table) {
    const auto& declared = methods[static_cast<std::size_t>(method)];
    EXPECT_EQ(declared.name, name);
    EXPECT_EQ(declared.in, in) << name;
    EXPECT_EQ(declared.out, out) << name;
  }
}

TEST(ClientSessionInterfaceTest, TheSocketLiesBelowTheRoot) {
  EXPECT_EQ(tallydSocketPath(platform::Root()), "/run/tallyd/com.quillon.tallyd");
  EXPECT_EQ(tallydSocketPath(platform::Root("/tmp/r")), "/tmp/r/run/tallyd/com.quillon.tallyd");
}

}  // namespace
}  // namespace tallyd
