// The daemon's entry point: opens the log, enters the sandbox, listens.

#include <sys/resource.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <csignal>

#include "daemon/DaemonOptions.h"
#include "daemon/InspectionService.h"
#include "daemon/ProductionPlatform.h"
#include "daemon/TallydAgent.h"
#include "framework/ClientSessionInterface.h"
#include "framework/InspectionInterface.h"
#include "framework/TallyLogging.h"
#include "platform/ipc/DBusListener.h"
#include "platform/sandbox/LinuxSandbox.h"
#include "platform/system/SystemClock.h"

namespace {

using tallyd::platform::asl_log;
using tallyd::platform::LogLevel;

constexpr const char* kSandboxProfile = "com.quillon.tallyd";
constexpr int kSandboxFailure = -1;

/// Every connection takes a descriptor: as many as the system allows.
void raiseDescriptorLimit() {
  rlimit limit{};
  if (getrlimit(RLIMIT_NOFILE, &limit) != 0) return;
  limit.rlim_cur = limit.rlim_max;
  setrlimit(RLIMIT_NOFILE, &limit);
}

/// The main thread's run loop: everything happens on queues, until a signal ends the process.
[[noreturn]] void runMainLoop() {
  while (true) pause();
}

/// Why the daemon could not start: to the log, and to whoever started it when the log goes elsewhere.
void reportFailedStart(tallyd::platform::Log& log, const tallyd::DaemonOptions& options, LogLevel level,
                       const std::string& reason) {
  asl_log(log, level, "{}\n", reason);
  if (options.logDestination != tallyd::platform::LogDestination::StandardError) {
    fmt::print(stderr, "tallyd: {}\n", reason);
  }
}

/// The inspection service's own socket; null, after a warning, where it can't be had: the daemon does its
/// work without it.
std::unique_ptr<tallyd::platform::DBusListener> makeInspectionListener(
    const tallyd::platform::Root& root, const tallyd::platform::Platform& platform) {
  try {
    return std::make_unique<tallyd::platform::DBusListener>(tallyd::inspectionSocketPath(root),
                                                             platform.queues, platform.log,
                                                             tallyd::platform::SocketAccess::OwnersOnly);
  } catch (const std::exception& error) {
    asl_log(platform.log, LogLevel::Warning, "Running without inspection: {}", error.what());
    return nullptr;
  }
}

int serve(const tallyd::DaemonOptions& options, const tallyd::platform::Root& root,
          tallyd::platform::Log& log, const tallyd::platform::Clock& clock,
          tallyd::platform::Sandbox& sandbox) {
  if (!options.sandbox) {
    asl_log(log, LogLevel::Warning, "Running without a sandbox.");
  } else if (const auto error = sandbox.sandbox_init(kSandboxProfile)) {
    reportFailedStart(log, options, LogLevel::Error, fmt::format("sandbox_init() fails: {}", *error));
    return kSandboxFailure;
  }
  const tallyd::ProductionPlatform production(root, log, clock, sandbox);
  const tallyd::platform::Platform& platform = production.platform();
  tallyd::platform::DBusListener listener(tallyd::tallydSocketPath(root), platform.queues, log);
  const auto tap = std::make_shared<tallyd::Tap>(platform.queues, clock);
  const auto ledger = std::make_shared<tallyd::Ledger>(tap);
  tallyd::TallydAgent agent(platform, ledger);
  tallyd::InspectionService inspection(log, *ledger, *tap, geteuid());
  const auto inspectionListener = makeInspectionListener(root, platform);
  if (inspectionListener) {
    inspectionListener->setDelegate(inspection);
    inspectionListener->resume();
  }
  listener.setDelegate(agent);
  listener.resume();
  asl_log(log, LogLevel::Info, "Listener resumes with sandbox, start loop.");
  sd_notify(0, "READY=1\nSTATUS=Listening");
  runMainLoop();
}

}  // namespace

int main(int argc, char** argv) {
  const auto parsed = tallyd::parseDaemonOptions(argc, argv);
  if (!parsed.options) return parsed.exitStatus;
  const tallyd::DaemonOptions& options = *parsed.options;

  std::signal(SIGPIPE, SIG_IGN);
  raiseDescriptorLimit();
  const tallyd::platform::SystemClock clock;
  const tallyd::platform::Root root(options.root);
  const auto log = tallyd::platform::makeLog(options.logDestination, options.logLevel, clock);
  tallyd::TallyLogging(*log).startLogging("tallyd", "Daemon");
  tallyd::platform::LinuxSandbox sandbox(root, *log);
  try {
    return serve(options, root, *log, clock, sandbox);
  } catch (const std::exception& error) {
    reportFailedStart(*log, options, LogLevel::Critical, fmt::format("tallyd can't start: {}", error.what()));
    return EXIT_FAILURE;
  }
}
