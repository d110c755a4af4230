#include "backends/https-post/HTTPSPostBackend.h"

#include <fmt/format.h>

#include <new>

#include "backends/RequestBooking.h"
#include "backends/https-post/EventRecord.h"
#include "backends/https-post/PostBody.h"
#include "framework/Tally.h"
#include "framework/TallyKeys.h"
#include "platform/Clock.h"
#include "platform/HTTPClient.h"
#include "platform/Locale.h"
#include "platform/Log.h"
#include "platform/Platform.h"
#include "platform/SerialQueue.h"
#include "platform/Settings.h"
#include "storebag/StorebagEnvironment.h"
#include "support/GzipCompression.h"

namespace tallyd {

using platform::asl_log;
using platform::HTTPFailure;
using platform::LogLevel;
using platform::Value;

namespace {

constexpr std::uint16_t kSessionStopRespCode = 1;

/// Whether the device sets its clock by itself, as far as the time daemon's preferences tell.
bool isTimeSetAutomatically(const platform::Platform& platform) {
  const auto automatic = platform.preferences.value("com.quillon.timed", "TMAutomaticTimeZoneEnabled");
  return !automatic || automatic->booleanValue();
}

void logWithdrawal(platform::Log& log, std::size_t events) {
  asl_log(log, LogLevel::Info, "Tally(HTTPSPostBackend): consent has been withdrawn, not posting {} events",
          events);
}

// On the completion queue, after the backend may have gone: these know log and books only.

void logPostError(platform::Log& log, std::size_t events, const platform::HTTPResult& result) {
  if (!result.error) return;
  if (result.failure == HTTPFailure::Withdrawn) return logWithdrawal(log, events);
  asl_log(log, LogLevel::Error, "Tally(sendMessage) post error: {}", *result.error);
}

DropReason dropReasonOf(HTTPFailure failure) {
  switch (failure) {
    case HTTPFailure::TooMuchWaits:
      return DropReason::MemoryBound;
    case HTTPFailure::Withdrawn:
      return DropReason::ConsentWithdrawn;
    default:
      return DropReason::PostFailed;
  }
}

void bookPost(Account& account, std::size_t events, const platform::HTTPResult& result) {
  if (!result.error) return account.finish(events, answerOf(result));
  account.drop(dropReasonOf(result.failure), events);
}

}  // namespace

std::shared_ptr<HTTPSPostBackend> HTTPSPostBackend::initWithName(
    const platform::Platform& platform, std::string_view name, const Payload& profile,
    const std::optional<std::string>& productFamily) {
  if (!profile || !productFamily) return nullptr;
  if (!profile->array("clients")) {
    asl_log(platform.log, LogLevel::Error, "Tally(HTTPSPostBackend): can't find the client list.");
    return nullptr;
  }
  return std::shared_ptr<HTTPSPostBackend>(new HTTPSPostBackend(platform, name, profile, productFamily));
}

HTTPSPostBackend::HTTPSPostBackend(const platform::Platform& platform, std::string_view name,
                                   const Payload& profile, const std::optional<std::string>& productFamily)
    : TallyBackend(platform, name, profile, productFamily),
      _queue(platform.queues.makeSerialQueue("com.quillon.Tally.httpsPost")),
      _postURL(httpsPostURLFromPreferences(platform)),
      _dnuEnabled(DiagnosticLogSubmissionEnabled(platform)) {
  if (_postURL) asl_log(_platform.log, LogLevel::Debug, "Using user default '{}' for postURL", *_postURL);
  if (const auto url = profile->string("display_url")) _displayURL = std::string(*url);
}

HTTPSPostBackend::~HTTPSPostBackend() {
  if (!_batchEvents || !_batchedEvents || _state != ReportingStateOn) {
    if (_batchedEvents) _account->dropHeld(DropReason::CleanUp, _batchedEvents->size());
    return;
  }
  const auto document = takeBatchForPost();
  const Result posted = document ? postJsonMessage(*document) : std::nullopt;
  asl_log(_platform.log, LogLevel::Debug, "dealloc: flush batched events, {}", posted.value_or("(null)"));
}

TallyBackend::Result HTTPSPostBackend::sendMessage(const Payload& payload, const timeval& timestamp,
                                                   std::uint16_t method, std::uint16_t respCode,
                                                   std::uint16_t eventID) {
  const MessageNumbers numbers{method, eventID};
  if (_state == ReportingStateOff) {
    _account->dropNew(DropReason::StateOff, 1, numbers);
    return std::nullopt;
  }
  EventRecord event =
      createEventDictfromPayload(respCode == kSessionStopRespCode ? stopMessagePayload(payload) : payload,
                                 timestamp, method, respCode, eventID);
  asl_log(_platform.log, LogLevel::Debug, "Tally (sendMessage): {:d}, {:d}, {:d}", _state, _batchEvents,
          _requireUserInfo);
  if (_state == ReportingStatePending || _batchEvents || !hasRequiredUserInfo()) {
    batchEvent(std::move(event), numbers);
    return std::nullopt;
  }
  if (isConsentWithdrawn()) {
    logWithdrawal(_platform.log, 1);
    _account->dropNew(DropReason::ConsentWithdrawn, 1, numbers);
    return std::nullopt;
  }
  Events events;
  events.push_back(std::move(event));
  _account->start();
  const auto document = documentOf(events);
  return document ? postJsonMessage(*document) : std::nullopt;
}

TallyBackend::Result HTTPSPostBackend::flushMessages() {
  if (!_batchEvents || !_batchedEvents || _state != ReportingStateOn || !hasRequiredUserInfo())
    return std::nullopt;
  const auto document = takeBatchForPost();
  _eventMethodCounts.clear();
  return document ? postJsonMessage(*document) : std::nullopt;
}

void HTTPSPostBackend::setCorrelatedSessionID(const std::string& correlatedSessionID) {
  setCombinedSessionIDString(correlatedSessionID);
  if (!_batchedEvents) return;
  const Value sessionID(correlatedSessionID);
  for (EventRecord& event : *_batchedEvents) event.setSessionID(sessionID);
}

void HTTPSPostBackend::updateState() {
  _state = updateBackendState();
  if (_batchEvents || !_batchedEvents || _state != ReportingStateOn) return;
  // Unlike flushMessages, this way out leaves the counts by method as they are.
  if (const auto document = takeBatchForPost()) postJsonMessage(*document);
}

std::int32_t HTTPSPostBackend::updateBackendState() {
  const ReportingDecision decision =
      decideReporting({.profile = *_profile,
                       .requireUserInfo = _requireUserInfo,
                       .userInfo = _userInfoDict,
                       .consented = _dnuEnabled,
                       .samplingFactor = _samplingFactor,
                       .productFamily = _productFamily,
                       .countryCode = _requireUserInfo ? _platform.locale.countryCode() : std::nullopt});
  if (decision.entry) applyEntry(decision);
  return decision.state;
}

void HTTPSPostBackend::applyEntry(const ReportingDecision& decision) {
  const Dictionary& entry = *decision.entry;
  const auto listText = [&entry](std::string_view key) {
    const platform::Array* list = entry.array(key);
    return list ? Value(*list).description() : std::string("(null)");
  };
  setHierarchy(*decision.hierarchy);
  _dnuType = *decision.dnuType;
  switch (decision.reason) {
    case ReportingReason::NoConsent:
      asl_log(_platform.log, LogLevel::Debug, "Tally(updateBackendState): reporting disabled by DNU: {}.",
              decision.override_dnu);
      return;
    case ReportingReason::LocaleNotListed:
      asl_log(_platform.log, LogLevel::Debug, "Tally(updateBackendState): ({}) isn't in locale list {}",
              _platform.locale.countryCode().value_or("(null)"), listText("locale_whitelist"));
      return;
    case ReportingReason::DeviceNotListed:
      asl_log(_platform.log, LogLevel::Debug, "Tally(updateBackendState): ({}) isn't in device list {}",
              _productFamily.value_or("(null)"), listText("device_whitelist"));
      return;
    case ReportingReason::NoFilters:
      asl_log(_platform.log, LogLevel::Warning, "Tally(updateBackendState): filters are required.");
      return;
    default:
      applySampledEntry(decision);
  }
}

void HTTPSPostBackend::applySampledEntry(const ReportingDecision& decision) {
  _filters.createFiltersFromArray(*decision.filters);
  _samplingThreshold = decision.samplingThreshold;
  if (decision.eventThreshold) {
    _eventThreshold = *decision.eventThreshold;
    asl_log(_platform.log, LogLevel::Debug, "HTTPSPostBackend(updateBackendState): event_threshold set to {}",
            _eventThreshold);
  } else {
    asl_log(_platform.log, LogLevel::Debug,
            "HTTPSPostBackend(updateBackendState): event_threshold value not found in storebag - defaulting "
            "to {}",
            kDefaultEventThreshold);
  }
  if (decision.extrasOnInternal) {
    _extrasOnInternal = *decision.extrasOnInternal;
    asl_log(_platform.log, LogLevel::Debug,
            "HTTPSPostBackend(updateBackendState): extras on internal is set to {}", _extrasOnInternal);
  }
  asl_log(_platform.log, LogLevel::Debug, "Tally (updateBackendState): client found {}, state? {}, {:f}",
          decision.entry->string("client").value_or("(null)"), decision.state, _samplingFactor);
  if (decision.postURL) takePostURL(*decision.postURL);
}

void HTTPSPostBackend::takePostURL(const std::string& storebagURL) {
  if (auto preferred = httpsPostURLFromPreferences(_platform)) {
    _postURL = std::move(preferred);
    asl_log(_platform.log, LogLevel::Debug, "Using user default '{}' for postURL", *_postURL);
    return;
  }
  _postURL = storebagURL;
  asl_log(_platform.log, LogLevel::Debug, "Defaulting to '{}' for postURL", storebagURL);
}

TallyBackend::Payload HTTPSPostBackend::stopMessagePayload(const Payload& payload) const {
  asl_log(_platform.log, LogLevel::Debug,
          "HTTPSPostBackend: Adding dnu type and sampling threshold to SESSION_TYPE_STOP message dictionary");
  if (!payload) {
    asl_log(_platform.log, LogLevel::Critical,
            "HTTPSPostBackend: SESSION_TYPE_STOP message dictionary is nil");
    return payload;
  }
  Dictionary stop = *payload;
  stop.set("Opt", static_cast<std::int64_t>(_dnuType));
  stop.set("SamplingThreshold", _samplingThreshold.value_or(Value(-1)));
  stop.set("AutomaticTimeSet", isTimeSetAutomatically(_platform));
  return stop;
}

EventRecord HTTPSPostBackend::createEventDictfromPayload(const Payload& payload, const timeval& timestamp,
                                                         std::uint16_t method, std::uint16_t respCode,
                                                         std::uint16_t eventID) {
  const fmt::format_int plainSessionID(_sessionID);
  const std::string_view sessionID = _combinedSessionIDString
                                         ? std::string_view(*_combinedSessionIDString)
                                         : std::string_view(plainSessionID.data(), plainSessionID.size());
  return _records.record(payload, {.sessionStart = _startTimeStamp,
                                   .sender = codeForClientType(_compType),
                                   .clientVersion = _clientVersion,
                                   .sessionID = sessionID,
                                   .eventNumber = eventID,
                                   .method = method,
                                   .status = respCode,
                                   .eventTime = secondsFromTimeval(timestamp),
                                   .productFamily = _productFamily,
                                   .productModel = _hardwareType,
                                   .osVersion = _productVersion,
                                   .build = _buildVersion,
                                   .isInternal = _isInternal,
                                   .reportVersionMajor = _selfVersionMajor,
                                   .reportVersionMinor = _selfVersionMinor,
                                   .timezoneOffset = _platform.locale.offsetFromGMT(_platform.clock.now())});
}

void HTTPSPostBackend::batchEvent(EventRecord event, const MessageNumbers& numbers) {
  if (!_batchedEvents) _batchedEvents.emplace();
  const std::uint16_t method = numbers.method;
  std::int32_t& count = _eventMethodCounts[method];
  if (count > _eventThreshold) {
    asl_log(_platform.log, LogLevel::Debug, "HTTPSPostBackend: Dropping batched event ({})", method);
    _account->dropNew(DropReason::MethodLimit, 1, numbers);
    return;
  }
  _batchedEvents->push_back(std::move(event));
  _account->hold();
  ++count;
}

void HTTPSPostBackend::recheckConsent() {
  if (_dnuEnabled) _consentWatch = std::make_shared<ConsentWatch>(_platform);
}

std::optional<HTTPSPostBackend::Document> HTTPSPostBackend::takeBatchForPost() {
  Events events = std::move(*_batchedEvents);
  _batchedEvents.reset();
  if (isConsentWithdrawn()) {
    logWithdrawal(_platform.log, events.size());
    _account->dropHeld(DropReason::ConsentWithdrawn, events.size());
    return std::nullopt;
  }
  _account->startHeld(events.size());
  return documentOf(events);
}

std::optional<HTTPSPostBackend::Document> HTTPSPostBackend::documentOf(const Events& events) const {
  try {
    return createMessageForPost(prepareEventArrayForMessage(events).view(), events.size());
  } catch (const std::bad_alloc&) {
    dropForMemory(events.size());
    return std::nullopt;
  }
}

platform::JSONText HTTPSPostBackend::prepareEventArrayForMessage(const Events& events) const {
  constexpr std::size_t kUsualEventBytes = 1024;
  platform::JSONText array(events.size() * kUsualEventBytes);
  EventFields fields;
  array.startArray();
  for (const EventRecord& event : events) {
    event.fieldsInto(fields);
    if (_userInfoDict) fields.merge(*_userInfoDict);
    _filters.filterEvent(fields);
    sanitizeEventForJSON(fields, _platform.log);
    appendEvent(array, fields);
  }
  array.endArray();
  return array;
}

void HTTPSPostBackend::dropForMemory(std::size_t events) const {
  asl_log(_platform.log, LogLevel::Error, "Tally(HTTPSPostBackend): out of memory for a post of {} events",
          events);
  _account->drop(DropReason::OutOfMemory, events);
}

HTTPSPostBackend::Document HTTPSPostBackend::createMessageForPost(std::string_view eventArray,
                                                                  std::size_t count) const {
  const timeval now = _platform.clock.timeOfDay();
  auto clientIdentifier = Tally(_platform).getPersistentIdentifierForDNU(_dnuType == DNUTypeConsent);
  if (_extrasOnInternal != 0 && _isInternal) clientIdentifier = _udid;
  Document document{postBody(now, clientIdentifier, eventArray), clientIdentifier ? count : 0};
  if (!clientIdentifier) _account->drop(DropReason::NoClientIdentifier, count);
  return document;
}

TallyBackend::Result HTTPSPostBackend::postJsonMessage(const Document& document) const {
  try {
    platform::HTTPRequest request = requestFor(document.json);
    auto completion = completionFor(document, request);
    _platform.http.sendAsynchronousRequest(std::move(request), _queue, std::move(completion));
  } catch (const std::bad_alloc&) {
    dropForMemory(document.events);
    return std::nullopt;
  }
  return _dnuType == DNUTypeConsent && _dnuEnabled ? Result(document.json) : std::nullopt;
}

platform::HTTPRequest HTTPSPostBackend::requestFor(const std::string& json) const {
  auto compressed = gzipDeflate(json, _platform.log);
  platform::HTTPRequest request;
  request.url = _postURL.value_or("");
  request.method = "POST";
  const auto addUserInfoHeader = [&](const char* header, std::string_view key) {
    const auto value = _userInfoDict ? _userInfoDict->string(key) : std::nullopt;
    if (value) request.headers.emplace_back(header, *value);
  };
  addUserInfoHeader("X-RTC-Client-Name", kTallyUserInfoClientName);
  addUserInfoHeader("X-RTC-Service-Name", kTallyUserInfoServiceName);
  if (_isInternal) request.headers.emplace_back("X-RTC-Internal-Build", "1");
  request.headers.emplace_back("Accept", "application/json");
  request.headers.emplace_back("Content-Type", "application/json");
  const bool plain = !compressed || compressed->size() >= json.size();
  request.body = plain ? platform::Data(json) : platform::Data(std::move(*compressed));
  request.headers.emplace_back("Content-Length", std::to_string(request.body.size()));
  if (!plain) request.headers.emplace_back("Content-Encoding", "gzip");
  if (_consentWatch) request.mayBeSentAgain = [watch = _consentWatch] { return !watch->isWithdrawn(); };
  return request;
}

platform::HTTPClient::Completion HTTPSPostBackend::completionFor(const Document& document,
                                                                 const platform::HTTPRequest& request) const {
  Tap* const tap = _account->listeningTap();
  const std::uint64_t post = tap ? tap->nextNumber() : 0;
  _account->show("post", [&](TapLine& line) {
    const bool gzipped = request.headers.back().first == "Content-Encoding";
    line.add("post", post).add("url", request.url).add("encoding", gzipped ? "gzip" : "identity");
    line.add("bytes", std::uint64_t{request.body.size()}).add("events", std::uint64_t{document.events});
    line.addJSON("document", document.json);
  });
  return [&log = _platform.log, account = _account, events = document.events,
          post](const platform::HTTPResult& result) {
    logPostError(log, events, result);
    bookPost(*account, events, result);
    if (post == 0) return;
    account->show("post", [&](TapLine& line) {
      line.add("post", post);
      addResult(line, result);
    });
  };
}

}  // namespace tallyd
