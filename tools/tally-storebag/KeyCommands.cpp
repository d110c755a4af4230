// The commands that keys and signatures are made and checked with.

#include <fmt/format.h>
#include <sys/stat.h>

#include <stdexcept>

#include "platform/Base64.h"
#include "platform/property-list/PropertyList.h"
#include "signing/StorebagSigning.h"
#include "storebag/StorebagRetrieval.h"
#include "storebag/StorebagSignature.h"
#include "tally-storebag/BagFile.h"
#include "tally-storebag/DescribedDevice.h"
#include "tally-storebag/Files.h"
#include "tally-storebag/Linter.h"
#include "tally-storebag/Tool.h"

namespace tallyd::storebagtool {

using platform::Dictionary;

namespace {

constexpr mode_t kForOwnerOnly = 0600;
constexpr mode_t kReadableByAll = 0644;

void requireNoFile(const std::filesystem::path& path) {
  if (std::filesystem::exists(path))
    throw std::runtime_error(fmt::format("{} is there already; --force replaces it", path.string()));
}

void makeFolderOf(const std::filesystem::path& path) {
  if (path.has_parent_path()) std::filesystem::create_directories(path.parent_path());
}

/// Why the daemon takes no bag out of the envelope, where it does not log that itself.
std::string unloggedReason(std::string_view envelope, std::string_view publicKeyDER) {
  if (!StorebagPublicKey::fromDER(publicKeyDER)) return "the public key is no RSA key in DER";
  const auto list = platform::propertyListWithData(envelope);
  const Dictionary* outer = list.value ? list.value->dictionary() : nullptr;
  const auto decodes = [&](std::string_view key) {
    const auto text = outer ? outer->string(key) : std::nullopt;
    return text && platform::base64DecodedIgnoringUnknown(*text);
  };
  if (!decodes("signature")) return "\"signature\" is not base64";
  if (!decodes("bag")) return "\"bag\" is missing or not base64";
  return "\"bag\" is not a property list";
}

/// What the daemon says of the envelope; empty when it takes the bag.
std::string refusal(const std::string& envelope, const std::string& publicKeyDER) {
  Recorded recorded;
  RecordingLog log(recorded.lines);
  AnsweringHTTPClient http(envelope);
  RecordingPowerLog powerLog(recorded.powerEvents);
  RecordingCodeBundles codeBundles(recorded.adaptorCalls);
  DescribedDevice device({}, publicKeyDER);
  std::int32_t maxAgeSeconds = 0;
  if (fetchSignedStorebag(device.platformWith(log, http, powerLog, codeBundles), "storebag", maxAgeSeconds))
    return {};
  std::string reasons;
  for (const LogLine& line : recorded.lines) {
    if (line.level > platform::LogLevel::Error) continue;
    // Behind the comma stands an address, which tells nobody anything.
    const bool isSignature = line.text.starts_with("Signature can not be verified");
    reasons += (reasons.empty() ? "" : "; ") + (isSignature ? "Signature can not be verified" : line.text);
  }
  return reasons.empty() ? unloggedReason(envelope, publicKeyDER) : reasons;
}

}  // namespace

int runCommand(const KeygenOptions& options, const Surroundings& surroundings) {
  if (!options.force) {
    requireNoFile(options.privateKey);
    requireNoFile(options.publicKey);
  }
  const auto key = signing::makeStorebagKey(options.bits);
  makeFolderOf(options.privateKey);
  makeFolderOf(options.publicKey);
  const Existing existing = options.force ? Existing::Replace : Existing::Keep;
  writeFile(options.privateKey, signing::privateKeyPEM(key.get()), kForOwnerOnly, existing);
  writeFile(options.publicKey, signing::publicKeyDER(key.get()), kReadableByAll, existing);
  surroundings.out << fmt::format("private key {}\npublic key {}\n", options.privateKey.string(),
                                  options.publicKey.string());
  return kSucceeded;
}

int runCommand(const SignOptions& options, const Surroundings& surroundings) {
  const BagFile file = readBagFile(options.bag);
  for (const Finding& finding : lintBag(file.bag)) {
    if (finding.severity == Severity::Error) complain(surroundings, textOf(finding));
  }
  std::string envelope;
  try {
    const auto key = signing::privateKeyFromPEM(readFile(options.key));
    signing::requireStorebagKey(key.get());
    envelope = signing::signedStorebag(key.get(), file.bag, options.format);
  } catch (const std::system_error&) {
    throw;  // Names the file already.
  } catch (const std::exception& error) {
    throw std::runtime_error(fmt::format("{}: {}", options.key.string(), error.what()));
  }
  if (options.out == kStandardStream)
    surroundings.out << envelope;
  else
    writeFile(options.out, envelope, kReadableByAll, Existing::Replace);
  return kSucceeded;
}

int runCommand(const VerifyOptions& options, const Surroundings& surroundings) {
  const std::string reason = refusal(readFile(options.envelope), readFile(options.publicKey));
  if (!reason.empty()) throw std::runtime_error(fmt::format("{}: {}", options.envelope.string(), reason));
  surroundings.out << fmt::format("{}: the signature holds\n", options.envelope.string());
  return kSucceeded;
}

}  // namespace tallyd::storebagtool
