// The station's page in a real browser, with reports that come while it is open.

#include <arpa/inet.h>
#include <gmock/gmock.h>
#include <gtest/gtest.h>
#include <httplib.h>
#include <sys/socket.h>
#include <csignal>

#include <fstream>
#include <future>
#include <memory>
#include <thread>
#include <utility>
#include <vector>

#include "backends/dashboard/Datagram.h"
#include "integration/TestDaemon.h"
#include "platform/JSON.h"
#include "support/ChildProcess.h"
#include "support/HeadlessBrowser.h"

namespace tallyd::test {
namespace {

using platform::Dictionary;
using platform::Value;
using testing::Each;
using testing::HasSubstr;
using testing::IsEmpty;
using testing::StartsWith;

class StationPageTest : public testing::Test {
 protected:
  static constexpr const char* kIsLive = "document.getElementById('connection').dataset.state === 'live'";

  StationPageTest() { startStation({}); }

  void startStation(const std::vector<std::string>& options) {
    station.reset();
    std::vector<std::string> arguments{
        "--directory", folder.path().string(),   "--quiet",         "--port", "0",
        "--http-port", std::to_string(httpPort), "--datagram-port", "0"};
    arguments.insert(arguments.end(), options.begin(), options.end());
    station = std::make_unique<ChildProcess>(TALLYD_BIN_DIR "/tally-station", arguments);
    if (!station->waitForText(ChildProcess::Stream::Output, "ready\n"))
      throw std::runtime_error(station->text(ChildProcess::Stream::Errors));
    std::ifstream file(folder.path() / "station.json");
    const std::string text{std::istreambuf_iterator<char>(file), {}};
    const Dictionary ports = *platform::valueFromJSON(text).value.value().dictionary();
    httpPort = static_cast<int>(ports.integer("http_port").value());
    httpsPort = static_cast<int>(ports.integer("https_port").value());
    datagramPort = static_cast<int>(ports.integer("datagram_port").value());
  }

  [[nodiscard]] std::string base() const { return "http://127.0.0.1:" + std::to_string(httpPort); }

  /// Opens a page and waits until it gets what comes.
  void openLive(const std::string& path) {
    browser.open(base() + path);
    ASSERT_TRUE(browser.waitUntil(kIsLive)) << browser.evaluateText("document.body.innerText");
  }

  void postEvent(const std::string& session, const Dictionary& fields = {}, int number = 1) const {
    Dictionary event{{"_sessionID", session},
                     {"_sender", "PH"},
                     {"_method", "4"},
                     {"_status", "2"},
                     {"_startTS", "60"},
                     {"_eventNumber", std::to_string(number)},
                     {"_productFamily", "Workbench"}};
    event.set("eventTime", std::to_string(1772366400 + number) + ".250");
    event.merge(fields);
    const Dictionary post{{"postTime", "1"}, {"clientId", "C"}, {"events", platform::Array{event}}};
    const auto result = httplib::Client("127.0.0.1", httpPort)
                            .Post("/events", platform::jsonFromValue(post).value(), "application/json");
    ASSERT_TRUE(result && result->status == 200);
  }

  void sendDatagram(std::uint32_t session, std::uint16_t number) const {
    DatagramFacts facts;
    facts.compType = 5;
    facts.timestamp = {1772366400 + number, 0};
    facts.sessionID = session;
    facts.eventID = number;
    const Datagram datagram(facts, Dictionary{{"rtt", 40 + number}});
    sockaddr_in address{};
    address.sin_family = AF_INET;
    address.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    address.sin_port = htons(static_cast<std::uint16_t>(datagramPort));
    const auto bytes = datagram.bytes();
    ASSERT_EQ(::sendto(datagrams.get(), bytes.data(), bytes.size(), 0,
                       reinterpret_cast<const sockaddr*>(&address), sizeof address),
              static_cast<ssize_t>(bytes.size()));
  }

