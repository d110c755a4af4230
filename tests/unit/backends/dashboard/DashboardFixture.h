// A dashboard backend on a fake platform, configured as a session configures it, and a server for its
// datagrams.
#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <filesystem>
#include <memory>
#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "LoopbackDashboard.h"
#include "backends/dashboard/DashboardBackend.h"
#include "backends/dashboard/Datagram.h"
#include "fakes/FakePlatform.h"

namespace tallyd {

/// The platform with other queues.
inline platform::Platform platformWith(fakes::FakePlatform& fake, platform::Queues& queues,
                                       platform::Log& log) {
  return {fake.root,
          log,
          fake.clock,
          fake.randomness,
          fake.locale,
          queues,
          fake.http,
          fake.preferences,
          fake.defaults,
          fake.device,
          fake.frameworkBundle,
          fake.sandbox,
          fake.powerLog,
          fake.codeBundles,
          fake.process};
}

inline std::set<int> openDescriptors() {
  std::set<int> numbers;
  for (const auto& entry : std::filesystem::directory_iterator("/proc/self/fd")) {
    // The listing's own descriptor is closed with it.
    if (std::filesystem::is_directory(entry.status())) continue;
    numbers.insert(std::stoi(entry.path().filename()));
  }
  return numbers;
}

/// Every test ends with no timer and no descriptor left.
class DashboardFixture : public testing::Test {
 protected:
  using Array = platform::Array;
  using Dictionary = platform::Dictionary;
  using Level = platform::LogLevel;
  using Lines = std::vector<fakes::FakeLog::Line>;
  using Milliseconds = std::chrono::milliseconds;
  using Seconds = std::chrono::seconds;

  static constexpr const char* kUdid = "0123456789abcdef0123456789abcdef01234567";
  static constexpr timeval kTime{1000, 20'000};
  static constexpr Milliseconds kPeriod{20};

  void TearDown() override {
    // A dropped backend needs 21 ticks of the default period at most.
    fake.queues.advance(Seconds(200));
    EXPECT_EQ(fake.queues.armedTimers(), 0U);
    EXPECT_EQ(openDescriptors(), descriptors);
  }

  [[nodiscard]] Dictionary profile(const Dictionary& more = {}) const {
    Dictionary entry{{"ip", "127.0.0.1"}, {"port", server.port()}};
    entry.merge(more);
    return entry;
  }
  [[nodiscard]] Dictionary reliableProfile() const {
    return profile({{"reliable", static_cast<std::int64_t>(kPeriod.count())}});
  }

  std::shared_ptr<DashboardBackend> made(const TallyBackend::Payload& entry) {
    return configured(DashboardBackend::initWithName(fake.platform, "dashboard", entry, "Kasten"));
  }
  std::shared_ptr<DashboardBackend> madeWithServer(const std::optional<std::string>& ip, std::uint16_t port) {
    return configured(DashboardBackend::initWithName(fake.platform, "dashboard", ip, port, "Kasten"));
  }
  static std::shared_ptr<DashboardBackend> configured(std::shared_ptr<DashboardBackend> backend) {
    if (!backend) return nullptr;
    backend->setSelfVersion("7.42.1");
    backend->setCompType(6);
    backend->setSessionID(77);
    backend->setClientVersion(3);
    backend->setUdid(kUdid);
    return backend;
  }

  static void send(DashboardBackend& backend, std::uint16_t eventID, std::string_view text = "x") {
    backend.sendMessage(Dictionary{{"a", text}}, kTime, 1, 0, eventID);
  }

  /// What has arrived, as event IDs.
  std::vector<std::uint16_t> receivedEventIDs() {
    std::vector<std::uint16_t> ids;
    while (const auto datagram = server.received())
      ids.push_back(datagramNumber16(*datagram, DatagramEventID));
    return ids;
  }

  /// The one descriptor that was not open when the test began.
  [[nodiscard]] int newDescriptor() const {
    std::vector<int> added;
    for (const int number : openDescriptors()) {
      if (!descriptors.contains(number)) added.push_back(number);
    }
    EXPECT_EQ(added.size(), 1U);
    return added.empty() ? -1 : added.front();
  }

  /// Makes every send on the one new socket fail, until it is connected again.
  void disconnect() const {
    const sockaddr nowhere{.sa_family = AF_UNSPEC, .sa_data = {}};
    EXPECT_EQ(::connect(newDescriptor(), &nowhere, sizeof nowhere), 0);
  }
  void connectAgain() const {
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    address.sin_port = htons(server.port());
    EXPECT_EQ(::connect(newDescriptor(), reinterpret_cast<const sockaddr*>(&address), sizeof address), 0);
  }

  fakes::FakePlatform fake;
  test::LoopbackDashboard server;
  std::set<int> descriptors = openDescriptors();
};

}  // namespace tallyd
