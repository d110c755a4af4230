#include "support/DevToolsPipe.h"

#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <cerrno>
#include <stdexcept>

#include "platform/JSON.h"

namespace tallyd::test {

using platform::Dictionary;
using Clock = std::chrono::steady_clock;

DevToolsPipe::DevToolsPipe(platform::FileDescriptor commands, platform::FileDescriptor answers,
                           EventHandler onEvent)
    : _commands(std::move(commands)), _answers(std::move(answers)), _onEvent(std::move(onEvent)) {}

Dictionary DevToolsPipe::call(const std::string& method, const Dictionary& parameters) {
  const std::int64_t id = ++_lastId;
  Dictionary command{{"id", id}, {"method", method}, {"params", parameters}};
  if (_session) command.set("sessionId", *_session);
  write(platform::jsonFromValue(command).value());

  const auto deadline = Clock::now() + kPatience;
  while (true) {
    const Dictionary message = readMessage(deadline);
    if (const auto event = message.string("method")) {
      const Dictionary* about = message.dictionary("params");
      _onEvent(std::string(*event), about == nullptr ? Dictionary() : *about);
    } else if (message.integer("id") == id) {
      if (const Dictionary* error = message.dictionary("error"))
        throw std::runtime_error(method + ": " + std::string(error->string("message").value_or("refused")));
      const Dictionary* result = message.dictionary("result");
      return result == nullptr ? Dictionary() : *result;
    }
  }
}

void DevToolsPipe::write(const std::string& text) const {
  const std::size_t size = text.size() + 1;  // With the NUL at its end.
  for (std::size_t sent = 0; sent < size;) {
    const ssize_t count = ::write(_commands.get(), text.c_str() + sent, size - sent);
    if (count < 0 && errno != EINTR) throw std::runtime_error("the browser takes no commands");
    sent += static_cast<std::size_t>(std::max<ssize_t>(count, 0));
  }
}

Dictionary DevToolsPipe::readMessage(Clock::time_point deadline) {
  std::size_t searched = 0;
  std::size_t end = std::string::npos;
  while ((end = _received.find('\0', searched)) == std::string::npos) {
    searched = _received.size();
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now()).count();
    pollfd wanted{_answers.get(), POLLIN, 0};
    if (left <= 0 || ::poll(&wanted, 1, static_cast<int>(left)) == 0)
      throw std::runtime_error("the browser does not answer");
    std::array<char, 65'536> buffer;
    const ssize_t count = ::read(_answers.get(), buffer.data(), buffer.size());
    if (count == 0) throw std::runtime_error("the browser has ended");
    _received.append(buffer.data(), static_cast<std::size_t>(std::max<ssize_t>(count, 0)));
  }
  const auto parsed = platform::valueFromJSON(std::string_view(_received).substr(0, end));
  _received.erase(0, end + 1);
  const Dictionary* message = parsed.value ? parsed.value->dictionary() : nullptr;
  if (message == nullptr) throw std::runtime_error("the browser's answer is no object: " + parsed.error);
  return *message;
}

}  // namespace tallyd::test