  static std::string rowsOf(const std::string& section) {
    return "[...document.querySelectorAll('#" + section + " tbody tr')]";
  }
  /// Whether a section has just so many rows.
  static std::string hasRows(const std::string& section, int count) {
    return rowsOf(section) + ".length === " + std::to_string(count);
  }
  /// The texts of a row's cells, with bars between them.
  std::string row(const std::string& section, int index) {
    return browser.evaluateText("[..." + rowsOf(section) + "[" + std::to_string(index) +
                                "].cells].map(cell => cell.textContent.trim()).join('|')");
  }

  const fakes::TemporaryFolder folder;
  std::unique_ptr<ChildProcess> station;
  int httpPort = 0;
  int httpsPort = 0;
  int datagramPort = 0;
  const platform::FileDescriptor datagrams{::socket(AF_INET, SOCK_DGRAM | SOCK_CLOEXEC, 0)};
  HeadlessBrowser browser;
};

TEST_F(StationPageTest, ShowsEventsThatComeWhileItIsOpen) {
  postEvent("early");
  openLive("/sessions");
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
  postEvent("late", {{"speed", 2.5}, {"note", "hello"}}, 9);
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 2)));
  EXPECT_THAT(row("reports", 0), testing::MatchesRegex(R"(..:..:..\.250\|late\|HTTPS\|4\|2\|9\|.*)"));
  EXPECT_THAT(row("reports", 0), HasSubstr("speed=2.5"));
  EXPECT_TRUE(browser.waitUntil(hasRows("sessions", 2)));
  EXPECT_THAT(row("sessions", 0), HasSubstr("late|PH|Workbench|"));
  EXPECT_THAT(browser.evaluateText("document.getElementById('totals').textContent"),
              StartsWith("2 sessions · 2 events · 0 datagrams"));
  EXPECT_THAT(browser.problems(), IsEmpty());
}

TEST_F(StationPageTest, IsServedOverHTTPSToo) {
  browser.open("https://127.0.0.1:" + std::to_string(httpsPort) + "/sessions");
  EXPECT_TRUE(browser.waitUntil(kIsLive));
  postEvent("K");
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
  EXPECT_THAT(browser.problems(), IsEmpty());
}

TEST_F(StationPageTest, LoadsNothingFromElsewhere) {
  postEvent("K", {{"url", "https://elsewhere.example/a.png"}});
  openLive("/sessions");
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
  EXPECT_GE(browser.requestedURLs().size(), 7U);
  EXPECT_THAT(browser.requestedURLs(), Each(StartsWith(base() + "/")));
  // And could not: the browser reports what the page's policy refused.
  EXPECT_EQ(
      browser.evaluateText(
          "new Promise(resolve => { document.addEventListener('securitypolicyviolation', "
          "event => resolve(event.effectiveDirective)); new Image().src = 'http://127.0.0.1:1/a.png' })"),
      "img-src");
}

TEST_F(StationPageTest, ShowsWhateverAReportHoldsAsText) {
  const std::string trick = "<img src=x onerror=\"window['tricked']=1\"><script>window['tricked']=1</script>";
  postEvent(trick, {{trick, trick}, {"_sender", trick}, {"_productFamily", trick}, {"ClientName", trick}});
  openLive("/sessions");
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
  EXPECT_THAT(row("reports", 0), HasSubstr(trick + "=" + trick));
  EXPECT_THAT(row("sessions", 0), HasSubstr(trick));
  browser.open(base() +
               "/sessions?sequences=%3Cimg%20src%3Dx%20onerror%3D%22window%5B'tricked'%5D%3D1%22%3E");
  EXPECT_TRUE(browser.waitUntil(kIsLive));
  EXPECT_EQ(browser.evaluateText("document.querySelectorAll('img, main script').length"), "0");
  EXPECT_EQ(browser.evaluateText("typeof window.tricked"), "undefined");
  EXPECT_THAT(browser.problems(), IsEmpty());
}

