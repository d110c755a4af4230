#include "replay/World.h"

#include <array>
#include <fstream>

#include "fakes/SignedStorebag.h"
#include "support/MessageLog.h"

namespace tallyd::replay {

using platform::Value;

namespace {

constexpr std::string_view kLogFolder = "/var/mobile/Library/Logs/CrashReporter/Retired";
constexpr std::string_view kUploadFolder = "/var/log/clients";
constexpr std::array kAdaptorBundles{
    "/System/Library/PrivateFrameworks/PlayhallServices.framework/Frameworks/PHSPerformance.framework",
    "/System/Library/PrivateFrameworks/Fennel.framework"};

}  // namespace

World::World(const Scenario& scenario) : _world(scenario) {
  _world.elapse = [this](Milliseconds duration) {
    ++_world.callsWaiting;
    runUntil(_world.queues.now() + duration);
    --_world.callsWaiting;
  };
  _world.country = _locale.country;
  _world.trace.setRoot(_folder.path().string());
  _device.answers = {{"UniqueDeviceID", "0123456789abcdef0123456789abcdef01234567"},
                     {"ProductVersion", "12.4"},
                     {"BuildVersion", "12D500"},
                     {"ProductType", "Kasten3,1"},
                     {"DeviceName", "Kasten"},
                     {"HWModelStr", "K31AP"},
                     {"SerialNumber", "QX1234"}};
  if (scenario.isInternalDevice) _device.answers["ReleaseType"] = "Internal";
  _frameworkBundle.info.set("CFBundleVersion", "7.42.1");
  _frameworkBundle.resources["publicKey.der"] = fakes::StorebagSigner::server().subjectPublicKeyInfo();
  for (const char* bundle : kAdaptorBundles) {
    _codeBundles.symbols[_root.under(bundle)] = {{"PithAdaptor", _adaptor.adaptorClass()}};
  }
  std::filesystem::create_directories(_root.under(kUploadFolder));
  std::filesystem::create_directories(_root.under(kLogFolder));
  const auto evening = _world.clock.now() - std::chrono::hours(20) - _world.upTo(std::chrono::hours(3));
  const auto seconds = static_cast<std::int64_t>(platform::secondsSince1970(evening));
  const auto oldLog = _root.under(kLogFolder) / fmt::format("tallyd_{}_messageLog.diag", seconds);
  std::ofstream(oldLog) << "a line of yesterday\n";
  _defaults.setValue("logFilePath", Value(oldLog.string()));
  _defaults.setValue("logFileCreationDate", Value(platform::Date{static_cast<double>(seconds)}));
}

platform::HTTPClient& World::withRetries() {
  const auto limits = retryLimitsOf(_world.optIns);
  if (!limits) return _network;
  return _retrying.emplace(_network, _world.clock, _randomness, _log, *limits,
                           [this] { return platform::RetryingHTTPClient::Moment(_world.queues.now()); });
}

void World::runUntil(Milliseconds moment) {
  while (_world.queues.advanceToNext(moment)) {
    settle();
    afterStep();
  }
}

void World::set(const SetPreference& change) {
  if (change.value) {
    _preferences.set(change.suite, change.key, *change.value);
  } else {
    _preferences.values.erase(change.suite + "/" + change.key);
  }
  if (change.key == kConsentKey) _world.hasConsent = change.value && change.value->booleanValue();
}

void World::set(const SetCountry& change) {
  _locale.country = change.country;
  _world.country = change.country;
}

void World::lose(Loss what) {
  std::error_code ignored;
  switch (what) {
    case Loss::MessageLogFile:
      if (const auto path = _defaults.value("logFilePath")) std::filesystem::remove(*path->string(), ignored);
      break;
    case Loss::MessageLogFolder:
      std::filesystem::remove_all(_root.under(kLogFolder), ignored);
      break;
    case Loss::UserDefaults:
      _defaults.setValue("logFilePath", std::nullopt);
      _defaults.setValue("logFileCreationDate", std::nullopt);
      break;
  }
}

std::filesystem::path World::makeFile(const UploadFile& upload) const {
  const auto path = _root.under(kUploadFolder) / upload.name;
  if (upload.bytes) {
    std::string contents;
    while (contents.size() < *upload.bytes) contents += fmt::format("line {}\n", contents.size());
    contents.resize(*upload.bytes);
    std::ofstream(path) << contents;
  }
  return path;
}

std::size_t World::messageLogFiles() const {
  std::error_code ignored;
  std::size_t files = 0;
  for (const auto& entry : std::filesystem::directory_iterator(_root.under(kLogFolder), ignored)) {
    files += isMessageLogFileName(entry.path().filename().string()) ? 1 : 0;
  }
  return files;
}

}  // namespace tallyd::replay
