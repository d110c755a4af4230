#include "replay/PostModel.h"

#include <algorithm>
#include <string_view>
#include <utility>

#include "framework/TallyKeys.h"
#include "replay/Storebags.h"

namespace tallyd::replay {

using platform::Array;
using platform::Dictionary;

namespace {

/// Of the names in a simulated day, all of which are ASCII.
std::string lowercase(std::string_view text) {
  std::string lower(text);
  for (char& letter : lower)
    letter = letter >= 'A' && letter <= 'Z' ? static_cast<char>(letter + 32) : letter;
  return lower;
}

/// Whether `name` is one of the names in `list`, between commas.
bool isListed(std::string_view list, std::optional<std::string_view> name) {
  if (!name || name->empty()) return false;
  return ("," + lowercase(list) + ",").find("," + lowercase(*name) + ",") != std::string::npos;
}

bool appliesTo(const Dictionary& entry, const Dictionary& userInfo) {
  const bool hasClient = isListed(*entry.string("client"), userInfo.string(kTallyUserInfoClientName));
  const auto service = entry.string("service");
  const auto given = userInfo.string(kTallyUserInfoServiceName);
  const bool hasService =
      !service || (given && lowercase(*given).find(lowercase(*service)) != std::string::npos);
  return hasClient && hasService;
}

bool names(const Array& list, std::string_view text) {
  return std::any_of(list.begin(), list.end(), [&](const auto& element) { return element.string() == text; });
}

}  // namespace

/// One post backend, by the numbers.
class PostModel::Backend {
 public:
  Backend(const Surroundings& world, PostForecast& forecast, Array clients, const Dictionary& sessionInfo)
      : _world(world),
        _forecast(forecast),
        _clients(std::move(clients)),
        _requiresUserInfo(sessionInfo.boolean(kTallySessionInfoRequireUserInfo)),
        _batches(sessionInfo.boolean(kTallySessionInfoBatchEvent)),
        _hadConsent(world.hasConsent),
        _samplingFactor(world.samplingFactor) {}

  void send(std::uint16_t method) {
    ++_forecast.accepted;
    if (_state == State::Off) {
      ++_forecast.stateOff;
    } else if (_state == State::Pending || _batches) {
      batch(method);
    } else if (isConsentWithdrawn()) {
      ++_forecast.consentWithdrawn;
    }
  }

  void update(const OptionalDictionary& userInfo) {
    _state = stateFor(userInfo);
    if (!_batches && _state == State::On) post();
  }

  void flush() {
    if (!_batches || !_batched || _state != State::On) return;
    post();
    _ofMethod.clear();
  }

  void finish() {
    if (_batches && _state == State::On) return post();
    _forecast.cleanUp += _batched.value_or(0);
    _forecast.held -= _batched.value_or(0);
  }

 private:
  enum class State { Pending, Off, On };

  State stateFor(const OptionalDictionary& userInfo) {
    if (!_requiresUserInfo) return State::On;
    if (!userInfo) return State::Pending;
    for (const auto& client : _clients) {
      const Dictionary& entry = *client.dictionary();
      if (appliesTo(entry, *userInfo)) return mayReport(entry) ? State::On : State::Off;
    }
    return State::Pending;
  }

  bool mayReport(const Dictionary& entry) {
    if (!_hadConsent && entry.integer("override_dnu") != 1) return false;
    if (_world.country && !names(*entry.array("locale_whitelist"), *_world.country)) return false;
    _batchLimit = *entry.integer("event_threshold") + 1;
    return _samplingFactor <= *entry.real("sampling_threshold");
  }

  void batch(std::uint16_t method) {
    if (!_batched) _batched = 0;
    std::int64_t& count = _ofMethod[method];
    if (count >= _batchLimit) {
      ++_forecast.methodLimit;
      return;
    }
    ++count;
    ++*_batched;
    ++_forecast.held;
  }

  void post() {
    if (!_batched) return;
    _forecast.held -= *_batched;
    if (isConsentWithdrawn()) _forecast.consentWithdrawn += *_batched;
    _batched.reset();
  }