TEST_F(StationPageTest, ShowsTheSessionOfADaemonsDisplayURL) {
  StorebagServer storebags;
  storebags.serve(
      "playhall",
      {{"dashboard",
        Dictionary{{"ip", "127.0.0.1"}, {"port", datagramPort}, {"display_url", base() + "/sessions"}}}},
      "max-age=600");
  const TestRoot root(storebags);
  TestDaemon daemon(root);
  postEvent("another");
  // Above 2^31: the daemon writes it as a negative number.
  const std::uint32_t id = 4'000'000'000;
  const auto connection = daemon.connect();
  ASSERT_EQ(connection->setSessionInfoSync(sessionInfo(id), std::nullopt).value, "received");
  ASSERT_EQ(connection->startConfigSync().value, (std::vector<std::string>{"dashboard"}));
  const std::string url = connection->fetchDisplayURLSync().value;
  EXPECT_THAT(url, HasSubstr("?sequences=-"));

  browser.open(url);
  ASSERT_TRUE(browser.waitUntil(kIsLive));
  connection->sendMessageSync(3, 4, Dictionary{{"speed", 7}});
  EXPECT_TRUE(browser.waitUntil("document.querySelector('#reports tbody').textContent.includes('speed=7')"));
  EXPECT_EQ(browser.evaluateText("document.getElementById('selection-title').textContent"),
            "Session 4000000000");
  EXPECT_TRUE(browser.evaluate(rowsOf("reports") + ".every(row => row.cells[1].textContent === '4000000000')")
                  .booleanValue());
  EXPECT_EQ(browser.evaluateText("document.querySelector('#sessions tr.chosen').dataset.key"), "4000000000");
}

TEST_F(StationPageTest, WaitsForASessionThatHasNotReported) {
  postEvent("another");
  openLive("/sessions?sequences=99&override=yes");
  const std::string note = "document.getElementById('selection-note').textContent";
  EXPECT_TRUE(browser.waitUntil(hasRows("sessions", 1)));
  EXPECT_TRUE(browser.waitUntil(note + ".startsWith('Waiting: ')"));
  EXPECT_TRUE(browser.evaluate(hasRows("reports", 0)).booleanValue());
  postEvent("1.99");
  EXPECT_TRUE(browser.waitUntil("!" + note + ".startsWith('Waiting')"));
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
}

TEST_F(StationPageTest, FollowsLinksToSessionsAndBack) {
  postEvent("A");
  postEvent("B");
  openLive("/sessions");
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 2)));
  static_cast<void>(browser.evaluate("document.querySelector('#sessions a[data-session=A]').click()"));
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
  EXPECT_EQ(browser.evaluateText("location.search"), "?sequences=A");
  EXPECT_THAT(row("reports", 0), HasSubstr("|A|"));
  static_cast<void>(browser.evaluate("history.back()"));
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 2)));
}

TEST_F(StationPageTest, DrawsSessionsUnderTheirParents) {
  openLive("/sessions");
  postEvent("G.P.K");
  postEvent("G.P");
  postEvent("alone");
  const std::string tree = rowsOf("sessions") + ".map(row => row.cells[0].textContent).join()";
  EXPECT_TRUE(browser.waitUntil(tree + " === 'alone,G,└ P,   └ K'")) << browser.evaluateText(tree);
  EXPECT_TRUE(browser.evaluate(rowsOf("sessions") + "[1].classList.contains('unseen')").booleanValue());
}

