#include "station/StationPage.h"

#include <httplib.h>

#include <algorithm>
#include <array>
#include <fstream>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>

#include "station/HTTPStatus.h"
#include "station/IncomingFile.h"
#include "station/Limits.h"
#include "station/PageFiles.h"

namespace tallyd::station {

namespace {

using httplib::Request;
using httplib::Response;

constexpr int kFound = 302;
constexpr int kNotModified = 304;
constexpr int kForbidden = 403;
constexpr int kMisdirected = 421;
constexpr int kUnavailable = 503;

constexpr const char* kPlainText = "text/plain; charset=utf-8";
constexpr const char* kRetryAfterSeconds = "5";
/// Only what the station itself serves, and no code or style within the page.
constexpr const char* kContentSecurityPolicy =
    "default-src 'none'; script-src 'self'; style-src 'self'; connect-src 'self'; img-src 'self'; "
    "base-uri 'none'; form-action 'none'; frame-ancestors 'none'";

std::string typeOf(std::string_view name) {
  constexpr std::array<std::pair<std::string_view, const char*>, 4> kTypes{{
      {".html", "text/html; charset=utf-8"},
      {".css", "text/css; charset=utf-8"},
      {".js", "text/javascript; charset=utf-8"},
      {".svg", "image/svg+xml"},
  }};
  for (const auto& [ending, type] : kTypes)
    if (name.ends_with(ending)) return type;
  return "application/octet-stream";
}

void refuse(Response& response, int status, const char* problem) {
  response.status = status;
  response.set_content(problem, kPlainText);
}

bool isLoopbackName(std::string_view host) {
  // The port goes; an IPv6 address keeps its brackets.
  if (const std::size_t colon = host.rfind(':');
      colon != std::string_view::npos && host.find(']', colon) == std::string_view::npos)
    host = host.substr(0, colon);
  return host == "127.0.0.1" || host == "localhost" || host == "[::1]";
}

/// Whether the request may be answered at all. A page of another site may have its own name resolved to this
/// machine, or name this machine itself.
bool admit(const Request& request, Response& response) {
  response.set_header("Content-Security-Policy", kContentSecurityPolicy);
  response.set_header("X-Content-Type-Options", "nosniff");
  response.set_header("Referrer-Policy", "no-referrer");
  response.set_header("Cross-Origin-Resource-Policy", "same-origin");
  if (!isLoopbackName(request.get_header_value("Host"))) {
    refuse(response, kMisdirected, "The station is reached as 127.0.0.1 or localhost only.\n");
    return false;
  }
  const bool isNavigation = request.get_header_value("Sec-Fetch-Mode") == "navigate";
  if (!isNavigation && request.get_header_value("Sec-Fetch-Site") == "cross-site") {
    refuse(response, kForbidden, "Not for other sites.\n");
    return false;
  }
  return true;
}

/// A handler for requests that are admitted.
template <class Handler>
httplib::Server::Handler guarded(Handler handler) {
  return [handler = std::move(handler)](const Request& request, Response& response) {
    if (admit(request, response)) handler(request, response);
  };
}

void serveFile(const PageFile& file, const Request& request, Response& response) {
  const std::string tag = '"' + std::string(file.tag) + '"';
  response.set_header("ETag", tag);
  response.set_header("Cache-Control", "no-cache");  // Kept, and asked for again: a new station has new ones.
  if (request.get_header_value("If-None-Match") == tag) {
    response.status = kNotModified;
    return;
  }
  response.set_content(file.bytes.data(), file.bytes.size(), typeOf(file.name));
}

bool write(httplib::DataSink& sink, const std::string& text) { return sink.write(text.data(), text.size()); }

/// One page's stream: waits for news and writes them, again and again.
bool writeNext(const PageModel& model, PagePosition& position, httplib::DataSink& sink) {
  constexpr std::chrono::milliseconds kLook{1000};
  auto waited = std::chrono::milliseconds(0);
  while (!model.waitForMore(position, kLook)) {
    waited += kLook;
    if (!model.rest(std::chrono::milliseconds(0))) {
      sink.done();
      return true;
    }
    if (!sink.is_writable()) return false;
    if (waited >= StationPage::kHeartbeat) return write(sink, ":\n\n");
  }
  const PageUpdate update = model.updateSince(position);
  position = update.position;
  if (!write(sink, "id: " + textOfPosition(position) + "\ndata: " + update.json + "\n\n")) return false;
  static_cast<void>(model.rest(StationPage::kPause));
  return true;
}

}  // namespace

/// Counts the live pages.
class StationPage::LiveSlots {
 public:
  /// A place among them while it lives; null when all are taken.
  static std::shared_ptr<void> take(const std::shared_ptr<LiveSlots>& slots) {
    const std::lock_guard lock(slots->_mutex);
    if (slots->_taken == kMostLivePages) return nullptr;
    ++slots->_taken;
    return {slots.get(), [slots](void*) { slots->giveBack(); }};
  }