  bool isConsentWithdrawn() {
    const bool isAsked = _world.optIns.consentChecks == ConsentChecks::BeforeEachPost && _hadConsent;
    _isWithdrawn = _isWithdrawn || (isAsked && !_world.hasConsent);
    return _isWithdrawn;
  }

  const Surroundings& _world;
  PostForecast& _forecast;
  const Array _clients;
  const bool _requiresUserInfo;
  const bool _batches;
  const bool _hadConsent;
  const double _samplingFactor;
  State _state = State::Pending;
  std::int64_t _batchLimit = kHighestEventThreshold + 1;  ///< Of one method, until an entry applies.
  std::optional<std::uint64_t> _batched;
  std::map<std::uint16_t, std::int64_t> _ofMethod;  ///< Since the last flush.
  bool _isWithdrawn = false;
};

PostModel::PostModel(const Surroundings& world) : _world(world) {}
PostModel::~PostModel() = default;

void PostModel::configure(int client, const Configure& call) {
  Session& session = _sessions[client];
  session.sessionInfo = call.sessionInfo;
  takeUserInfo(session, call.userInfo);
}

void PostModel::takeUserInfo(Session& session, const OptionalDictionary& userInfo) {
  const auto isAsBefore = [&](std::string_view key) {
    return userInfo->string(key) && userInfo->string(key) == session.userInfo->string(key);
  };
  const bool isKept = userInfo && session.userInfo && isAsBefore(kTallyUserInfoClientName) &&
                      isAsBefore(kTallyUserInfoServiceName);
  if (userInfo && !isKept) session.userInfo = userInfo;
  for (const auto& backend : session.backends) backend->update(session.userInfo);
}

std::optional<PostModel::Backends> PostModel::makeBackends(const Dictionary& sessionInfo) {
  const auto name = storebagNameOf(sessionInfo.integer(kTallySessionInfoClientType).value_or(0));
  const auto edition = name ? _world.editionsTaken.find(*name) : _world.editionsTaken.end();
  if (edition == _world.editionsTaken.end()) return std::nullopt;
  const Dictionary section = sectionOf(*name, edition->second);
  Backends backends;
  for (const char* key : {"splunk", "https_post"}) {
    const Dictionary* profile = section.dictionary(key);
    const Array* clients = profile ? profile->array("clients") : nullptr;
    if (clients) backends.push_back(std::make_unique<Backend>(_world, _forecast, *clients, sessionInfo));
  }
  return backends;
}

void PostModel::start(int client) {
  constexpr std::uint16_t kOwnMethod = 0;
  Session& session = _sessions[client];
  auto backends = makeBackends(session.sessionInfo.value_or(Dictionary()));
  if (!backends) return;
  finish(session.backends);
  session.backends = std::move(*backends);
  for (const auto& backend : session.backends) backend->send(kOwnMethod);
  takeUserInfo(session, session.userInfo);
}

void PostModel::fetchStates(int client, const FetchStates& call) {
  takeUserInfo(_sessions[client], call.userInfo);
}

void PostModel::send(int client, std::uint16_t method) {
  for (const auto& backend : _sessions[client].backends) backend->send(method);
}

void PostModel::sendOnce(int client, const SendOnce& call) {
  if (!call.sessionInfo || !call.sessionInfo->contains(kTallySessionInfoClientType) ||
      !call.sessionInfo->contains(kTallySessionInfoSessionID)) {
    return;
  }
  configure(client, {*call.sessionInfo, call.userInfo});
  auto backends = makeBackends(*call.sessionInfo);
  if (!backends) return;
  for (const auto& backend : *backends) {
    backend->update(call.userInfo);
    backend->send(call.message.category);
  }
  finish(*backends);
}

void PostModel::flush(int client) {
  for (const auto& backend : _sessions[client].backends) backend->flush();
}

void PostModel::end(int client) {
  constexpr std::uint16_t kOwnMethod = 0;
  send(client, kOwnMethod);
  flush(client);
  finish(_sessions[client].backends);
  _sessions.erase(client);
}

void PostModel::finish(Backends& backends) {
  for (const auto& backend : backends) backend->finish();
  backends.clear();
}

}  // namespace tallyd::replay
