// The web page for those who watch what their reports look like.
#pragma once

#include <chrono>
#include <cstddef>
#include <filesystem>
#include <memory>

#include "station/PageModel.h"

namespace httplib {
class Server;
struct Request;
struct Response;
}  // namespace httplib

namespace tallyd::station {

/// Serves the page, what it shows, and the files that were uploaded:
///
///  - GET /sessions: the page; with ?sequences=ID, that of one session. GET / leads there.
///  - GET /sessions/FILE: what the page is made of.
///  - GET /api/snapshot: sessions and records as JSON.
///  - GET /live?after=POSITION: what comes after a snapshot's position, as server-sent events (the HTML
///  standard, section 9.2), from "Last-Event-ID" on where there is one. Each holds a thread of the server's:
///  the page beyond kMostLivePages gets 503 with "Retry-After".
///  - GET /uploads/NAME: an uploaded file, to be saved.
///
/// Nothing of it may be read by other web sites: requests for another host than this machine's loopback names
/// get 421, and those that other sites cause 403.
///
/// Threading: any thread.
class StationPage {
 public:
  /// Between two messages, so that a flood of reports comes in few of them.
  static constexpr std::chrono::milliseconds kPause{100};
  /// A page that is gone is noticed by then, unless a firewall swallows what is sent to it.
  static constexpr std::chrono::milliseconds kHeartbeat{3000};

  /// Borrows the model.
  /// @param uploads  The folder of uploaded files; need not be there.
  StationPage(PageModel& model, std::filesystem::path uploads);
  ~StationPage();

  /// Adds the routes to a server that has not started. This object must outlive it; the model must be
  /// stopped before the server is, which waits for open pages otherwise.
  void addRoutes(httplib::Server& server);

 private:
  class LiveSlots;

  void addFiles(httplib::Server& server);
  void serveLive(const httplib::Request& request, httplib::Response& response) const;
  void serveUpload(const std::string& name, httplib::Response& response) const;

  PageModel& _model;
  const std::filesystem::path _uploads;
  const std::shared_ptr<LiveSlots> _slots;
};

}  // namespace tallyd::station