TEST_F(StationPageTest, DrawsNumbersOverTime) {
  openLive("/sessions?sequences=K");
  const std::vector<int> speeds{30, 10, 20, 50};
  for (int i = 0; i < 4; ++i) {
    postEvent("K", {{"speed", speeds[static_cast<std::size_t>(i)]}, {"wheels", 4}, {"note", "text"}}, i + 1);
    postEvent("another", {{"height", 10 * i}}, i + 1);
  }
  const std::string chart = "document.querySelector('.chart[data-field=speed]')";
  const std::string line = chart + "?.querySelector('polyline').getAttribute('points').split(' ')";
  EXPECT_TRUE(browser.waitUntil(line + ".length === 4"));
  EXPECT_EQ(browser.evaluateText("document.querySelectorAll('.chart').length"), "1");
  EXPECT_EQ(browser.evaluateText(line + ".map(point => point.split(',')[0]).join(' ')"),
            "0.0 100.0 200.0 300.0");
  EXPECT_TRUE(browser
                  .evaluate("(y => y[3] < y[0] && y[0] < y[2] && y[2] < y[1])(" + line +
                            ".map(point => Number(point.split(',')[1])))")
                  .booleanValue());
  const std::string value = chart + ".querySelector('.value').textContent";
  EXPECT_EQ(browser.evaluateText(value), "50");
  EXPECT_EQ(browser.evaluateText("document.querySelector('#charts dl').textContent"), "wheels 4");

  const std::string box = chart + ".querySelector('svg').getBoundingClientRect()";
  const double left = browser.evaluate(box + ".left").realValue().value_or(0);
  const double width = browser.evaluate(box + ".width").realValue().value_or(0);
  const double top = browser.evaluate(box + ".top").realValue().value_or(0);
  browser.moveMouse(left + width * 0.35, top + 10);
  EXPECT_TRUE(browser.waitUntil(value + " === '10'"));
  browser.moveMouse(1, 1);
  EXPECT_TRUE(browser.waitUntil(value + " === '50'"));
  static_cast<void>(browser.evaluate(chart + ".focus()"));
  browser.pressKey("ArrowLeft");
  browser.pressKey("ArrowLeft");
  EXPECT_EQ(browser.evaluateText(value), "20");
}

TEST_F(StationPageTest, PausesAndGoesOn) {
  openLive("/sessions");
  postEvent("K");
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
  static_cast<void>(browser.evaluate("document.getElementById('pause').click()"));
  postEvent("K", {}, 2);
  EXPECT_TRUE(browser.waitUntil("document.getElementById('behind').textContent === 'Paused, 1 new'"));
  EXPECT_TRUE(browser.evaluate(hasRows("reports", 1)).booleanValue());
  static_cast<void>(browser.evaluate("document.getElementById('pause').click()"));
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 2)));
}

TEST_F(StationPageTest, ShowsRepeatedAndMissingDatagrams) {
  openLive("/sessions?sequences=1201");
  for (const int number : {1, 2, 2, 5}) sendDatagram(1201, static_cast<std::uint16_t>(number));
  EXPECT_TRUE(browser.waitUntil(rowsOf("delivery") + "[0]?.cells[2].textContent === '4'"));
  EXPECT_EQ(row("delivery", 0), "1201|UDP|4|3|1|0|1|2: 3–4");
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 4)));
  EXPECT_THAT(row("reports", 1), HasSubstr("repeated"));
  EXPECT_TRUE(browser.waitUntil("document.querySelector('.chart[data-field=rtt]') !== null"));
}

TEST_F(StationPageTest, ShowsDatagramsThatWereLostOnPurpose) {
  startStation({"--lose", "100"});
  openLive("/sessions");
  sendDatagram(1201, 1);
  EXPECT_TRUE(browser.waitUntil(hasRows("delivery", 1)));
  EXPECT_EQ(row("delivery", 0), "1201|UDP|1|0|0|1|0|none");
  EXPECT_TRUE(browser.evaluate(rowsOf("reports") + "[0].classList.contains('lost')").booleanValue());
}

