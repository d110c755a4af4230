// A storebag server that answers every request with one signed bag, until the test changes it.
#pragma once

#include <gtest/gtest.h>

#include "fakes/FakePlatform.h"
#include "fakes/SignedStorebag.h"

namespace tallyd {

class StorebagFixture : public testing::Test {
 protected:
  using Lines = std::vector<fakes::FakeLog::Line>;

  StorebagFixture() {
    fake.frameworkBundle.resources["publicKey.der"] = server.subjectPublicKeyInfo();
    serve(bag());
  }

  /// A bag with a section for each environment that tells which one it is.
  static platform::Dictionary bag() {
    return {{"version", "bag 17"},
            {"development", section("development")},
            {"quillon_internal", section("quillon_internal")},
            {"seed", section("seed")},
            {"release", section("release")}};
  }
  static platform::Dictionary section(const char* name) { return {{"which", name}}; }

  void serve(const platform::Dictionary& content, std::optional<std::string> cacheControl = "max-age=600") {
    serveBody(server.envelope(content), std::move(cacheControl));
  }
  void serveBody(std::string body, const std::optional<std::string>& cacheControl = "max-age=600") {
    std::vector<std::pair<std::string, std::string>> headers;
    if (cacheControl) headers.emplace_back("Cache-Control", *cacheControl);
    fake.http.answer = [body = std::move(body), headers](const platform::HTTPRequest&) {
      return fakes::FakeHTTPClient::ok(body, headers);
    };
  }
  void serveFailure(const std::string& error) {
    fake.http.answer = [error](const platform::HTTPRequest&) {
      return fakes::FakeHTTPClient::failure(error);
    };
  }

  void prefer(std::string_view key, platform::Value value) {
    fake.preferences.set("com.quillon.tally", key, std::move(value));
  }
  std::size_t requestCount() const { return fake.http.synchronousRequests().size(); }

  static fakes::FakeLog::Line critical(std::string text) {
    return {platform::LogLevel::Critical, std::move(text)};
  }
  static fakes::FakeLog::Line warning(std::string text) {
    return {platform::LogLevel::Warning, std::move(text)};
  }
  static fakes::FakeLog::Line info(std::string text) { return {platform::LogLevel::Info, std::move(text)}; }
  static fakes::FakeLog::Line debug(std::string text) { return {platform::LogLevel::Debug, std::move(text)}; }

  const fakes::StorebagSigner& server = fakes::StorebagSigner::server();
  fakes::FakePlatform fake;
  const platform::Platform& platform = fake.platform;
};

inline constexpr const char* kPlayhallURL =
    "https://storebags.quillon.example/bags/sorrel/playhall?version=7.42.1";

}  // namespace tallyd
