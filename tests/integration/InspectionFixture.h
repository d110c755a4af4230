// A daemon with a collector that refuses some posts, and a look into its books.
#pragma once

#include <gtest/gtest.h>

#include <chrono>
#include <functional>
#include <string>

#include "framework/InspectionInterface.h"
#include "framework/TallyInspection.h"
#include "integration/TestDaemon.h"
#include "platform/JSON.h"
#include "support/TapEnd.h"

namespace tallyd::test {

class InspectionFixture : public testing::Test {
 protected:
  using Dictionary = platform::Dictionary;
  using Value = platform::Value;

  InspectionFixture() {
    storebags.serve("playhall", storebagWithHTTPSPost(), "max-age=600");
    postTo(collector.url("/events"));
    root.setPreferences("com.quillon.diagnostics", {{"DiagnosticLogSubmissionEnabled", true}});
  }

  void postTo(const std::string& url) const {
    root.setPreferences("com.quillon.tally",
                        {{"tally_storebag_url", storebags.baseURL()}, {"httpsPostURL", url}});
  }
  [[nodiscard]] std::filesystem::path inspectionSocket() const { return inspectionSocketPath(root.root()); }

  static std::unique_ptr<TallyConnection> startedSession(TestDaemon& daemon, const Dictionary& info) {
    auto connection = daemon.connect();
    EXPECT_EQ(connection->setSessionInfoSync(info, Dictionary{{"ClientName", "demo"}}).value, "received");
    EXPECT_EQ(connection->startConfigSync().error, std::nullopt);
    return connection;
  }

  static Dictionary rowOf(const Dictionary& sums, std::string_view backend) {
    const auto* rows = sums.array("backends");
    if (!rows) return {};
    for (const Value& row : *rows) {
      if (row.dictionary()->string("name") == backend) return *row.dictionary();
    }
    return {};
  }
  static std::int64_t number(const Dictionary& row, std::string_view key) {
    return row.integer(key).value_or(-1);
  }
  static bool isBalanced(const Dictionary& row) {
    std::int64_t sum = number(row, "sent") + number(row, "held") + number(row, "inFlight");
    for (const auto& [reason, count] : *row.dictionary("dropped")) sum += count.integerValue().value_or(0);
    return number(row, "accepted") == sum;
  }

  /// The books once they are as they must become; fails the test when they don't.
  static Dictionary statsWhen(TallyInspection& inspection,
                              const std::function<bool(const Dictionary&)>& condition) {
    const auto deadline = std::chrono::steady_clock::now() + WatchedProcess::kPatience;
    Dictionary stats;
    do {
      const auto reply = inspection.statsSync();
      EXPECT_EQ(reply.error, std::nullopt);
      stats = reply.stats;
      for (const Value& row : *stats.dictionary("total")->array("backends")) {
        EXPECT_TRUE(isBalanced(*row.dictionary())) << row.description();
      }
      if (condition(stats)) return stats;
    } while (std::chrono::steady_clock::now() < deadline);
    ADD_FAILURE() << Value(stats).description();
    return stats;
  }
  static bool nothingUnderWay(const Dictionary& stats) {
    for (const Value& row : *stats.dictionary("total")->array("backends")) {
      if (number(*row.dictionary(), "held") + number(*row.dictionary(), "inFlight") > 0) return false;
    }
    return number(*stats.dictionary("connections"), "open") == 0 && stats.array("sessions")->empty();
  }

  static Dictionary parsed(const std::string& line) {
    const auto result = platform::valueFromJSON(line);
    EXPECT_TRUE(result.value && result.value->dictionary()) << line << ": " << result.error;
    return result.value && result.value->dictionary() ? *result.value->dictionary() : Dictionary();
  }

  StorebagServer storebags;
  /// Answers every event whose "refuse" is true with 503.
  LoopbackServer collector{[](const ReceivedRequest& request) {
    const bool refuses = request.body.find("\"refuse\":true") != std::string::npos;
    return ServedResponse{.status = refuses ? 503 : 200};
  }};
  TestRoot root{storebags};
};

}  // namespace tallyd::test
