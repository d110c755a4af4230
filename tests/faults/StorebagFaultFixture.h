// The real daemon and a storebag server that behaves for one client type and misbehaves for another.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <utility>

#include "fakes/SignedStorebag.h"
#include "faults/FaultFixture.h"
#include "support/TLSServer.h"

namespace tallyd::test {

/// The server behaves for "playhall" (client type 5) and misbehaves for "vitrine" (6).
class StorebagFaultFixture : public FaultFixture {
 protected:
  static constexpr std::int32_t kMisservedType = 6;

  void useServer(const TLSServer& server) const {
    root.setPreferences("com.quillon.tally", {{"tally_storebag_url", server.url("/bags")},
                                              {"httpsPostURL", collector.url("/events")}});
  }
  [[nodiscard]] TLSServer::Script serveWith(TLSServer::Script misbehave) const {
    return [good = goodText(), misbehave = std::move(misbehave)](TLSConnection& connection) {
      const std::string request = connection.readRequest();
      if (request.find("/playhall?") == std::string::npos) return misbehave(connection);
      connection.write(good);
      connection.close();
    };
  }
  /// What a server sends that does as it should.
  [[nodiscard]] std::string goodText() const { return httpText(storebags.signedBag(bag(), "max-age=600")); }
  /// The same, but for its last bytes.
  [[nodiscard]] std::string brokenOffText() const {
    const std::string whole = goodText();
    return whole.substr(0, whole.size() - 200);
  }
  /// The same, signed by somebody else.
  [[nodiscard]] static std::string forgedText() {
    return httpText({.body = fakes::StorebagSigner::stranger().envelope(bag()),
                     .headers = {{"Cache-Control", "max-age=600"}}});
  }
  static constexpr std::size_t kGibibyte = std::size_t{1} << 30U;
  /// Writes a body of a gibibyte as far as the client takes it, and counts what it took.
  template <class Counter>
  static void writeGibibyte(TLSConnection& connection, Counter& written) {
    connection.write("HTTP/1.1 200 OK\r\nContent-Length: " + std::to_string(kGibibyte) + "\r\n\r\n");
    const std::string piece(1U << 20U, 'x');
    while (written < kGibibyte && connection.writeAll(piece)) written += piece.size();
  }

  /// A session that gets no storebag: it has no backend, and its message is booked as dropped for that.
  void expectNoStorebag(TestDaemon& daemon) const {
    TallyInspection inspection(inspectionSocket());
    {
      auto session = daemon.connect();
      session->setSessionInfoSync(sessionInfo(7, kMisservedType), std::nullopt);
      EXPECT_EQ(session->startConfigSync().value, std::nullopt);
      EXPECT_EQ(session->sendMessageSync(kMethod, 0, Dictionary{{"a", 1}}).value, std::nullopt);
    }
    EXPECT_EQ(linesWith(daemon, "<2>Unable to fetch storebag for client type 6", "", 1), 1U);
    const Dictionary stats = statsWhen(inspection, nothingUnderWay);
    const Dictionary& messages = *stats.dictionary("total")->dictionary("messages");
    EXPECT_EQ(number(messages, "accepted"), 1);
    EXPECT_EQ(number(*messages.dictionary("dropped"), "no-backends"), 1);
  }
  void expectOthersServed(TestDaemon& daemon) const {
    auto session = daemon.connect();
    session->setSessionInfoSync(sessionInfo(8), Dictionary{{"ClientName", "demo"}});
    EXPECT_EQ(session->startConfigSync().value, std::vector<std::string>{"splunk"});
    EXPECT_TRUE(collector.waitForRequests(1));
  }

 private:
  [[nodiscard]] static Dictionary bag() { return {{"version", "1.0"}, {"release", storebagWithHTTPSPost()}}; }
};

}  // namespace tallyd::test
