// A whole device, its network and its servers, on one timeline.
#pragma once

#include <filesystem>
#include <functional>
#include <optional>

#include "fakes/FakeCodeBundles.h"
#include "fakes/FakeLocale.h"
#include "fakes/FakeSandbox.h"
#include "fakes/FakeSettings.h"
#include "fakes/TemporaryFolder.h"
#include "platform/Platform.h"
#include "platform/http/RetryingHTTPClient.h"
#include "replay/PostWatch.h"
#include "replay/Scenario.h"
#include "replay/SimulatedAdaptor.h"
#include "replay/SimulatedDatagrams.h"
#include "replay/SimulatedDevice.h"
#include "replay/SimulatedHTTP.h"
#include "replay/Surroundings.h"

namespace tallyd::replay {

/// The platform on which the daemon's core is replayed.
///
/// Nothing in it comes from outside but a folder for files; what the world decides by chance is drawn from
/// the scenario's seed. Threading: one thread.
class World {
 public:
  /// The device already has a message log, of the evening before.
  explicit World(const Scenario& scenario);

  [[nodiscard]] const platform::Platform& platform() const { return _platform; }
  [[nodiscard]] Surroundings& surroundings() { return _world; }
  /// Lets time pass up to `moment`, calling `afterStep` after everything that happens on the way.
  void runUntil(Milliseconds moment);
  /// Runs what is due now.
  void settle() { _world.queues.serveReadable(); }
  std::function<void()> afterStep = [] {};

  void set(const SetPreference& change);
  void set(const SetCountry& change);
  void lose(Loss what);
  /// Makes the file as `upload` has it; its path.
  std::filesystem::path makeFile(const UploadFile& upload) const;
  /// Message log files that lie in their folder.
  [[nodiscard]] std::size_t messageLogFiles() const;

 private:
  /// The client that the daemon gets: the simulated network's own without retries.
  platform::HTTPClient& withRetries();

  Surroundings _world;
  fakes::TemporaryFolder _folder;
  platform::Root _root{_folder.path()};
  TraceLog _log{_world.trace};
  SimulatedRandomness _randomness{_world};
  fakes::FakeLocale _locale;
  PostWatch _posts{_world};
  SimulatedHTTP _network{_world, _posts};
  std::optional<platform::RetryingHTTPClient> _retrying;
  WatchedHTTP _http{withRetries(), _posts};
  fakes::FakePreferences _preferences;
  SimulatedDefaults _defaults;
  SimulatedDeviceProperties _device{_world};
  fakes::FakeBundle _frameworkBundle;
  fakes::FakeSandbox _sandbox;
  SimulatedPowerLog _powerLog{_world};
  SimulatedAdaptor _adaptor{_world};
  fakes::FakeCodeBundles _codeBundles;
  platform::ProcessValues _process;
  SimulatedDatagrams _datagrams{_world};
  platform::Platform _platform{
      _root,     _log,    _world.clock,     _randomness, _locale,   _world.queues, _http,    _preferences,
      _defaults, _device, _frameworkBundle, _sandbox,    _powerLog, _codeBundles,  _process, _datagrams};
};

}  // namespace tallyd::replay
