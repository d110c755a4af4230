// What every test of a command starts from: a scripted daemon below a root of its own.
#pragma once

#include <gtest/gtest.h>

#include <cerrno>
#include <sstream>
#include <streambuf>
#include <string>
#include <vector>

#include "InputFile.h"
#include "ProcFixtures.h"
#include "ScriptedDaemon.h"
#include "platform/JSON.h"
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

/// A file descriptor's stream that takes so many lines, then fails as the system call would.
class FailingOutput final : public std::streambuf {
 public:
  FailingOutput(int lines, int error) : _linesLeft(lines), _error(error) {}
  [[nodiscard]] const std::string& taken() const { return _taken; }

 private:
  int_type overflow(int_type character) override {
    if (_linesLeft == 0) {
      errno = _error;
      return traits_type::eof();
    }
    _taken.push_back(traits_type::to_char_type(character));
    if (_taken.back() == '\n') --_linesLeft;
    return character;
  }

  int _linesLeft;
  const int _error;
  std::string _taken;
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
    std::ostringstream out;
    const int status = runInto(out, std::move(arguments), standardInput);
    _out = out.str();
    return status;
  }

  int runInto(std::ostream& out, std::vector<std::string> arguments, std::string_view standardInput = "") {
    arguments.insert(arguments.begin(), {"tallyctl", "--socket", _socket.string()});
    std::vector<const char*> pointers;
    for (const auto& argument : arguments) pointers.push_back(argument.c_str());
    const InputFile input(standardInput);
    std::ostringstream err;
    const Surroundings surroundings{
        .version = "1.2.3",
        .out = out,
        .err = err,
        .standardInput = input.descriptor(),
        .progress = _progress,
        .procFolder = _proc,
        .makePacer = [this] { return std::make_unique<FakePacer>(_waits, _whileWaiting); },
    };
    const int status = runTool(static_cast<int>(pointers.size()), pointers.data(), surroundings);
    _err = err.str();
    return status;
  }

  /// The lines of _out, each read as an object.
  [[nodiscard]] std::vector<Dictionary> objects() const {
    std::vector<Dictionary> objects;
    std::istringstream lines(_out);
    for (std::string line; std::getline(lines, line);) {
      const auto value = platform::valueFromJSON(line).value;
      EXPECT_TRUE(value && value->dictionary()) << line;
      objects.push_back(value && value->dictionary() ? *value->dictionary() : Dictionary());
    }
    return objects;
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
  Console::Progress _progress = Console::Progress::Hidden;
  FakePacer::Hook _whileWaiting;
  std::string _out;
  std::string _err;
};

}  // namespace tallyd::tallyctl
