#include "backends/dashboard/DashboardBackend.h"

#include <arpa/inet.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <new>

#include "backends/RequestBooking.h"
#include "backends/dashboard/DatagramSender.h"
#include "backends/dashboard/LocalLog.h"
#include "platform/Clock.h"
#include "platform/HTTPClient.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/UTF8.h"
#include "platform/property-list/KeyedArchive.h"

namespace tallyd {

using platform::asl_log;
using platform::Dictionary;
using platform::LogLevel;

namespace {

constexpr std::uint16_t kLogDataUploadedRespCode = 2;

std::optional<std::string> ownedString(const Dictionary& profile, std::string_view key) {
  const auto text = profile.string(key);
  return text ? std::optional<std::string>(*text) : std::nullopt;
}

/// What is no address becomes the broadcast address, to which no such socket connects.
sockaddr_in serverAddress(const std::string& ip, std::uint16_t port) {
  sockaddr_in address{};
  address.sin_family = AF_INET;
  address.sin_addr.s_addr = ::inet_addr(ip.c_str());
  address.sin_port = htons(port);
  return address;
}

bool namesServer(platform::Log& log, const Dictionary& profile) {
  if (!profile.string("ip")) {
    asl_log(log, LogLevel::Error, "Tally(DashboardBackend): can't resolve server IP");
    return false;
  }
  if (!profile.integer("port")) {
    asl_log(log, LogLevel::Error, "Tally(DashboardBackend): can't resolve server port");
    return false;
  }
  return true;
}

DatagramSender::Milliseconds timerPeriod(const platform::Value& reliable) {
  const std::int64_t milliseconds = reliable.integerValue().value_or(0);
  if (milliseconds <= 0) return DatagramSender::kDefaultPeriod;
  return std::min(DatagramSender::Milliseconds(milliseconds), DatagramSender::kLongestPeriod);
}

}  // namespace

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(
    const platform::Platform& platform, std::string_view name, const Payload& profile,
    const std::optional<std::string>& productFamily) {
  return initWithName(platform, name, profile, std::nullopt, 0, productFamily);
}

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(
    const platform::Platform& platform, std::string_view name, const std::optional<std::string>& serverIP,
    std::uint16_t serverPort, const std::optional<std::string>& productFamily) {
  return initWithName(platform, name, std::nullopt, serverIP, serverPort, productFamily);
}

std::shared_ptr<DashboardBackend> DashboardBackend::initWithName(
    const platform::Platform& platform, std::string_view name, const Payload& profile,
    const std::optional<std::string>& serverIP, std::uint16_t serverPort,
    const std::optional<std::string>& productFamily) {
  if (profile && !namesServer(platform.log, *profile)) return nullptr;
  auto socket = platform.datagrams.makeSocket();
  if (!socket) {
    asl_log(platform.log, LogLevel::Error, "Tally(DashboardBackend): socket() failed ({:d})", errno);
    return nullptr;
  }
  std::shared_ptr<DashboardBackend> backend(
      new DashboardBackend(platform, name, profile, productFamily, std::move(socket)));
  const bool isStarted =
      profile ? backend->startWithProfile() : backend->startWithServer(serverIP, serverPort);
  return isStarted ? backend : nullptr;
}

DashboardBackend::DashboardBackend(const platform::Platform& platform, std::string_view name,
                                   const Payload& profile, const std::optional<std::string>& productFamily,
                                   std::unique_ptr<platform::DatagramSocket> socket)
    : TallyBackend(platform, name, profile, productFamily),
      _sender(std::make_shared<DatagramSender>(platform.log, platform.queues, std::move(socket), _account)) {}

bool DashboardBackend::startWithProfile() {
  _usingProfile = true;
  _displayURL = ownedString(*_profile, "display_url");
  _postURL = ownedString(*_profile, "post_url");
  auto period = DatagramSender::kDefaultPeriod;
  if (const auto* reliable = _profile->find("reliable")) {
    _sender->useReliableUDP();
    period = timerPeriod(*reliable);
  }
  return _sender->start(
      serverAddress(*ownedString(*_profile, "ip"), static_cast<std::uint16_t>(*_profile->integer("port"))),
      period);
}

bool DashboardBackend::startWithServer(const std::optional<std::string>& serverIP, std::uint16_t serverPort) {
  if (!serverIP) {
    asl_log(_platform.log, LogLevel::Error, "Tally (DashboardBackend): initWitName will all null params.");
    return false;
  }
  _sender->useReliableUDP();
  return _sender->start(serverAddress(*serverIP, serverPort), DatagramSender::kDefaultPeriod);
}

DashboardBackend::~DashboardBackend() { _sender->drop(); }

void DashboardBackend::setAccount(std::shared_ptr<Account> account) {
  _sender->setAccount(account);
  TallyBackend::setAccount(std::move(account));
}

void DashboardBackend::cleanup() { _sender->cleanup(); }

TallyBackend::Result DashboardBackend::sendMessage(const Payload& payload, const timeval& timestamp,
                                                   std::uint16_t method, std::uint16_t respCode,
                                                   std::uint16_t eventID) {
  const DatagramFacts facts{.selfVersionMajor = _selfVersionMajor,
                            .compType = _compType,
                            .timestamp = timestamp,
                            .sessionID = _sessionID,
                            .clientVersion = _clientVersion,
                            .method = method,
                            .respCode = respCode,
                            .udid = _udid ? std::string_view(_udid) : std::string_view(),
                            .eventID = eventID,
                            .reliableUDP = _sender->reliableUDP(),
                            .usingProfile = _usingProfile};
  _account->start();
  try {
    auto datagram = std::make_shared<const Datagram>(facts, payload);
    Result line = writeLocalLog(datagram->bytes());
    _sender->send(std::move(datagram));
    return line;
  } catch (const std::bad_alloc&) {
    asl_log(_platform.log, LogLevel::Error, "Tally (DashboardBackend): can't malloc.");
    _account->drop(DropReason::OutOfMemory, 1, {{method, eventID}});
    return std::nullopt;
  }
}

bool DashboardBackend::uploadLogData(const platform::Array& logData) {
  _account->start();
  std::optional<platform::HTTPResult> result;
  try {
    result = postLogData(logData);
  } catch (const std::bad_alloc&) {
    asl_log(_platform.log, LogLevel::Error, "Tally (DashboardBackend): can't malloc.");
    _account->drop(DropReason::OutOfMemory);
    return false;
  }
  if (!result) {
    _account->drop(DropReason::NotUploadable);
    return false;
  }
  if (result->error || !result->response) {
    asl_log(_platform.log, LogLevel::Error, "Tally (DashboardBackend): Error uploading log data array ({})",
            result->error ? std::string_view(*result->error) : "(null)");
    _account->drop(DropReason::UploadFailed);
    return false;
  }
  _account->finish(1, answerOf(*result));
  reportUpload(platform::withBrokenUTF8Replaced(result->data.bytes()));
  return true;
}

std::optional<platform::HTTPResult> DashboardBackend::postLogData(const platform::Array& logData) const {
  if (!_postURL) {
    asl_log(_platform.log, LogLevel::Error, "Tally (DashboardBackend): Post URL for log data array is nil");
    return std::nullopt;
  }
  auto serialized = platform::archivedDataWithRootObject(logData);
  if (!serialized) {
    asl_log(_platform.log, LogLevel::Error,
            "Tally (DashboardBackend): Failed to serialize log data array for upload");
    return std::nullopt;
  }
  platform::Data archive(std::move(*serialized));
  const std::uint64_t bytes = archive.size();
  platform::HTTPResult result =
      _platform.http.sendSynchronousRequest({.url = *_postURL,
                                             .method = "POST",
                                             .headers = {{"Content-Type", "application/octet-stream"}},
                                             .body = std::move(archive)});
  _account->show("log-data", [&](TapLine& line) {
    line.add("url", *_postURL).add("bytes", bytes);
    addResult(line, result);
  });
  return result;
}

void DashboardBackend::reportUpload(std::string_view location) {
  asl_log(_platform.log, LogLevel::Debug, "Tally (DashboardBackend): Log data uploaded to {}", location);
  sendMessage(Dictionary{{"LogDataUploadLocation", location}}, _platform.clock.timeOfDay(), 0,
              kLogDataUploadedRespCode);
}

}  // namespace tallyd
