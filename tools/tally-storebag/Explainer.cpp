#include "tally-storebag/Explainer.h"

#include <arpa/inet.h>
#include <fmt/format.h>

#include <stdexcept>

#include "framework/TallyKeys.h"
#include "session/TallydSession.h"
#include "session/TallydSessionDelegate.h"
#include "signing/StorebagSigning.h"
#include "storebag/StorebagEnvironment.h"
#include "storebag/StorebagRetrieval.h"
#include "support/MessageLog.h"
#include "tally-storebag/DatagramReceiver.h"

namespace tallyd::storebagtool {

using platform::Dictionary;

namespace {

/// Hands out one storebag; knows of no other sessions.
class OneStorebag final : public TallydSessionDelegate {
 public:
  explicit OneStorebag(StorebagFetch fetch) : _fetch(std::move(fetch)) {}
  std::optional<Dictionary> storebagForSession(const TallydSession& /*session*/) override {
    return _fetch.storebag;
  }
  std::optional<std::string> storebagVersionForSession(const TallydSession& /*session*/) override {
    return _fetch.version;
  }
  std::optional<std::string> parentSessionIDStringForSession(const TallydSession& /*session*/) override {
    return std::nullopt;
  }
  void userInfoUpdatedForSession(TallydSession& /*session*/) override {}
  [[nodiscard]] std::string description() const override { return "tally-storebag"; }

 private:
  const StorebagFetch _fetch;
};

StorebagFetch fetched(DescribedDevice& device, const std::string& envelope, std::int32_t clientType) {
  Recorded recorded;
  RecordingLog log(recorded.lines);
  AnsweringHTTPClient http(envelope);
  RecordingPowerLog powerLog(recorded.powerEvents);
  RecordingCodeBundles codeBundles(recorded.adaptorCalls);
  const auto platform = device.platformWith(log, http, powerLog, codeBundles);
  StorebagFetch fetch = fetchStorebagForClientType(platform, clientType);
  if (fetch.storebag) return fetch;
  const bool saysWhy = !recorded.lines.empty();
  throw std::runtime_error(saysWhy ? recorded.lines.back().text : "the device gets no storebag");
}

bool isConnectable(const Dictionary& profile) {
  const auto address = profile.string("ip");
  return address && profile.contains("port") && ::inet_addr(std::string(*address).c_str()) != INADDR_NONE;
}

/// The run of one session.
class Run {
 public:
  Run(const Dictionary& bag, const Occasion& occasion)
      : _occasion(occasion),
        _key(signing::makeStorebagKey()),
        _device(occasion.device, signing::publicKeyDER(_key.get())),
        _main(_device),
        _messageLog(_main.platform()) {
    const auto envelope = signing::signedStorebag(_key.get(), bag, platform::PropertyListFormat::XML);
    StorebagFetch fetch = fetched(_device, envelope, occasion.session.clientType);
    _result.storebagName = storebagNameForClientType(occasion.session.clientType).value_or("");
    _result.environment = environmentNameForType(currentEnvironmentType(_main.platform())).value_or("");
    _result.version = fetch.version.value_or("");
    _section = *fetch.storebag;
    _delegate.emplace(std::move(fetch));
  }

  Explanation result() && {
    setTime(_occasion.sessionStart, _occasion.sessionStart);
    auto session = std::make_shared<TallydSession>(
        *_delegate, _main.platform(), _messageLog,
        [this](const platform::Platform&, std::string_view name, const TallyBackend::Payload& profile,
               const std::optional<std::string>& productFamily,
               std::int32_t clientType) { return newBackend(name, profile, productFamily, clientType); });
    if (_occasion.sessionKey) session->setCombinedSessionIDString(*_occasion.sessionKey);
    start(*session);
    send(*session);
    if (_occasion.session.batchEvent) flush(*session);
    explainBackends();
    setTime(_occasion.postTime, _occasion.postTime);
    session.reset();
    endAct("end", Expect::Datagram);
    takeLines();
    return std::move(_result);
  }

 private:
  enum class Expect { Datagram, Nothing };

  void setTime(platform::TimePoint first, platform::TimePoint later) { _device.clock().set(first, later); }

  void start(TallydSession& session) {
    const auto ignore = [](const std::string&) {};
    session.setSessionInfo(sessionInfo(), tallyctl::userInfo(_occasion.session), _occasion.session.frameworks,
                           ignore);
    session.startConfigWithCompletionHandler({});
    endAct("start", Expect::Datagram);
  }

  void send(TallydSession& session) {
    setTime(_occasion.messageTime, _occasion.postTime);
    const auto& [category, type, payload] = _occasion.message;
    auto reply = session.sendMessageWithCategory(category, type, payload);
    endAct("message", Expect::Datagram).reply = std::move(reply);
  }

