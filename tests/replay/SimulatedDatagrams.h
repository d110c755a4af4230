// A datagram network that loses, delays and doubles, and the dashboards at its other end.
#pragma once

#include <memory>

#include "platform/DatagramSocket.h"
#include "replay/Surroundings.h"

namespace tallyd::replay {

/// Acknowledges what asks for it and watches over what is sent again, and when.
class SimulatedDatagrams : public platform::DatagramSockets {
 public:
  explicit SimulatedDatagrams(Surroundings& surroundings)
      : _world(surroundings), _network(surroundings.queues.makeSerialQueue("network")) {}

  [[nodiscard]] std::unique_ptr<platform::DatagramSocket> makeSocket() override;

 private:
  class Socket;

  Surroundings& _world;
  const std::shared_ptr<platform::SerialQueue> _network;  ///< On which acknowledgements travel.
  int _sockets = 0;
};

}  // namespace tallyd::replay
