// tally-station: stands in for the storebag server and the collector while somebody develops.

#include <fmt/format.h>
#include <pthread.h>
#include <unistd.h>
#include <csignal>

#include <CLI/CLI.hpp>
#include <cstdio>
#include <exception>
#include <filesystem>
#include <iostream>
#include <optional>

#include "platform/JSON.h"
#include "station/BagFolder.h"
#include "station/EventCollector.h"
#include "station/Files.h"
#include "station/StationIdentity.h"
#include "station/StationServer.h"
#include "station/TerminalView.h"

namespace {

namespace station = tallyd::station;
using station::TerminalView;
using tallyd::platform::Dictionary;
using tallyd::platform::Value;

constexpr int kExitFailure = 1;
constexpr int kExitUsage = 2;

struct Options {
  std::filesystem::path directory;
  int httpsPort = 8443;
  std::optional<int> httpPort;
  long maxAgeSeconds = 60;
  bool quiet = false;
  bool json = false;

  [[nodiscard]] TerminalView::Events events() const {
    if (quiet) return TerminalView::Events::Hidden;
    return json ? TerminalView::Events::JSON : TerminalView::Events::Readable;
  }
};

/// "station.json", there as long as the station answers.
class ReadyFile {
 public:
  explicit ReadyFile(std::filesystem::path path) : _path(std::move(path)) { remove(); }
  ~ReadyFile() { remove(); }
  ReadyFile(const ReadyFile&) = delete;
  ReadyFile& operator=(const ReadyFile&) = delete;

  void write(const station::StationServer& server) const {
    const auto httpPort = server.httpPort();
    const Dictionary contents{{"https_port", server.httpsPort()},
                              {"http_port", httpPort ? Value(*httpPort) : Value()},
                              {"pid", static_cast<int>(::getpid())}};
    station::replaceFile(_path, tallyd::platform::jsonFromValue(contents).value_or("{}") + "\n", 0644);
  }

 private:
  void remove() const {
    std::error_code ignored;
    std::filesystem::remove(_path, ignored);
  }
  const std::filesystem::path _path;
};

/// The signals that end the station, held back in every thread until wait() takes one.
class EndSignals {
 public:
  EndSignals() {
    ::sigemptyset(&_signals);
    ::sigaddset(&_signals, SIGINT);
    ::sigaddset(&_signals, SIGTERM);
    ::pthread_sigmask(SIG_BLOCK, &_signals, nullptr);
  }
  void wait() const {
    int received = 0;
    ::sigwait(&_signals, &received);
  }

 private:
  sigset_t _signals{};
};

void configure(CLI::App& app, Options& options) {
  constexpr int kHighestPort = 65535;
  app.description("Stands in for the storebag server and the event collector during development.");
  app.footer(
      "Example:\n"
      "  tally-station --directory ~/station --port 8443 --http-port 8080\n"
      "serves ~/station/bags/playhall.plist as https://127.0.0.1:8443/bags/sorrel/playhall\n"
      "and shows what is posted to https://127.0.0.1:8443/events. Give ~/station/ca.pem to\n"
      "the daemon as etc/tally/ca.pem and ~/station/publicKey.der to the client framework.");
  app.set_version_flag("--version", "tally-station " TALLYD_VERSION);
  app.add_option("--directory", options.directory, "Folder of keys, certificates, bags/ and events.jsonl")
      ->required()
      ->type_name("DIR");
  app.add_option("--port", options.httpsPort, "HTTPS port; 0 lets the system choose")
      ->check(CLI::Range(0, kHighestPort))
      ->capture_default_str()
      ->type_name("N");
  app.add_option("--http-port", options.httpPort,
                 "Collect events over plain HTTP too; 0 lets the system choose")
      ->check(CLI::Range(0, kHighestPort))
      ->type_name("N");
  app.add_option("--max-age", options.maxAgeSeconds, "Seconds for which a storebag may be reused")
      ->check(CLI::NonNegativeNumber)
      ->capture_default_str()
      ->type_name("S");
  auto* quiet = app.add_flag("--quiet", options.quiet, "Show no events");
  app.add_flag("--json", options.json, "Show each event as one line of JSON")->excludes(quiet);
}

void run(const Options& options) {
  const EndSignals signals;  // Before any thread starts.
  TerminalView view(std::cout, std::cerr, options.events());
  const station::StationIdentity identity(options.directory);
  const ReadyFile readyFile(options.directory / "station.json");
  std::filesystem::create_directories(options.directory / "bags");

  const station::BagFolder bags(options.directory / "bags", identity.storebagKey());
  station::EventCollector collector(options.directory / "events.jsonl", view);
  std::optional<station::StationServer> server;
  server.emplace(station::StationServer::Settings{identity.certificateFile(), identity.certificateKeyFile(),
                                                  options.httpsPort, options.httpPort,
                                                  std::chrono::seconds(options.maxAgeSeconds)},
                 bags, collector, view);
  view.showNotice(fmt::format("listening on https://127.0.0.1:{}", server->httpsPort()));
  if (const auto port = server->httpPort())
    view.showNotice(fmt::format("listening on http://127.0.0.1:{}", *port));
  readyFile.write(*server);
  view.showNotice("ready");

  signals.wait();
  const auto servedStorebags = server->servedStorebags();
  server.reset();
  const auto totals = collector.totals();
  view.showNotice(fmt::format("{} events in {} posts, {} posts refused, {} storebags served", totals.events,
                              totals.posts, totals.refused, servedStorebags));
}

}  // namespace

int main(int argc, char** argv) {
  try {
    Options options;
    CLI::App app;
    configure(app, options);
    try {
      app.parse(argc, argv);
    } catch (const CLI::ParseError& error) {
      return app.exit(error) == 0 ? 0 : kExitUsage;
    }
    run(options);
    return 0;
  } catch (const std::exception& exception) {
    std::fprintf(stderr, "tally-station: %s\n", exception.what());
    return kExitFailure;
  }
}
