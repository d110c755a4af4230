#include "platform/sandbox/LinuxSandbox.h"

#include <fcntl.h>
#include <sys/prctl.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <iterator>
#include <system_error>

#include "platform/sandbox/FileProbes.h"
#include "platform/sandbox/LandlockRuleset.h"
#include "platform/sandbox/SandboxErrors.h"
#include "platform/sandbox/SandboxProfile.h"
#include "platform/sandbox/SystemCallFilter.h"
#include "platform/sandbox/SystemCallProbes.h"

namespace tallyd::platform {
namespace {

constexpr const char* kProfileFolder = "/usr/share/tally/sandbox";

std::string contentsOf(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  if (!file) throw ProfileError(fmt::format("can't be opened: {}", std::strerror(errno)));
  std::string bytes{std::istreambuf_iterator<char>(file), {}};
  if (file.bad()) throw ProfileError("can't be read");
  return bytes;
}

/// Runs one step of the confinement; an optional profile goes on without it.
template <class Step>
void attempt(const SandboxProfile& profile, const std::filesystem::path& path, Log& log, Step&& step) {
  try {
    step();
  } catch (const EnforcementError& error) {
    if (!profile.optional) throw;
    asl_log(log, LogLevel::Warning, "Sandbox profile {} is not enforced: {}", path.string(), error.what());
  }
}

}  // namespace

std::optional<std::string> LinuxSandbox::sandbox_init(std::string_view profileName) {
  if (profileName.empty() || profileName.find('/') != std::string_view::npos) {
    return fmt::format("\"{}\" is no name of a sandbox profile", profileName);
  }
  const auto path = _root.under(kProfileFolder) / fmt::format("{}.plist", profileName);
  try {
    confine(path);
  } catch (const std::exception& error) {
    return fmt::format("sandbox profile {}: {}", path.string(), error.what());
  }
  return std::nullopt;
}

void LinuxSandbox::confine(const std::filesystem::path& profilePath) {
  const SandboxProfile profile = sandboxProfileWithData(contentsOf(profilePath), _root);
  // Made first, so that a wrong name in the profile is told before anything is restricted.
  const SystemCallFilter filter(profile.systemCalls);
  attempt(profile, profilePath, _log, [] {
    if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) {
      throw EnforcementError(fmt::format("no-new-privileges can't be set: {}", std::strerror(errno)));
    }
  });
  attempt(profile, profilePath, _log, [&] { restrictFiles(profile); });
  attempt(profile, profilePath, _log, [&] {
    filter.enforce();
    _restrictsCalls = true;
  });
}

void LinuxSandbox::restrictFiles(const SandboxProfile& profile) {
  LandlockRuleset rules;
  // Folders are made before any rule, as one path may be both read and written.
  for (const auto& path : profile.write) {
    std::error_code error;
    if (!std::filesystem::exists(path, error)) std::filesystem::create_directories(path, error);
    if (error) asl_log(_log, LogLevel::Warning, "Sandbox: can't make {}: {}", path.string(), error.message());
  }
  for (const auto& path : profile.read) rules.allow(path, LandlockRuleset::Access::Read);
  for (const auto& path : profile.write) rules.allow(path, LandlockRuleset::Access::Write);
  for (const auto& path : profile.remove) rules.allow(path, LandlockRuleset::Access::Remove);
  // Enforced twice, so that the probes leave nothing in the system's audit, but later refusals do.
  rules.enforce(LandlockRuleset::Refusals::Quiet);
  _fileHoles = reachableFiles();
  rules.enforce(LandlockRuleset::Refusals::Audited);
}

std::vector<std::string> LinuxSandbox::holes() const {
  std::vector<std::string> holes = _fileHoles;
  if (!_restrictsCalls) return holes;
  for (const auto& [act, calls] : systemCallsLetThrough()) {
    holes.push_back(fmt::format("{} ({})", act, fmt::join(calls, ", ")));
  }
  return holes;
}

std::unique_ptr<Sandbox::Grant> LinuxSandbox::offerGrant(std::string_view token,
                                                         std::vector<FileDescriptor> descriptors) {
  return _grants.offer(token, std::move(descriptors));
}

Sandbox::ExtensionHandle LinuxSandbox::sandbox_extension_consume(std::string_view token) {
  return _grants.consume(token);
}

void LinuxSandbox::sandbox_extension_release(ExtensionHandle handle) { _grants.release(handle); }

FileDescriptor LinuxSandbox::openForReading(std::string_view path) {
  FileDescriptor granted = _grants.open(path);
  if (granted || errno != ENOENT) return granted;
  // Not blocking, so that a path that turns out to be a pipe holds nobody up.
  return FileDescriptor(::open(std::string(path).c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK));
}

}  // namespace tallyd::platform
