// Inputs like those of a corpus, the same ones in every run.
#pragma once

#include <cstddef>
#include <cstdint>
#include <random>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

namespace tallyd::fuzz {

/// The words of a libFuzzer dictionary: lines NAME="TEXT" or "TEXT", with \\, \" and \xNN.
[[nodiscard]] std::vector<std::string> dictionaryFrom(std::string_view text);

/// Changes inputs at random places, without looking at what comes of it.
class Mutator {
 public:
  static constexpr std::size_t kMaximumBytes = 8'192;

  /// @param corpus  at least one input.
  Mutator(std::vector<std::string> corpus, std::vector<std::string> words)
      : _corpus(std::move(corpus)), _words(std::move(words)) {}

  [[nodiscard]] std::string next();

 private:
  /// Below `bound`, which is at least 1. The standard's distributions differ between libraries.
  std::size_t below(std::size_t bound) { return static_cast<std::size_t>(_random() % bound); }
  void change(std::string& input);
  void insert(std::string& input, std::string_view text) { input.insert(below(input.size() + 1), text); }
  std::string_view pieceOf(std::string_view text);

  const std::vector<std::string> _corpus;
  const std::vector<std::string> _words;
  std::mt19937_64 _random{20'261'121};
};

}  // namespace tallyd::fuzz
