// What the simulated device keeps: defaults, identifiers, randomness, power log.
#pragma once

#include "fakes/FakeSettings.h"
#include "platform/PowerLog.h"
#include "platform/Randomness.h"
#include "replay/Scenario.h"
#include "replay/Surroundings.h"

namespace tallyd::replay {

/// User defaults that know when a message log file was made on the simulation's timeline: from its name.
class SimulatedDefaults : public fakes::FakeUserDefaults {
 public:
  [[nodiscard]] std::optional<platform::Value> value(std::string_view key) const override {
    auto kept = FakeUserDefaults::value(key);
    if (key != "logFileCreationDate" || !kept) return kept;
    const auto path = FakeUserDefaults::value("logFilePath");
    if (!path || !path->string()) return kept;
    const std::string_view name = path->string()->substr(path->string()->rfind('/') + 1);
    return platform::Value(
        platform::Date{static_cast<double>(platform::leadingInteger(name.substr(name.find('_') + 1)))});
  }
};

/// A device that at times has no machine ID.
class SimulatedDeviceProperties : public fakes::FakeDeviceProperties {
 public:
  explicit SimulatedDeviceProperties(Surroundings& world) : _world(world) {}

  [[nodiscard]] std::optional<platform::UUIDBytes> machineIdentifier(
      std::string_view purpose) const override {
    if (_world.draws.chance(_world.weather.hasNoMachineID)) return std::nullopt;
    return FakeDeviceProperties::machineIdentifier(purpose);
  }

 private:
  Surroundings& _world;
};

/// Sampling factors are drawn call by call, so that the world knows them.
class SimulatedRandomness : public platform::Randomness {
 public:
  explicit SimulatedRandomness(Surroundings& world) : _world(world) {}

  double drand48() override { return _world.samplingFactor; }
  platform::UUIDBytes uuid() override {
    platform::UUIDBytes bytes{};
    for (auto& byte : bytes) byte = static_cast<std::uint8_t>(_world.draws.next());
    return bytes;
  }

 private:
  Surroundings& _world;
};

class SimulatedPowerLog : public platform::PowerLog {
 public:
  explicit SimulatedPowerLog(Surroundings& world) : _world(world) {}

  void WBLogRegisteredEvent(std::int32_t number, std::string_view name,
                            const platform::Dictionary& record) override {
    ++_world.received.powerRecords;
    if (const auto serial = record.integer(kSerialKey)) _world.arrived(Channel::PowerLog, *serial, 1);
    _world.trace.write("power", "{} {} {}", number, name, platform::Value(record).description());
  }

 private:
  Surroundings& _world;
};

}  // namespace tallyd::replay
