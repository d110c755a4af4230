// Posts messages as JSON documents over HTTPS, one by one or in batches.
#pragma once

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "backends/TallyBackend.h"
#include "backends/https-post/EventFilters.h"
#include "backends/https-post/EventRecord.h"
#include "backends/https-post/ReportingRules.h"
#include "platform/HTTPClient.h"
#include "platform/JSON.h"
#include "support/Consent.h"

namespace tallyd::platform {
class SerialQueue;
}

namespace tallyd {

/// Turns each message into a flat event record and posts it, gzipped when that is shorter, or holds it back
/// in a batch while it may not be posted yet or batching is asked for.
///
/// A batch holds at most threshold + 1 events of one method. Posts go to the shared transfer engine and are
/// not retried here; what becomes of them is only logged.
///
/// Consent is read when the backend is made. With recheckConsent() it is read again before each post, and
/// before each further attempt of one: when it was there at first and has gone, this and all later posts are
/// dropped. It never makes anything leave that would not have left without it.
///
/// Books: events. Those of a batch are held; those of a post are in flight until it is done, and then sent
/// when there was a response, with whatever status. Threading: the session's queue; the posts' completions
/// run on a queue of the backend's own and touch no backend.
class HTTPSPostBackend final : public TallyBackend {
 public:
  static constexpr std::int32_t kDefaultEventThreshold = 49;

  /// Null without a profile or a product family, and without a client list in the profile (one error line).
  [[nodiscard]] static std::shared_ptr<HTTPSPostBackend> initWithName(
      const platform::Platform& platform, std::string_view name, const Payload& profile,
      const std::optional<std::string>& productFamily);
  /// Posts a batch that may be posted.
  ~HTTPSPostBackend() override;

  [[nodiscard]] std::string_view kind() const override { return "https-post"; }
  void recheckConsent() override;
  using TallyBackend::sendMessage;
  /// The posted document when the user consents to see it; nothing when nothing was posted.
  Result sendMessage(const Payload& payload, const timeval& timestamp, std::uint16_t method,
                     std::uint16_t respCode, std::uint16_t eventID) override;
  Result flushMessages() override;
  /// Also renames the session of the events held back.
  void setCorrelatedSessionID(const std::string& correlatedSessionID) override;
  /// Evaluates the storebag's rules, and posts the batch when they now let it go.
  void updateState() override;

  [[nodiscard]] const std::optional<std::string>& postURL() const { return _postURL; }
  void setPostURL(std::optional<std::string> url) { _postURL = std::move(url); }
  [[nodiscard]] DNUType dnuType() const { return _dnuType; }
  [[nodiscard]] std::int32_t eventThreshold() const { return _eventThreshold; }
  [[nodiscard]] std::size_t batchedEventCount() const { return _batchedEvents ? _batchedEvents->size() : 0; }

 private:
  using Events = std::vector<EventRecord>;

  /// A document that is ready to go.
  struct Document {
    std::string json;
    std::size_t events = 0;  ///< In flight with it.
  };

  HTTPSPostBackend(const platform::Platform& platform, std::string_view name, const Payload& profile,
                   const std::optional<std::string>& productFamily);

  std::int32_t updateBackendState();
  void applyEntry(const ReportingDecision& decision);
  void applySampledEntry(const ReportingDecision& decision);
  void takePostURL(const std::string& storebagURL);

  Payload stopMessagePayload(const Payload& payload) const;
  EventRecord createEventDictfromPayload(const Payload& payload, const timeval& timestamp,
                                         std::uint16_t method, std::uint16_t respCode, std::uint16_t eventID);
  void batchEvent(EventRecord event, const MessageNumbers& numbers);
  [[nodiscard]] bool hasRequiredUserInfo() const { return !_requireUserInfo || _userInfoDict; }
  [[nodiscard]] bool isConsentWithdrawn() const { return _consentWatch && _consentWatch->isWithdrawn(); }
  /// Prepares and takes the batch away; what is left is no batch. Nothing without a document, and when
  /// consent is withdrawn.
  std::optional<Document> takeBatchForPost();
  /// Takes events that are booked as being in flight.
  std::optional<Document> documentOf(const Events& events) const;
  /// The events as a JSON array: each with the user info, filtered, and what is not fit for JSON left out.
  [[nodiscard]] platform::JSONText prepareEventArrayForMessage(const Events& events) const;
  [[nodiscard]] Document createMessageForPost(std::string_view eventArray, std::size_t count) const;
  void dropForMemory(std::size_t events) const;  ///< Of those in flight.
  Result postJsonMessage(const Document& document) const;
  [[nodiscard]] platform::HTTPRequest requestFor(const std::string& json) const;
  /// What is to happen once the post is done; shows the post on the tap.
  platform::HTTPClient::Completion completionFor(const Document& document,
                                                 const platform::HTTPRequest& request) const;

  const std::shared_ptr<platform::SerialQueue> _queue;
  std::optional<std::string> _postURL;
  std::optional<Events> _batchedEvents;  ///< Nothing until an event is held back, and after each flush.
  EventRecords _records;
  EventFilters _filters;
  const bool _dnuEnabled;
  std::shared_ptr<ConsentWatch> _consentWatch;  ///< Null when consent is not looked at again.
  DNUType _dnuType = DNUTypeConsent;
  std::int32_t _eventThreshold = kDefaultEventThreshold;
  std::int32_t _extrasOnInternal = 0;
  std::optional<platform::Value> _samplingThreshold;
  std::map<std::uint16_t, std::int32_t> _eventMethodCounts;  ///< Events of each method in the batch.
};

}  // namespace tallyd
