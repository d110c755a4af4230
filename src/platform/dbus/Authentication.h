// The dialogue before the first message (D-Bus Specification, "Authentication Protocol").
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

namespace tallyd::platform::dbus {

/// One side's part of the dialogue: bytes in, bytes out.
///
/// Bounds: a line is at most kMaximumLineBytes long and there are at most kMaximumLines.
class Authentication {
 public:
  enum class Progress { More, Over, Failed };
  static constexpr std::size_t kMaximumLineBytes = 16'384;
  static constexpr int kMaximumLines = 64;

  virtual ~Authentication() = default;

  /// What this side says first.
  [[nodiscard]] virtual std::string opening() const = 0;
  /// Takes whole lines from the front of `bytes`, as far as the dialogue goes, and appends what is to be
  /// answered to `answers`. `taken` gets how many bytes that were.
  Progress take(std::string_view bytes, std::size_t& taken, std::string& answers);

 protected:
  /// One line without its end.
  virtual Progress takeLine(std::string_view line, std::string& answers) = 0;
  /// How many bytes at the front are no line's; they are not yet there while it is more than there are.
  [[nodiscard]] virtual std::size_t prefixBytes() const { return 0; }
  virtual bool takePrefix(std::string_view) { return true; }

 private:
  int _lines = 0;
};

/// The service's part: EXTERNAL and ANONYMOUS, and descriptors when they are asked for.
class ServerAuthentication final : public Authentication {
 public:
  /// @param peer        the user that EXTERNAL must name.
  /// @param identifier  the server's, 32 hexadecimal digits.
  ServerAuthentication(uid_t peer, std::string identifier)
      : _peer(peer), _identifier(std::move(identifier)) {}

  [[nodiscard]] std::string opening() const override { return {}; }

 private:
  enum class State { Start, Mechanism, ExternalData, AnonymousData, Accepted };

  Progress takeLine(std::string_view line, std::string& answers) override;
  [[nodiscard]] std::size_t prefixBytes() const override { return _state == State::Start ? 1 : 0; }
  bool takePrefix(std::string_view prefix) override;
  void chooseMechanism(std::string_view words, std::string& answers);
  void external(std::string_view identity, std::string& answers);
  void accept(std::string& answers);
  void reject(std::string& answers);

  const uid_t _peer;
  const std::string _identifier;
  State _state = State::Start;
};

/// The client's part: EXTERNAL, then descriptors, all said at once.
class ClientAuthentication final : public Authentication {
 public:
  [[nodiscard]] std::string opening() const override;

 private:
  enum class Awaited { Data, Acceptance, Descriptors };
  Progress takeLine(std::string_view line, std::string& answers) override;

  Awaited _awaited = Awaited::Data;
};

}  // namespace tallyd::platform::dbus
