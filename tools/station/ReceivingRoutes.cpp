#include "station/ReceivingRoutes.h"

#include <httplib.h>

#include <exception>
#include <optional>
#include <string>

#include "station/HTTPStatus.h"
#include "station/Limits.h"
#include "station/RequestBody.h"

namespace tallyd::station {

namespace {

constexpr const char* kEventsPath = R"(/events(?:/.*)?)";
constexpr const char* kUploadPath = "/upload";
constexpr const char* kLogDataPath = "/log-data";

using httplib::ContentReader;
using httplib::Request;
using httplib::Response;

void give(Response& response, const Answer& answer) {
  response.status = answer.status;
  if (!answer.body.empty()) response.set_content(answer.body, "text/plain; charset=utf-8");
}

std::optional<std::string> parameter(const Request& request, const char* name) {
  if (!request.has_param(name)) return std::nullopt;
  return request.get_param_value(name);
}

Answer takeEvents(EventCollector& events, const Request& request, const ContentReader& reader) {
  std::string json;
  const BodyResult body =
      readBody(request, reader, kMaximumPostBytes, [&json](std::string_view part) { json += part; });
  if (body.status != 0) return events.refuse(body.status, body.problem);
  return events.collect(json, body.encoding);
}

Answer takeUpload(UploadReceiver& uploads, const Request& request, const ContentReader& reader) {
  // Made within the sink: a folder that can't be written is a problem of the request like any other.
  std::optional<IncomingFile> file;
  const auto begin = [&] {
    if (!file) uploads.begin(file);
  };
  const BodyResult body = readBody(request, reader, kMaximumUploadBytes, [&](std::string_view part) {
    begin();
    file->write(part);
  });
  if (body.status != 0) return uploads.refuse(body.status, body.problem);
  try {
    begin();
  } catch (const std::exception& exception) {
    return uploads.refuse(kServerError, exception.what());
  }
  return uploads.finish(*file, {.uuid = parameter(request, "uuid"),
                                .sequence = parameter(request, "sequence"),
                                .description = parameter(request, "description"),
                                .filename = parameter(request, "filename"),
                                .encoding = body.encoding});
}

Answer takeLogData(LogDataReceiver& logData, const Request& request, const ContentReader& reader) {
  std::string archive;
  const BodyResult body =
      readBody(request, reader, kMaximumLogDataBytes, [&archive](std::string_view part) { archive += part; });
  if (body.status != 0) return logData.refuse(body.status, body.problem);
  return logData.receive(archive);
}

}  // namespace

void ReceivingRoutes::addTo(httplib::Server& server) {
  server.Post(kEventsPath, [this](const Request& request, Response& response, const ContentReader& reader) {
    give(response, takeEvents(_events, request, reader));
  });
  server.Post(kUploadPath, [this](const Request& request, Response& response, const ContentReader& reader) {
    give(response, takeUpload(_uploads, request, reader));
  });
  server.Post(kLogDataPath, [this](const Request& request, Response& response, const ContentReader& reader) {
    give(response, takeLogData(_logData, request, reader));
  });
}

}  // namespace tallyd::station
