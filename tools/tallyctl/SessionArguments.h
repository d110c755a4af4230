// The options that several commands share.
#pragma once

#include <string>
#include <vector>

#include "tallyctl/Message.h"
#include "tallyctl/OptionValues.h"
#include "tallyctl/SessionInfo.h"

namespace tallyd::tallyctl {

/// The options that say what a session is. Stays where it is from addTo() on.
class SessionArguments {
 public:
  enum class ClientType { Chosen, Fixed };

  void addTo(CLI::App& command, ClientType clientType = ClientType::Chosen);
  [[nodiscard]] SessionOptions options() const;

 private:
  SessionOptions _options;
  std::vector<std::string> _userInfo;
};

/// The options that spell out one message. Stays where it is from addTo() on.
class MessageArguments {
 public:
  void addTo(CLI::App& command);
  void require();
  void exclude(CLI::Option* other);
  /// Throws CLI::RequiredError when category or type is missing.
  [[nodiscard]] Message message() const;

 private:
  Message _message;
  std::vector<std::string> _assignments;
  CLI::Option* _category = nullptr;
  CLI::Option* _type = nullptr;
  CLI::Option* _payload = nullptr;
};

}  // namespace tallyd::tallyctl
