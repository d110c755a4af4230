// Sends one event to the reporting daemon and says what became of it, in C++20.
//
// With CMake (examples/CMakeLists.txt):  find_package(Tally) and target_link_libraries(report Tally::tally)
// With pkg-config:  c++ -std=c++20 report.cpp $(pkg-config --cflags --libs tally) -o report
// Use:  report [SOCKET]

#include <tally/TallyConnection.h>
#include <tally/TallyKeys.h>

#include <iostream>

using namespace std::chrono_literals;
using tallyd::TallyConnection;
using tallyd::TallyConnectionOptions;
using tallyd::platform::Date;
using tallyd::platform::Dictionary;

namespace {

/// Whether there is an answer; says why when there is none.
template <class T>
bool succeeded(const char* operation, const tallyd::TallyReply<T>& reply) {
  if (reply.error) std::cerr << operation << ": " << *reply.error << '\n';
  return !reply.error;
}

bool report(TallyConnection& connection) {
  const Dictionary info{{std::string(tallyd::kTallySessionInfoSessionID), 1002},
                        {std::string(tallyd::kTallySessionInfoClientType), 5}};
  if (!succeeded("configuring", connection.setSessionInfoSync(info, std::nullopt))) return false;
  if (!succeeded("starting", connection.startConfigSync())) return false;

  // Without waiting: the completion runs on the connection's thread, the destructor waits for it.
  const Dictionary event{{"from", "C++"}, {"departed", Date{1.5}}, {"stops", 2}};
  connection.sendMessage(3, 0, event, [](const auto& reply) { succeeded("sending", reply); });
  // With a time limit of its own.
  return succeeded("sending", connection.sendMessageSync(4, 0, event, 10s));
}

}  // namespace

int main(int argc, char** argv) {
  TallyConnectionOptions options;
  if (argc > 1) options.socketPath = argv[1];
  options.timeout = 30s;
  TallyConnection connection(options);
  connection.setInterruptionHandler(
      [] { std::cerr << "the daemon has gone; waiting for it to come back\n"; });
  if (!report(connection)) return 1;
  std::cout << "reported\n";
}
