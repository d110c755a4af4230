// What a dashboard server may answer, between datagrams and ticks: the queue and its books.

#include <memory>
#include <string>

#include "FuzzTarget.h"
#include "backends/dashboard/Datagram.h"
#include "backends/dashboard/MessageQueue.h"
#include "support/Account.h"

namespace tallyd::fuzz {
namespace {

/// Plays one input on a queue and knows how many datagrams must wait.
class Play {
 public:
  void append(std::uint16_t eventNumber) {
    const std::size_t before = size();
    _account->start();
    _queue.append(UDPPacketToSend(std::string(DatagramText, 'x'), eventNumber));
    FUZZ_CHECK(size() == std::min(before + 1, MessageQueue::kMaximumPackets));
    FUZZ_CHECK(_queue.packets().back().eventNumber() == eventNumber);
  }

  void acknowledge(std::string_view received) {
    const auto event = acknowledgedEventID(received);
    FUZZ_CHECK(event.has_value() == (received.size() >= DatagramEventID + 2));
    if (!event) return;
    const auto& packets = _queue.packets();
    const auto oldest = std::find_if(packets.begin(), packets.end(), [&](const UDPPacketToSend& packet) {
      return packet.eventNumber() == *event;
    });
    const std::size_t expected = size() - (oldest == packets.end() ? 0 : 1);
    _queue.acknowledge(*event);
    FUZZ_CHECK(size() == expected);
  }

  /// @param lets  one bit for each of the first datagrams: whether the socket takes it.
  void tick(Delivery delivery, std::uint8_t lets) {
    const std::size_t before = size();
    std::size_t sent = 0;
    _queue.tick(delivery, [&](std::string_view bytes) {
      FUZZ_CHECK(bytes.size() == DatagramText);
      return (lets >> (sent++ % 8) & 1U) != 0;
    });
    FUZZ_CHECK(sent <= before && size() <= before);
  }

  void checkBooks() const {
    const AccountCounts counts = _account->counts();
    FUZZ_CHECK(counts.isBalanced());
    FUZZ_CHECK(counts.held + counts.inFlight == size());
  }

  /// Whatever came, nothing waits for ever.
  void checkEnd() {
    for (int tick = 0; tick < 40 && !_queue.empty(); ++tick) this->tick(Delivery::Reliable, 0xFF);
    FUZZ_CHECK(_queue.empty());
    checkBooks();
  }

 private:
  [[nodiscard]] std::size_t size() const { return _queue.packets().size(); }

  std::shared_ptr<Account> _account = std::make_shared<Account>();
  MessageQueue _queue{_account};
};

}  // namespace
}  // namespace tallyd::fuzz

/// Steps: 't', what the socket takes; 'f', the same without acknowledgements; 'a', a length and so many
/// bytes; any other byte is a new datagram of that number.
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  Input input(data, size);
  Play play;
  while (!input.isEmpty()) {
    const std::uint8_t step = input.takeByte();
    if (step == 't') {
      play.tick(tallyd::Delivery::Reliable, input.takeByte());
    } else if (step == 'f') {
      play.tick(tallyd::Delivery::FireAndForget, input.takeByte());
    } else if (step == 'a') {
      play.acknowledge(input.takeBytes(input.takeByte()));
    } else {
      play.append(step);
    }
    play.checkBooks();
  }
  play.checkEnd();
  return 0;
}
