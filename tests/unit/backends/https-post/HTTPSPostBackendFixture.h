// A post backend on a fake platform, configured as a session configures it, and a reader for what it posted.
#pragma once

#include <gtest/gtest.h>

#include <memory>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "backends/https-post/HTTPSPostBackend.h"
#include "fakes/FakePlatform.h"
#include "framework/TallyKeys.h"
#include "platform/JSON.h"
#include "support/Gunzipped.h"

namespace tallyd {

/// The device consents and matches the default client entry, which lets everything through.
class HTTPSPostBackendFixture : public testing::Test {
 protected:
  using Array = platform::Array;
  using Dictionary = platform::Dictionary;
  using Level = platform::LogLevel;
  using Lines = std::vector<fakes::FakeLog::Line>;
  using Payload = TallyBackend::Payload;

  static constexpr const char* kURL = "https://collect.example/post";
  static constexpr const char* kUdid = "0123456789abcdef0123456789abcdef01234567";
  static constexpr timeval kEventTime{1'768'478'460, 750'000};

  HTTPSPostBackendFixture() { setConsent(true); }

  void setConsent(bool consent) {
    fake.preferences.set("com.quillon.diagnostics", "DiagnosticLogSubmissionEnabled", consent);
  }

  static Dictionary defaultEntry() {
    return {{"client", "Alpha,beta"},
            {"hierarchy", 3},
            {"locale_whitelist", Array{"DE"}},
            {"filters", Array{Dictionary{{"key", "unused"}, {"action", "remove"}}}},
            {"sampling_threshold", 1.0},
            {"post_url", kURL}};
  }
  static Dictionary entryWith(std::string_view key, platform::Value value) {
    Dictionary entry = defaultEntry();
    entry.set(key, std::move(value));
    return entry;
  }
  static Dictionary entryWithout(std::string_view key) {
    Dictionary entry = defaultEntry();
    entry.remove(key);
    return entry;
  }
  static Dictionary userInfo(std::string_view client = "Alpha",
                             std::string_view service = "VideoCallService") {
    return {{kTallyUserInfoClientName.data(), client}, {kTallyUserInfoServiceName.data(), service}};
  }

  /// A backend that still waits for user info.
  std::shared_ptr<HTTPSPostBackend> pending(const Array& clients = {defaultEntry()}) {
    auto backend =
        HTTPSPostBackend::initWithName(fake.platform, "splunk", Dictionary{{"clients", clients}}, "Kasten");
    EXPECT_NE(backend, nullptr);
    backend->setSessionID(77);
    backend->setCompType(7);
    backend->setClientVersion(12);
    backend->setUdid(kUdid);
    backend->setProductVersion("12.4");
    backend->setBuildVersion("12D500");
    backend->setHardwareType("Kasten3,1");
    backend->setRequireUserInfo(true);
    backend->setSelfVersion("7.42.1");
    backend->setStartTimestamp({1'768'478'459, 500'000});  // 12:00:59.500
    return backend;
  }
  /// A backend that has user info and has evaluated the entries.
  std::shared_ptr<HTTPSPostBackend> evaluated(const Array& clients = {defaultEntry()},
                                              const Dictionary& info = userInfo()) {
    auto backend = pending(clients);
    backend->setUserInfoDict(info);
    backend->updateState();
    return backend;
  }

  [[nodiscard]] std::size_t postCount() const { return fake.http.posts().size(); }
  [[nodiscard]] platform::HTTPRequest lastPost() const {
    const auto posts = fake.http.posts();
    EXPECT_FALSE(posts.empty());
    return posts.empty() ? platform::HTTPRequest() : posts.back();
  }
  static std::optional<std::string> header(const platform::HTTPRequest& request, std::string_view name) {
    for (const auto& [key, value] : request.headers) {
      if (key == name) return value;
    }
    return std::nullopt;
  }
  static std::string textOf(const platform::HTTPRequest& request) {
    const std::string bytes(request.body.bytes());
    return header(request, "Content-Encoding") == "gzip" ? test::gunzipped(bytes) : bytes;
  }
  /// The document of the last post.
  [[nodiscard]] Dictionary lastBody() const {
    const auto parsed = platform::valueFromJSON(textOf(lastPost()));
    EXPECT_TRUE(parsed.value) << parsed.error;
    return parsed.value && parsed.value->dictionary() ? *parsed.value->dictionary() : Dictionary();
  }
  [[nodiscard]] std::vector<Dictionary> lastEvents() const {
    const Dictionary body = lastBody();
    std::vector<Dictionary> events;
    if (!body.array("events")) return events;
    for (const auto& event : *body.array("events")) events.push_back(*event.dictionary());
    return events;
  }
  /// The only event of the last post.
  [[nodiscard]] Dictionary lastEvent() const {
    const auto events = lastEvents();
    EXPECT_EQ(events.size(), 1U);
    return events.empty() ? Dictionary() : events.front();
  }
  /// All lines but the compression's own.
  [[nodiscard]] Lines lines() const {
    Lines kept = fake.log.lines();
    std::erase_if(kept,
                  [](const auto& line) { return line.text.find("Compressed file") != std::string::npos; });
    return kept;
  }

  fakes::FakePlatform fake;
};

}  // namespace tallyd
