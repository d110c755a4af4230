#include "backends/TallyBackend.h"

#include <fmt/format.h>
#include <openssl/evp.h>
#include <openssl/sha.h>

#include <algorithm>
#include <array>

#include "platform/Platform.h"
#include "platform/Randomness.h"
#include "platform/text/UnicodeText.h"

namespace tallyd {

namespace {

using Digest = std::array<unsigned char, SHA256_DIGEST_LENGTH>;

/// OpenSSL's functions for one text look the algorithm up by its name each time, which costs more than the
/// digest of a short one.
Digest sha256(std::string_view text) {
  struct Kept {
    EVP_MD* algorithm = EVP_MD_fetch(nullptr, "SHA256", nullptr);
    EVP_MD_CTX* context = EVP_MD_CTX_new();
    ~Kept() {
      EVP_MD_CTX_free(context);
      EVP_MD_free(algorithm);
    }
  };
  thread_local const Kept kept;
  Digest digest{};
  EVP_DigestInit_ex2(kept.context, kept.algorithm, nullptr);
  EVP_DigestUpdate(kept.context, text.data(), text.size());
  EVP_DigestFinal_ex(kept.context, digest.data(), nullptr);
  return digest;
}

}  // namespace

TallyBackend::TallyBackend(const platform::Platform& platform, std::string_view name, Payload profile,
                           std::optional<std::string> productFamily)
    : _platform(platform),
      _profile(std::move(profile)),
      _name(name),
      _productFamily(std::move(productFamily)),
      _samplingFactor(platform.randomness.drand48()) {}

std::string TallyBackend::convertIntoSHA256(std::string_view text) {
  const std::size_t hashedBytes = std::min(platform::utf16Length(text), text.size());
  const auto digest = sha256(text.substr(0, hashedBytes));
  std::string hexadecimal;
  hexadecimal.reserve(2 * digest.size());
  constexpr std::string_view kDigits = "0123456789abcdef";
  for (const unsigned byte : digest) {
    hexadecimal += kDigits[byte >> 4U];
    hexadecimal += kDigits[byte & 0xFU];
  }
  return hexadecimal;
}

void TallyBackend::setSelfVersion(std::string_view version) {
  const auto point = version.find('.');
  _selfVersionMajor = static_cast<std::uint8_t>(platform::leadingInteger(version.substr(0, point)));
  _selfVersionMinor = 0;
  if (point == std::string_view::npos) return;
  _selfVersionMinor = static_cast<std::uint8_t>(platform::leadingInteger(version.substr(point + 1)));
}

void TallyBackend::setStartTimestamp(const timeval& timestamp) {
  _startTimeStamp = secondsFromTimeval(timestamp);
}

TallyBackend::Result TallyBackend::sendMessage(const Payload& payload, const timeval& timestamp,
                                               std::uint16_t method, std::uint16_t respCode) {
  ++_eventID;
  return sendMessage(payload, timestamp, method, respCode, _eventID);
}

TallyBackend::Result TallyBackend::sendMessage(const Payload&, const timeval&, std::uint16_t, std::uint16_t,
                                               std::uint16_t) {
  _account->passBy();
  return std::nullopt;
}

bool TallyBackend::uploadFileAtPath(std::string_view, std::string_view) {
  _account->passBy();
  return false;
}

bool TallyBackend::uploadLogData(const platform::Array&) {
  _account->passBy();
  return false;
}

double secondsFromTimeval(const timeval& time) {
  return static_cast<double>(time.tv_sec) + static_cast<double>(time.tv_usec) / 1'000'000;
}

std::string_view codeForClientType(std::int32_t clientType) {
  constexpr std::array<std::string_view, 12> kCodes{"KP", "WD", "YBF", "HJ", "ZU", "PH",
                                                    "VT", "DH", "LB",  "BW", "HT", "FN"};
  const auto index = static_cast<std::size_t>(clientType);
  return index < kCodes.size() ? kCodes[index] : std::string_view();
}

}  // namespace tallyd