TEST_F(StationPageTest, LinksUploadedFiles) {
  openLive("/sessions?sequences=42");
  const auto sent = httplib::Client("127.0.0.1", httpPort)
                        .Post("/upload?sequence=42&uuid=ab&filename=a.log", "what happened", "text/plain");
  ASSERT_TRUE(sent && sent->status == 200);
  EXPECT_TRUE(browser.waitUntil(hasRows("files", 1)));
  EXPECT_THAT(row("files", 0), HasSubstr("|42|upload|a.log|13 B"));
  EXPECT_EQ(
      browser.evaluateText("fetch(document.querySelector('#files a[download]').href).then(it => it.text())"),
      "what happened");
}

TEST_F(StationPageTest, FitsAPhone) {
  postEvent(std::string(300, 's'), {{std::string(300, 'k'), std::string(300, 'v')}, {"speed", 1}});
  postEvent(std::string(300, 's'), {{"speed", 2}}, 2);
  sendDatagram(1201, 1);
  browser.setViewport({390, 844, HeadlessBrowser::Device::Phone});
  for (const std::string& path : {std::string("/sessions"), "/sessions?sequences=" + std::string(300, 's'),
                                  std::string("/sessions?sequences=99")}) {
    openLive(path);
    EXPECT_TRUE(browser.waitUntil("document.querySelectorAll('#sessions tbody tr').length === 2"));
    EXPECT_EQ(browser.evaluateText("document.documentElement.scrollWidth"), "390") << path;
    EXPECT_EQ(browser.evaluateText("[...document.querySelectorAll('.scroll')].filter("
                                   "it => it.scrollWidth > it.clientWidth).length"),
              "0")
        << path;
  }
  EXPECT_THAT(browser.screenshot(), StartsWith("\x89PNG"));
}

TEST_F(StationPageTest, GoesOnWithAStationThatStartsAnew) {
  postEvent("old");
  openLive("/sessions");
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
  station.reset();
  EXPECT_TRUE(browser.waitUntil("document.getElementById('connection').dataset.state === 'lost'"));
  startStation({});
  EXPECT_TRUE(browser.waitUntil(kIsLive));
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 0)));
  postEvent("new");
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
  EXPECT_THAT(row("reports", 0), HasSubstr("|new|"));
}

TEST_F(StationPageTest, GivesItsConnectionBackWhileNobodyLooks) {
  openLive("/sessions");
  const auto setHidden = [this](const std::string& hidden) {
    static_cast<void>(browser.evaluate("Object.defineProperty(document, 'hidden', {value: " + hidden +
                                       ", configurable: true}); "
                                       "document.dispatchEvent(new Event('visibilitychange'))"));
  };
  setHidden("true");
  EXPECT_TRUE(browser.waitUntil("document.getElementById('connection').dataset.state === 'connecting'"));
  postEvent("K");
  setHidden("false");
  EXPECT_TRUE(browser.waitUntil(kIsLive));
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
}

TEST_F(StationPageTest, SaysWhenTooManyPagesAreLive) {
  postEvent("K");
  std::vector<std::unique_ptr<httplib::Client>> clients;
  std::vector<std::thread> readers;
  for (int i = 0; i < 8; ++i) {
    auto& client = *clients.emplace_back(std::make_unique<httplib::Client>("127.0.0.1", httpPort));
    std::promise<void> opened;
    readers.emplace_back([&client, &opened] {
      bool isFirst = true;
      static_cast<void>(client.Get("/live", [&](const char*, std::size_t) {
        if (std::exchange(isFirst, false)) opened.set_value();
        return true;
      }));
    });
    opened.get_future().wait();
  }
  browser.open(base() + "/sessions");
  EXPECT_TRUE(
      browser.waitUntil("document.getElementById('connection').textContent.startsWith('not live: ')"));
  EXPECT_TRUE(browser.waitUntil(hasRows("reports", 1)));
  for (auto& client : clients) client->stop();
  for (auto& reader : readers) reader.join();
  EXPECT_TRUE(browser.waitUntil(kIsLive));
}

}  // namespace
}  // namespace tallyd::test