 private:
  void giveBack() {
    const std::lock_guard lock(_mutex);
    --_taken;
  }
  std::mutex _mutex;
  std::size_t _taken = 0;
};

StationPage::StationPage(PageModel& model, std::filesystem::path uploads)
    : _model(model), _uploads(std::move(uploads)), _slots(std::make_shared<LiveSlots>()) {}

StationPage::~StationPage() = default;

void StationPage::addRoutes(httplib::Server& server) {
  addFiles(server);
  server.Get("/",
             guarded([](const Request&, Response& response) { response.set_redirect("/sessions", kFound); }));
  server.Get("/api/snapshot", guarded([this](const Request&, Response& response) {
               response.set_header("Cache-Control", "no-store");
               response.set_content(_model.snapshot(), "application/json");
             }));
  server.Get("/live",
             guarded([this](const Request& request, Response& response) { serveLive(request, response); }));
  server.Get(R"(/uploads/(.+))", guarded([this](const Request& request, Response& response) {
               serveUpload(request.matches[1], response);
             }));
}

void StationPage::addFiles(httplib::Server& server) {
  for (const PageFile& file : pageFiles()) {
    const bool isPage = file.name == "index.html";
    const std::string path = isPage ? "/sessions" : "/sessions/" + std::string(file.name);
    server.Get(path, guarded([&file](const Request& request, Response& response) {
                 serveFile(file, request, response);
               }));
  }
}

void StationPage::serveLive(const Request& request, Response& response) const {
  auto slot = LiveSlots::take(_slots);
  if (!slot) {
    response.set_header("Retry-After", kRetryAfterSeconds);
    return refuse(response, kUnavailable, "As many pages are live as may be.\n");
  }
  const std::string after = request.has_header("Last-Event-ID") ? request.get_header_value("Last-Event-ID")
                                                                : request.get_param_value("after");
  response.set_header("Cache-Control", "no-store");
  response.set_chunked_content_provider(
      "text/event-stream",
      [this, slot = std::move(slot), position = pagePositionFrom(after).value_or(PagePosition())](
          std::size_t, httplib::DataSink& sink) mutable { return writeNext(_model, position, sink); });
}

void StationPage::serveUpload(const std::string& name, Response& response) const {
  const std::filesystem::path path = _uploads / name;
  std::error_code problem;
  const auto status = std::filesystem::symlink_status(path, problem);
  const bool isThere = name == safeFileName(name) && std::filesystem::is_regular_file(status);
  auto file = std::make_shared<std::ifstream>(isThere ? path.string() : std::string(), std::ios::binary);
  const auto size = isThere ? std::filesystem::file_size(path, problem) : 0;
  if (!isThere || problem || !*file) return refuse(response, kNotFound, "There is no such upload.\n");
  // Whatever is in it: to be saved, not shown.
  response.set_header("Content-Disposition", "attachment; filename=\"" + name + "\"");
  response.set_header("Cache-Control", "no-store");
  if (size == 0) return response.set_content("", "application/octet-stream");
  response.set_content_provider(static_cast<std::size_t>(size), "application/octet-stream",
                                [file](std::size_t offset, std::size_t length, httplib::DataSink& sink) {
                                  std::array<char, 65'536> buffer;
                                  file->seekg(static_cast<std::streamoff>(offset));
                                  file->read(buffer.data(),
                                             static_cast<std::streamsize>(std::min(length, buffer.size())));
                                  const auto count = static_cast<std::size_t>(file->gcount());
                                  return count > 0 && sink.write(buffer.data(), count);
                                });
}

}  // namespace tallyd::station
