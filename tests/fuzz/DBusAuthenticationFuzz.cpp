// The dialogue before the first D-Bus message, from both ends, whole and in pieces.

#include <memory>
#include <string>

#include "FuzzTarget.h"
#include "platform/dbus/Authentication.h"

namespace tallyd::fuzz {
namespace {

using platform::dbus::Authentication;
using platform::dbus::ClientAuthentication;
using platform::dbus::ServerAuthentication;
using Progress = Authentication::Progress;

constexpr uid_t kPeer = 1000;
constexpr std::size_t kLongestAnswer = 64;

struct Outcome {
  Progress progress = Progress::More;
  std::string answers;
  std::size_t left = 0;  ///< Bytes that are the first message's.
};

std::unique_ptr<Authentication> newSide(bool isServer) {
  if (!isServer) return std::make_unique<ClientAuthentication>();
  return std::make_unique<ServerAuthentication>(kPeer, std::string(32, 'a'));
}

/// As a connection does it: what was not taken is offered again, with what came since.
Outcome hold(bool isServer, std::string_view dialogue, std::uint32_t seed) {
  const auto side = newSide(isServer);
  Outcome outcome;
  std::string waiting;
  for (Pieces pieces(dialogue, seed); !pieces.areOver() && outcome.progress == Progress::More;) {
    waiting += pieces.take();
    std::size_t taken = 0;
    outcome.progress = side->take(waiting, taken, outcome.answers);
    FUZZ_CHECK(taken <= waiting.size());
    waiting.erase(0, taken);
    FUZZ_CHECK(outcome.progress != Progress::More || waiting.size() <= Authentication::kMaximumLineBytes);
    if (outcome.progress == Progress::Over) outcome.left = waiting.size() + pieces.left();
  }
  FUZZ_CHECK(outcome.answers.size() <= Authentication::kMaximumLines * kLongestAnswer);
  return outcome;
}

/// Nobody gets in without having been told so, and nobody under another's name.
void checkAdmission(std::string_view dialogue, const Outcome& outcome) {
  if (outcome.progress != Progress::Over) return;
  FUZZ_CHECK(dialogue[0] == '\0');
  FUZZ_CHECK(outcome.answers.find("OK " + std::string(32, 'a') + "\r\n") != std::string::npos);
  const auto accepted = outcome.answers.rfind("OK ");
  FUZZ_CHECK(outcome.answers.find("REJECTED", accepted) == std::string::npos);
}

}  // namespace
}  // namespace tallyd::fuzz

int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  using namespace tallyd::fuzz;
  Input input(data, size);
  const std::uint8_t seed = input.takeByte();
  const bool isServer = (seed & 1U) == 0;
  const auto dialogue = input.takeRest();
  const Outcome whole = hold(isServer, dialogue, 0);
  const Outcome parts = hold(isServer, dialogue, seed + 1U);
  FUZZ_CHECK(whole.progress == parts.progress);
  FUZZ_CHECK(whole.answers == parts.answers);
  FUZZ_CHECK(whole.left == parts.left);
  if (isServer) checkAdmission(dialogue, whole);
  return 0;
}
