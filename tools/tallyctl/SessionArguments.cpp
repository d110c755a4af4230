#include "tallyctl/SessionArguments.h"

#include <fmt/format.h>
#include <CLI/CLI.hpp>

#include "tallyctl/OptionTexts.h"

namespace tallyd::tallyctl {

void SessionArguments::addTo(CLI::App& command, ClientType clientType) {
  if (clientType == ClientType::Chosen) {
    addInteger<std::int32_t>(command, "--client-type", kClientTypeText, _options.clientType)
        ->default_str(fmt::format("{}", _options.clientType));
  }
  addInteger<std::uint32_t>(command, "--session-id", "Session number, 32 bits; by default a random one",
                            _options.sessionID);
  addInteger<std::uint16_t>(command, "--client-version", "Client version, 0 to 65535",
                            _options.clientVersion);
  command.add_flag("--require-user-info", _options.requireUserInfo,
                   "Let backends report only once the user info is known");
  command.add_flag("--batch", _options.batchEvent, "Let events be batched");
  command.add_option("--client-name", _options.clientName, "User info: the client's name")->type_name("NAME");
  command.add_option("--service-name", _options.serviceName, "User info: the service's name")
      ->type_name("NAME");
  takeAssignments(
      command.add_option("--user-info", _userInfo, "User info: a further KEY=VALUE or KEY:=JSON; repeatable"))
      ->allow_extra_args(false);
  command.add_option("--framework", _options.frameworks, "A framework to check; repeatable")
      ->type_name("NAME")
      ->allow_extra_args(false);
}

SessionOptions SessionArguments::options() const {
  SessionOptions options = _options;
  options.furtherUserInfo = dictionaryFrom("--user-info", _userInfo);
  return options;
}

void MessageArguments::addTo(CLI::App& command) {
  _category = addInteger<std::uint16_t>(command, "--category", "Category of the message, 0 to 65535",
                                        _message.category);
  _type = addInteger<std::uint16_t>(command, "--type", "Type of the message, 0 to 65535", _message.type);
  _payload = takeAssignments(command.add_option("payload", _assignments, kPayloadText));
}

void MessageArguments::require() {
  _category->required();
  _type->required();
}

void MessageArguments::exclude(CLI::Option* other) {
  for (CLI::Option* option : {_category, _type, _payload}) option->excludes(other);
}

Message MessageArguments::message() const {
  if (_category->empty()) throw CLI::RequiredError("--category");
  if (_type->empty()) throw CLI::RequiredError("--type");
  Message message = _message;
  if (!_assignments.empty()) message.payload = dictionaryFrom("payload", _assignments);
  return message;
}

}  // namespace tallyd::tallyctl
