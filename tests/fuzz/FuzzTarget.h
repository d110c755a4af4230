// What every fuzz target is made of: the function that the engine calls, its input, and checks that end it.
#pragma once

#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>

/// Runs one input. What it does may depend on the input only. Whatever is wrong ends the process.
extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size);

namespace tallyd::fuzz {

/// An input, taken from the front.
class Input {
 public:
  Input(const std::uint8_t* data, std::size_t size)
      : _rest(size == 0 ? std::string_view() : std::string_view(reinterpret_cast<const char*>(data), size)) {}

  [[nodiscard]] bool isEmpty() const { return _rest.empty(); }
  /// 0 at the end.
  std::uint8_t takeByte() {
    const auto byte = takeBytes(1);
    return byte.empty() ? std::uint8_t{0} : static_cast<std::uint8_t>(byte[0]);
  }
  /// Fewer at the end.
  std::string_view takeBytes(std::size_t count) {
    const auto taken = _rest.substr(0, count);
    _rest.remove_prefix(taken.size());
    return taken;
  }
  /// Up to the next line feed, which goes too, or the end.
  std::string_view takeLine() {
    const auto line = _rest.substr(0, _rest.find('\n'));
    _rest.remove_prefix(line.size());
    if (!_rest.empty()) _rest.remove_prefix(1);
    return line;
  }
  std::string_view takeRest() { return takeBytes(_rest.size()); }

 private:
  std::string_view _rest;
};

/// The pieces that a text arrives in: their lengths come from a seed.
class Pieces {
 public:
  /// @param seed  0 for one piece.
  Pieces(std::string_view text, std::uint32_t seed) : _rest(text), _state(seed) {}

  [[nodiscard]] bool areOver() const { return _rest.empty(); }
  [[nodiscard]] std::size_t left() const { return _rest.size(); }  ///< In bytes.
  std::string_view take() {
    if (_state == 0) return cut(_rest.size());
    _state = _state * 1'664'525U + 1'013'904'223U;
    const std::uint32_t random = _state >> 8U;
    // Short pieces find what is half there, long ones get through long inputs.
    return cut(random % 4 == 0 ? 1 + random / 4 % 512 : 1 + random / 4 % 12);
  }

 private:
  std::string_view cut(std::size_t length) {
    const auto piece = _rest.substr(0, length);
    _rest.remove_prefix(piece.size());
    return piece;
  }

  std::string_view _rest;
  std::uint32_t _state;
};

[[noreturn]] inline void fail(const char* condition, const char* file, int line) {
  std::fprintf(stderr, "%s:%d: not true: %s\n", file, line, condition);
  std::abort();
}

}  // namespace tallyd::fuzz

/// Ends the process when the condition does not hold, in every kind of build.
#define FUZZ_CHECK(condition) \
  ((condition) ? static_cast<void>(0) : ::tallyd::fuzz::fail(#condition, __FILE__, __LINE__))
