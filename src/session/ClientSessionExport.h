// A session as its connection sees it: calls with values become operations, replies become answers.
#pragma once

#include <memory>

#include "platform/IPC.h"

namespace tallyd::platform {
class Sandbox;
}

namespace tallyd {

class TallydSession;

/// Exports one session under clientSessionInterface().
///
/// Holds the session until the connection drops this object. Arguments of the wrong shape are rejected
/// before the session hears of them; a call that expects no answer reaches the session without a reply
/// block where that block may be missing, and with one whose reply goes nowhere where it must be there.
/// Threading: the connection's queue.
class ClientSessionExport final : public platform::ExportedObject {
 public:
  /// Borrows the sandbox.
  ClientSessionExport(std::shared_ptr<TallydSession> session, platform::Sandbox& sandbox);
  ~ClientSessionExport() override;

  void handleCall(const std::shared_ptr<platform::IncomingCall>& call) override;

 private:
  using Call = std::shared_ptr<platform::IncomingCall>;
  void setSessionInfo(const Call& call);
  void startConfig(const Call& call);
  void fetchStates(const Call& call);
  void sendMessage(const Call& call);
  void uploadFile(const Call& call);
  void uploadLogData(const Call& call);
  void sendMessageWithSessionInfo(const Call& call);

  std::shared_ptr<TallydSession> _session;
  platform::Sandbox& _sandbox;
};

}  // namespace tallyd
