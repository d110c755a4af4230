#include "station/Station.h"

#include <fmt/format.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <system_error>

#include "platform/JSON.h"
#include "station/Files.h"
#include "station/Limits.h"

namespace tallyd::station {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr const char* kReadyFile = "station.json";

Value valueOf(std::optional<int> port) { return port ? Value(*port) : Value(); }

}  // namespace

Station::Station(const Options& options, TerminalView& view)
    : _directory(options.directory),
      _view(view),
      _lock(_directory),
      _identity(_directory),
      _feed(kFeedCapacityPerKind),
      _eventJournal(_directory / "events.jsonl", Feed::Kind::Event, view, _feed),
      _datagramJournal(_directory / "datagrams.jsonl", Feed::Kind::Datagram, view, _feed),
      _uploadJournal(_directory / "uploads.jsonl", Feed::Kind::Upload, view, _feed),
      _logDataJournal(_directory / "logdata.jsonl", Feed::Kind::LogData, view, _feed),
      _bags(_directory / "bags", _identity.storebagKey()),
      _events(_eventJournal, view),
      _uploads(_directory / "uploads", options.uploadAnswer, _clock, _uploadJournal, view),
      _logData(_clock, _logDataJournal, view),
      _storebagRoutes(_bags, std::chrono::seconds(options.maxAgeSeconds), view),
      _receivingRoutes(_events, _uploads, _logData),
      _pageModel(_feed, _clock, kPageRecordsPerKind),
      _page(_pageModel, _directory / "uploads") {
  removeReadyFile();
  std::filesystem::create_directories(_directory / "bags");
  if (options.datagramPort) {
    _datagrams.emplace(*options.datagramPort, options.network, _clock, _datagramJournal, view);
  }
  _server.emplace(StationServer::Settings{_identity.certificateFile(), _identity.certificateKeyFile(),
                                          options.httpsPort, options.httpPort},
                  routes());
  showAddresses(options);
  writeReadyFile();
  _view.showNotice("ready");
}

Station::~Station() {
  removeReadyFile();
  _pageModel.stop();  // Pages that wait for more would hold the server up.
  _server.reset();
  showTotals();
}

std::vector<StationServer::RouteGroup> Station::routes() {
  using Reach = StationServer::RouteGroup::Reach;
  return {{Reach::HTTPSOnly, [this](httplib::Server& server) { _storebagRoutes.addTo(server); }},
          {Reach::HTTPSAndHTTP, [this](httplib::Server& server) { _receivingRoutes.addTo(server); }},
          {Reach::HTTPSAndHTTP, [this](httplib::Server& server) { _page.addRoutes(server); }}};
}

void Station::showTotals() const {
  const auto posted = _events.totals();
  const auto uploaded = _uploads.totals();
  const auto archived = _logData.totals();
  _view.showNotice(fmt::format("{} events in {} posts, {} posts refused, {} storebags served", posted.events,
                               posted.posts, posted.refused, _storebagRoutes.served()));
  _view.showNotice(
      fmt::format("{} files of {} bytes uploaded, {} refused; {} archives of log data, {} refused",
                  uploaded.files, uploaded.bytes, uploaded.refused, archived.archives, archived.refused));
  if (_datagrams) _view.showNotice(readableTotals(_datagrams->totals()));
}

void Station::showAddresses(const Options& options) const {
  _view.showNotice(fmt::format("listening on https://127.0.0.1:{}", _server->httpsPort()));
  if (const auto port = _server->httpPort()) {
    _view.showNotice(fmt::format("listening on http://127.0.0.1:{}", *port));
  }
  if (!_datagrams) return;
  _view.showNotice(fmt::format("receiving datagrams on 127.0.0.1:{}", _datagrams->port()));
  if (options.losesOnPurpose()) {
    _view.showNotice(fmt::format("playing a bad network; --seed {} plays it again", options.network.seed));
  }
}

void Station::writeReadyFile() const {
  const Dictionary contents{
      {"https_port", _server->httpsPort()},
      {"http_port", valueOf(_server->httpPort())},
      {"datagram_port", valueOf(_datagrams ? std::optional(_datagrams->port()) : std::nullopt)},
      {"pid", static_cast<int>(::getpid())}};
  replaceFile(_directory / kReadyFile, platform::jsonFromValue(contents).value_or("{}") + "\n", 0644);
}

void Station::removeReadyFile() const {
  std::error_code ignored;
  std::filesystem::remove(_directory / kReadyFile, ignored);
}

}  // namespace tallyd::station
