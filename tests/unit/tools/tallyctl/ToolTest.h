// What every test of a command starts from: a scripted daemon below a root of its own.
#pragma once

#include <gtest/gtest.h>

#include <sstream>
#include <string>
#include <vector>

#include "InputFile.h"
#include "ProcFixtures.h"
#include "ScriptedDaemon.h"
#include "platform/Root.h"
#include "tallyctl/Tool.h"

namespace tallyd::tallyctl {

/// Time passes only while somebody waits; stops after so many waits.
class FakePacer final : public Pacer {
 public:
  using Hook = std::function<void(SteadyTime)>;

  FakePacer(int waits, Hook beforeReturn) : _waitsLeft(waits), _beforeReturn(std::move(beforeReturn)) {}

  [[nodiscard]] SteadyTime now() override { return _now; }
  [[nodiscard]] bool waitUntil(SteadyTime time) override {
    if (_waitsLeft-- == 0) return false;
    _now = time;
    if (_beforeReturn) _beforeReturn(time);
    return true;
  }

 private:
  SteadyTime _now{std::chrono::hours(1)};
  int _waitsLeft;
  Hook _beforeReturn;
};

class ToolTest : public testing::Test {
 protected:
  using Method = ClientSessionMethod;
  using Dictionary = platform::Dictionary;
  using Array = platform::Array;
  using Value = platform::Value;

  ToolTest() {
    writeCounters(kStatBefore, kDiskstatsBefore, kNetDevBefore);
    writeFile(_proc / "meminfo", kMeminfo);
    writeFile(_proc / "loadavg", kLoadavg);
    writeFile(_proc / "uptime", kUptime);
  }

  void writeCounters(std::string_view stat, std::string_view diskstats, std::string_view netDev) {
    writeFile(_proc / "stat", stat);
    writeFile(_proc / "diskstats", diskstats);
    writeFile(_proc / "net/dev", netDev);
  }

  /// The exit status; what was written is in _out and _err.
  int run(std::vector<std::string> arguments, std::string_view standardInput = "") {
    arguments.insert(arguments.begin(), {"tallyctl", "--socket", _socket.string()});
    std::vector<const char*> pointers;
    for (const auto& argument : arguments) pointers.push_back(argument.c_str());
    const InputFile input(standardInput);
    std::ostringstream out;
    std::ostringstream err;
    const Surroundings surroundings{
        .version = "1.2.3",
        .out = out,
        .err = err,
        .standardInput = input.descriptor(),
        .procFolder = _proc,
        .makePacer = [this] { return std::make_unique<FakePacer>(_waits, _whileWaiting); },
    };
    const int status = runTool(static_cast<int>(pointers.size()), pointers.data(), surroundings);
    _out = out.str();
    _err = err.str();
    return status;
  }

  static Value message(int category, int type) { return Array{category, type}; }

  /// Category and type of each message that arrived.
  [[nodiscard]] std::vector<Value> messages() const {
    std::vector<Value> messages;
    for (const auto& call : _daemon.callsOf(Method::SendMessageWithCategory)) {
      messages.emplace_back(Array{call.arguments[0], call.arguments[1]});
    }
    return messages;
  }

  fakes::TemporaryFolder _folder;
  const std::filesystem::path _proc = _folder.path() / "proc";
  std::filesystem::path _socket = tallydSocketPath(platform::Root(_folder.path()));
  ScriptedDaemon _daemon{_socket};
  int _waits = 0;
  FakePacer::Hook _whileWaiting;
  std::string _out;
  std::string _err;
};

}  // namespace tallyd::tallyctl
