// The body of a request, taken in parts and decoded as it comes.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <string_view>

namespace tallyd::station {

/// A body that can't be taken.
class BodyError : public std::runtime_error {
 public:
  BodyError(int status, const std::string& problem) : std::runtime_error(problem), _status(status) {}
  [[nodiscard]] int status() const { return _status; }  ///< An HTTP status code.

 private:
  const int _status;
};

/// Hands a body on, decoded, in parts; of gzip (RFC 1952) any number of members, each whole with its trailer.
///
/// Threading: one thread.
class BodyDecoder {
 public:
  enum class Encoding { Identity, Gzip };
  using Sink = std::function<void(std::string_view)>;

  /// Of a "Content-Encoding"; nothing for one that is not known.
  [[nodiscard]] static std::optional<Encoding> encodingNamed(std::string_view name);
  /// "identity" or "gzip".
  [[nodiscard]] static std::string_view nameOf(Encoding encoding);

  /// @param limit  Bytes, decoded.
  BodyDecoder(Encoding encoding, std::uint64_t limit, Sink sink);
  ~BodyDecoder();
  BodyDecoder(const BodyDecoder&) = delete;
  BodyDecoder& operator=(const BodyDecoder&) = delete;

  /// Takes the next part. Throws BodyError for a body that is broken (400) or too large (413), and what the
  /// sink throws; the decoder is of no use after that.
  void put(std::string_view bytes);
  /// Throws BodyError (400) when the body is not whole.
  void finish() const;

 private:
  struct Inflater;
  void hand(std::string_view decoded);
  void inflate(std::string_view bytes);

  const std::uint64_t _limit;
  const Sink _sink;
  std::uint64_t _decodedBytes = 0;
  std::unique_ptr<Inflater> _inflater;  ///< Null for Identity.
};

/// A whole body, decoded; throws as the decoder does.
[[nodiscard]] std::string decodedBody(BodyDecoder::Encoding encoding, std::uint64_t limit,
                                      std::string_view bytes);

}  // namespace tallyd::station
