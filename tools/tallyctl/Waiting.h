// Waiting for one answer that may take long, while progress is shown.
#pragma once

#include <chrono>
#include <functional>
#include <future>
#include <memory>
#include <string>
#include <utility>

#include "framework/TallyConnection.h"
#include "tallyctl/Console.h"

namespace tallyd::tallyctl {

/// How long something took.
class Stopwatch {
 public:
  using Seconds = std::chrono::duration<double>;
  [[nodiscard]] Seconds elapsed() const { return std::chrono::steady_clock::now() - _start; }

 private:
  const std::chrono::steady_clock::time_point _start = std::chrono::steady_clock::now();
};

/// Makes an asynchronous call and waits for its completion, which comes at the latest after the connection's
/// timeout; `timeout` is that. What the transfer has done is known to the daemon alone: the progress is
/// `subject` and the time.
template <class T, class Call>
TallyReply<T> awaitAnswer(std::chrono::milliseconds timeout, const std::string& subject, Console& console,
                          Call&& call) {
  constexpr std::chrono::milliseconds kProgressInterval{200};
  constexpr std::chrono::milliseconds kGrace{500};  // For a service that does not even take the call.
  const Stopwatch watch;
  const auto promise = std::make_shared<std::promise<TallyReply<T>>>();
  auto answer = promise->get_future();
  call(TallyConnection::Completion<T>([promise](auto reply) { promise->set_value(std::move(reply)); }));
  do {
    console.showElapsed(subject, watch.elapsed());
    if (watch.elapsed() > timeout + kGrace) {
      console.clearProgress();
      return {"the service does not answer", {}};
    }
  } while (answer.wait_for(kProgressInterval) != std::future_status::ready);
  console.clearProgress();
  return answer.get();
}

}  // namespace tallyd::tallyctl