  void flush(TallydSession& session) {
    setTime(_occasion.postTime, _occasion.postTime);
    auto reply = session.flushMessages();
    endAct("flush", Expect::Nothing).reply = std::move(reply);
  }

  [[nodiscard]] Dictionary sessionInfo() const {
    return tallyctl::sessionInfo(_occasion.session, _occasion.session.sessionID.value_or(1));
  }

  std::shared_ptr<TallyBackend> newBackend(std::string_view name, const TallyBackend::Payload& profile,
                                           const std::optional<std::string>& productFamily,
                                           std::int32_t clientType) {
    auto& recorder = _recorders[std::string(name)];
    recorder = std::make_unique<RecordedPlatform>(_device);
    auto backend = TallyBackend::newBackendWithName(recorder->platform(), name, turnedAside(name, profile),
                                                    productFamily, clientType);
    _backends[std::string(name)] = backend;
    if (backend && name == kTallyBackendDashboard) _hasDashboard = true;
    return backend;
  }

  /// A dashboard's server becomes the receiver; no byte of a datagram tells of it.
  TallyBackend::Payload turnedAside(std::string_view name, const TallyBackend::Payload& profile) const {
    if (name != kTallyBackendDashboard || !profile || !isConnectable(*profile)) return profile;
    Dictionary aside = *profile;
    aside.set("ip", DatagramReceiver::kAddress);
    aside.set("port", unsigned{_receiver.port()});
    return aside;
  }

  Act& endAct(std::string name, Expect expect) {
    _device.queues().run();
    Act& act = _result.acts.emplace_back(Act{std::move(name), {}, std::nullopt});
    for (auto& [backend, recorder] : _recorders) act.sent[backend] = recorder->take();
    if (expect == Expect::Datagram && _hasDashboard) {
      auto datagram = _receiver.receive();
      if (!datagram) throw std::runtime_error("a datagram was lost on its way to the tool's own receiver");
      act.sent[std::string(kTallyBackendDashboard)].datagrams.push_back(std::move(*datagram));
    }
    return act;
  }

  void explainBackends() {
    for (const auto& [name, value] : _section) {
      const Dictionary* profile = value.dictionary();
      ExplainedBackend explained{name, profile ? *profile : Dictionary(), false, 0, std::nullopt, {}, {}};
      if (const auto backend = _backends[name].lock()) {
        explained.isMade = true;
        explained.state = backend->state();
        if (name == kTallyBackendHTTPPost || name == kTallyBackendHTTPPost2) explainRules(explained);
      } else {
        explained.refusal = forget(name);
      }
      _result.backends.push_back(std::move(explained));
    }
  }

  /// Takes a backend that was not made out of the acts; what it logged.
  std::vector<LogLine> forget(const std::string& name) {
    auto lines = std::move(_result.acts.front().sent[name].lines);
    for (Act& act : _result.acts) act.sent.erase(name);
    _recorders.erase(name);
    return lines;
  }

  void explainRules(ExplainedBackend& explained) const {
    explained.decision = decideReporting({.profile = explained.profile,
                                          .requireUserInfo = _occasion.session.requireUserInfo,
                                          .userInfo = tallyctl::userInfo(_occasion.session),
                                          .consented = _occasion.device.consented,
                                          .samplingFactor = _occasion.device.samplingFactor,
                                          .productFamily = _occasion.device.family,
                                          .countryCode = _occasion.device.countryCode},
                                         &explained.trace);
    if (explained.decision->state != explained.state)
      throw std::logic_error(fmt::format("{}: the rules say {}, the backend says {}", explained.name,
                                         explained.decision->state, explained.state));
  }

  void takeLines() { _result.lines = _main.take().lines; }

  const Occasion& _occasion;
  const signing::OpenSSLPointer<EVP_PKEY> _key;
  DescribedDevice _device;
  RecordedPlatform _main;
  MessageLog _messageLog;
  DatagramReceiver _receiver;
  Dictionary _section;
  std::optional<OneStorebag> _delegate;
  std::map<std::string, std::unique_ptr<RecordedPlatform>> _recorders;
  std::map<std::string, std::weak_ptr<TallyBackend>> _backends;
  bool _hasDashboard = false;
  Explanation _result;
};

}  // namespace

Explanation explain(const Dictionary& bag, const Occasion& occasion) {
  // The daemon would end itself, and the tool with it.
  if (!bag.contains("version")) throw std::runtime_error("the bag has no \"version\": it ends the daemon");
  return Run(bag, occasion).result();
}

}  // namespace tallyd::storebagtool
