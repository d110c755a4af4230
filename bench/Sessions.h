// A daemon with a collector of its own, and sessions that have started there.
#pragma once

#include <cstddef>
#include <functional>
#include <string>
#include <vector>

#include "Collector.h"
#include "Daemon.h"
#include "Recording.h"
#include "Storebags.h"

namespace tallyd::bench {

struct SessionSetup {
  Posting posting = Posting::Batched;
  std::size_t count = 1;
  Logging logging = Logging::Warnings;
  PostAnswers answers = PostAnswers::AtOnce;
  platform::Dictionary backends{{kFirstPoster, httpsPostSettings()}};
};

/// Each session has a connection, and all backends of the storebag, which report; the records of the starts
/// have been posted, so that a batch holds nothing yet. Throws std::runtime_error where that fails.
class Sessions {
 public:
  Sessions(const Settings& settings, const SessionSetup& setup);

  [[nodiscard]] const Daemon& daemon() const { return _daemon; }
  [[nodiscard]] Collector& collector() { return _collector; }
  [[nodiscard]] const Recording& recording() const { return _recording; }
  [[nodiscard]] std::vector<ReplayingClient>& clients() { return _clients; }
  /// Processor seconds that the daemon has taken so far.
  [[nodiscard]] double processorSeconds() const;
  /// What the collector has received since the last call.
  [[nodiscard]] std::vector<std::string> takeDocuments();

  /// Sends the events 0 to `count` - 1 on the first connection, with the flushes, so that no more than
  /// DatagramReceiver::kWindow of them are under way: after each window there is a round trip, and then
  /// `afterWindow` is told how many events that was. `count` is a multiple of the window.
  void sendPaced(std::size_t count, std::size_t flushEvery,
                 const std::function<void(std::size_t events)>& afterWindow);

 private:
  void start(ReplayingClient& client, const SessionSetup& setup) const;

  Collector _collector;
  Daemon _daemon;
  Recording _recording;
  std::vector<ReplayingClient> _clients;
};

/// Throws std::runtime_error unless each event from 0 to `events` - 1 is in `copies` of the documents.
void checkDocuments(const std::vector<std::string>& documents, std::size_t events, std::size_t copies = 1);

}  // namespace tallyd::bench
