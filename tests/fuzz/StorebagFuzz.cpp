// A storebag server's answer: envelope, signature, environments, and the backends that a section makes.

#include <string>

#include "ClosedPlatform.h"
#include "FuzzTarget.h"
#include "fakes/SignedStorebag.h"
#include "framework/TallyKeys.h"
#include "platform/property-list/PropertyList.h"
#include "session/BackendSetup.h"
#include "storebag/StorebagEnvironment.h"
#include "storebag/StorebagRetrieval.h"
#include "support/SessionBook.h"

namespace tallyd::fuzz {
namespace {

using platform::Dictionary;
using platform::FatalFailures;

constexpr std::int32_t kClientType = 5;

class Server {
 public:
  explicit Server(std::string_view cacheControl, std::uint8_t environment) {
    closed.fake.frameworkBundle.resources["publicKey.der"] = publicKey();
    closed.fake.preferences.set("com.quillon.tally", "environmentType", environment % 5);
    if (!cacheControl.empty()) _headers.emplace_back("Cache-Control", cacheControl);
  }

  void serve(std::string body) {
    closed.fake.http.answer = [this, body = std::move(body)](const platform::HTTPRequest&) {
      return fakes::FakeHTTPClient::ok(body, _headers);
    };
  }
  [[nodiscard]] StorebagFetch fetch() {
    return fetchStorebagForClientType(closed.platform, kClientType, FatalFailures::FailRequest);
  }

  ClosedPlatform closed;

 private:
  static const std::string& publicKey() {
    static const std::string key = fakes::StorebagSigner::server().subjectPublicKeyInfo();
    return key;
  }
  std::vector<std::pair<std::string, std::string>> _headers;
};

void checkBackend(TallyBackend& backend) {
  backend.updateState();
  FUZZ_CHECK(backend.state() >= ReportingStatePending && backend.state() <= ReportingStateOn);
  const timeval time{1'763'712'000, 1'000};
  (void)backend.sendMessage(Dictionary{{"speed", 2.5}, {"secret", "x"}}, time, 4, 0);
  (void)backend.sendMessage(Dictionary{{"speed", 2.5}}, time, 4, 1);
  (void)backend.flushMessages();
  (void)backend.uploadLogData(platform::Array{"line"});
  backend.cleanup();
}

/// Every entry makes a backend or none; whichever there are can be used, and their books balance.
void checkBackends(ClosedPlatform& closed, const Dictionary& section, std::uint8_t flags) {
  SessionBook book;
  const Dictionary sessionInfo{{std::string(kTallySessionInfoSessionID), 7},
                               {std::string(kTallySessionInfoClientType), kClientType + flags % 7},
                               {std::string(kTallySessionInfoRequireUserInfo), (flags & 1U) != 0},
                               {std::string(kTallySessionInfoBatchEvent), (flags & 2U) != 0}};
  const Dictionary userInfo{{std::string(kTallyUserInfoClientName), "Studio"},
                            {std::string(kTallyUserInfoServiceName), "Calls"}};
  closed.fake.preferences.set("com.quillon.diagnostics", "DiagnosticLogSubmissionEnabled", (flags & 4U) != 0);
  {
    const auto backends = createBackendsFromStorebag(closed.platform, section, sessionInfo, userInfo, "0123",
                                                     TallyBackend::newBackendWithName, &book);
    FUZZ_CHECK(backends.has_value());
    FUZZ_CHECK(backends->size() <= section.size());
    for (const auto& [name, backend] : *backends) {
      FUZZ_CHECK(section.contains(name));
      checkBackend(*backend);
    }
  }
  closed.fake.queues.advance(std::chrono::hours(1));
  for (const auto& [name, counts] : book.counts().backends) FUZZ_CHECK(counts.isBalanced());
}

/// Nobody but the server can make a storebag.
void checkForeign(std::string_view body, std::string_view cacheControl, std::uint8_t flags) {
  Server server(cacheControl, flags);
  server.serve(std::string(body));
  const StorebagFetch fetch = server.fetch();
  FUZZ_CHECK(!fetch.storebag && !fetch.version);
}

void checkSigned(std::string_view bag, std::string_view cacheControl, std::uint8_t flags) {
  Server server(cacheControl, flags);
  const auto& signer = fakes::StorebagSigner::server();
  const std::string signature = platform::base64Encoded(signer.signature(bag));
  server.serve(fakes::StorebagSigner::envelopeOf(signature, platform::base64Encoded(bag)));
  const StorebagFetch fetch = server.fetch();
  const auto list = platform::propertyListWithData(bag);
  const Dictionary* content = list.value ? list.value->dictionary() : nullptr;
  if (fetch.storebag) {
    FUZZ_CHECK(content && fetch.version);
    checkBackends(server.closed, *fetch.storebag, flags);
  }
  const auto environment = environmentNameForType(flags % 5);
  const bool isSound = content && environment && content->dictionary(*environment) &&
                       content->contains("version") && !cacheAgeFromHeader(cacheControl).endsInMaxAge;
  if (isSound) FUZZ_CHECK(fetch.storebag.has_value());

  std::string altered(bag);
  if (altered.empty()) return;
  altered[flags % altered.size()] = static_cast<char>(altered[flags % altered.size()] ^ 1);
  server.serve(fakes::StorebagSigner::envelopeOf(signature, platform::base64Encoded(altered)));
  FUZZ_CHECK(!server.fetch().storebag);
}

}  // namespace
}  // namespace tallyd::fuzz

/// A byte of flags; 's' for a bag that the server signs, else an answer as it stands; the rest of the line is
/// "Cache-Control"; then the bag or the answer.
int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  Input input(data, size);
  const std::uint8_t flags = input.takeByte();
  const bool isSigned = input.takeByte() == 's';
  const auto cacheControl = input.takeLine();
  (isSigned ? checkSigned : checkForeign)(input.takeRest(), cacheControl, flags);
  return 0;
}
