#include "session/ClientSessionExport.h"

#include <optional>
#include <stdexcept>

#include "framework/ClientSessionInterface.h"
#include "platform/Sandbox.h"
#include "session/TallydSession.h"

namespace tallyd {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

/// Arguments that the signature lets through and the interface does not.
struct WrongArguments : std::runtime_error {
  using std::runtime_error::runtime_error;
};

/// "aa{sv}": nothing, or one dictionary.
std::optional<Dictionary> optionalDictionary(const Value& argument) {
  const Array* list = argument.array();
  if (!list || list->size() > 1)
    throw WrongArguments("a dictionary that may be missing has at most one element");
  if (list->empty()) return std::nullopt;
  const Dictionary* dictionary = (*list)[0].dictionary();
  return dictionary ? *dictionary : Dictionary();
}

std::string text(const Value& argument) { return std::string(argument.string().value_or("")); }

std::uint16_t unsigned16(const Value& argument) {
  return static_cast<std::uint16_t>(argument.integerValue().value_or(0));
}

std::vector<std::string> texts(const Value& argument) {
  std::vector<std::string> all;
  if (const Array* list = argument.array()) {
    for (const Value& element : *list) all.push_back(text(element));
  }
  return all;
}

Value optionalText(const std::optional<std::string>& value) { return value ? Array{*value} : Array(); }

Value optionalTexts(const std::optional<std::vector<std::string>>& values) {
  Array optional;  // Filled by hand: compilers differ on whether braces around one array make a copy of it.
  if (values) optional.append(Array(std::vector<Value>(values->begin(), values->end())));
  return optional;
}

TallydSession::Reply<std::string> textReply(const std::shared_ptr<platform::IncomingCall>& call) {
  return [call](const std::string& value) { call->reply({value}); };
}

TallydSession::Reply<TallydSession::Result> optionalTextReply(
    const std::shared_ptr<platform::IncomingCall>& call) {
  return [call](const TallydSession::Result& value) { call->reply({optionalText(value)}); };
}

/// A reply block for a call that wants an answer, else no block.
TallydSession::Reply<std::optional<std::vector<std::string>>> statesReply(
    const std::shared_ptr<platform::IncomingCall>& call) {
  if (!call->expectsReply()) return {};
  return
      [call](const std::optional<std::vector<std::string>>& states) { call->reply({optionalTexts(states)}); };
}

}  // namespace

ClientSessionExport::ClientSessionExport(std::shared_ptr<TallydSession> session, platform::Sandbox& sandbox)
    : _session(std::move(session)), _sandbox(sandbox) {}

ClientSessionExport::~ClientSessionExport() = default;

void ClientSessionExport::handleCall(const std::shared_ptr<platform::IncomingCall>& call) {
  try {
    switch (static_cast<ClientSessionMethod>(call->methodIndex())) {
      case ClientSessionMethod::SetSessionInfo:
        return setSessionInfo(call);
      case ClientSessionMethod::StartConfig:
        return startConfig(call);
      case ClientSessionMethod::FetchStates:
        return fetchStates(call);
      case ClientSessionMethod::FetchDisplayURL:
        return _session->fetchDisplayURL(textReply(call));
      case ClientSessionMethod::SendMessageWithCategory:
        return sendMessage(call);
      case ClientSessionMethod::FlushMessages:
        return _session->flushMessagesWithReply(optionalTextReply(call));
      case ClientSessionMethod::UploadFileAtPath:
        return uploadFile(call);
      case ClientSessionMethod::UploadLogData:
        return uploadLogData(call);
      case ClientSessionMethod::SendMessageWithSessionInfo:
        return sendMessageWithSessionInfo(call);
    }
  } catch (const WrongArguments& wrong) {
    call->rejectArguments(wrong.what());
  }
}

void ClientSessionExport::setSessionInfo(const Call& call) {
  const auto& arguments = call->arguments();
  _session->setSessionInfo(optionalDictionary(arguments[0]), optionalDictionary(arguments[1]),
                           texts(arguments[2]), textReply(call));
}

void ClientSessionExport::startConfig(const Call& call) {
  _session->startConfigWithCompletionHandler(statesReply(call));
}

void ClientSessionExport::fetchStates(const Call& call) {
  _session->fetchStatesWithUserInfo(optionalDictionary(call->arguments()[0]), statesReply(call));
}

void ClientSessionExport::sendMessage(const Call& call) {
  const auto& arguments = call->arguments();
  _session->sendMessageWithCategory(unsigned16(arguments[0]), unsigned16(arguments[1]),
                                    optionalDictionary(arguments[2]), optionalTextReply(call));
}

void ClientSessionExport::uploadFile(const Call& call) {
  const auto& arguments = call->arguments();
  const std::string token = text(arguments[1]);
  const auto grant =
      call->descriptors().empty() ? nullptr : _sandbox.offerGrant(token, std::move(call->descriptors()));
  _session->uploadFileAtPath(text(arguments[0]), token, [call](bool uploaded) { call->reply({uploaded}); });
}

void ClientSessionExport::uploadLogData(const Call& call) {
  const Array* logData = call->arguments()[0].array();
  _session->uploadLogData(logData ? *logData : Array(),
                          [call](bool uploaded, const TallydSession::Result& error) {
                            call->reply({uploaded, optionalText(error)});
                          });
}

void ClientSessionExport::sendMessageWithSessionInfo(const Call& call) {
  const auto& arguments = call->arguments();
  _session->sendMessageWithSessionInfo(
      optionalDictionary(arguments[0]), optionalDictionary(arguments[1]), unsigned16(arguments[2]),
      unsigned16(arguments[3]), optionalDictionary(arguments[4]),
      call->expectsReply() ? textReply(call) : TallydSession::Reply<std::string>());
}

}  // namespace tallyd
