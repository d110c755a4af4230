// The daemon's entry point: opens the log, takes its sockets, enters the sandbox, serves.

#include <sys/resource.h>
#include <systemd/sd-daemon.h>
#include <unistd.h>

#include <csignal>
#include <cstdlib>
#include <future>

#include "daemon/DaemonOptions.h"
#include "daemon/Drain.h"
#include "daemon/InspectionService.h"
#include "daemon/ProductionPlatform.h"
#include "daemon/TallydAgent.h"
#include "framework/ClientSessionInterface.h"
#include "framework/InspectionInterface.h"
#include "framework/TallyLogging.h"
#include "platform/ipc/DBusListener.h"
#include "platform/sandbox/LinuxSandbox.h"
#include "platform/system/ProcessMemory.h"
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

sigset_t stopSignal() {
  sigset_t signals;
  sigemptyset(&signals);
  sigaddset(&signals, SIGTERM);
  return signals;
}

/// Keeps SIGTERM from this thread and those that it starts, so that it waits until somebody asks for it.
void holdStopSignal() {
  const sigset_t signals = stopSignal();
  pthread_sigmask(SIG_BLOCK, &signals, nullptr);
}

/// The next one has its default action again: it ends the process at once.
void waitForStopSignal() {
  const sigset_t signals = stopSignal();
  int number = 0;
  while (sigwait(&signals, &number) != 0) {
  }
  pthread_sigmask(SIG_UNBLOCK, &signals, nullptr);
}

/// Ends the sessions, gives what is under way its time and says what became of everything.
void drain(const tallyd::platform::Platform& platform, tallyd::TallydAgent& agent, tallyd::Ledger& ledger,
           std::chrono::seconds time) {
  sd_notify(0, "STOPPING=1\nSTATUS=Draining");
  agent.endSessions();
  const auto done = std::make_shared<std::promise<void>>();
  tallyd::Drain drain(platform.queues, ledger);
  drain.start(time, [done](auto) { done->set_value(); });
  done->get_future().wait();
  const auto totals = ledger.totals();
  asl_log(platform.log, tallyd::unfinishedOf(totals) == 0 ? LogLevel::Info : LogLevel::Warning, "{}",
          tallyd::balanceLine(totals));
}

/// Why the daemon could not start: to the log, and to whoever started it when the log goes elsewhere.
void reportFailedStart(tallyd::platform::Log& log, const tallyd::DaemonOptions& options, LogLevel level,
                       const std::string& reason) {
  asl_log(log, level, "{}\n", reason);
  if (options.logDestination != tallyd::platform::LogDestination::StandardError) {
    fmt::print(stderr, "tallyd: {}\n", reason);
  }
}

using TakenSocket = std::unique_ptr<const tallyd::platform::ListeningSocket>;

/// The inspection service's own socket; null, after a warning, where it can't be had: the daemon does its
/// work without it.
TakenSocket takeInspectionSocket(const tallyd::platform::Root& root, tallyd::platform::Log& log) {
  try {
    return std::make_unique<const tallyd::platform::ListeningSocket>(
        tallyd::inspectionSocketPath(root), tallyd::platform::SocketAccess::OwnersOnly);
  } catch (const std::exception& error) {
    asl_log(log, LogLevel::Warning, "Running without inspection: {}", error.what());
    return nullptr;
  }
}

/// Enters the sandbox and makes sure that it holds. False, after saying why, when the daemon must not start.
bool confine(const tallyd::DaemonOptions& options, tallyd::platform::Log& log,
             tallyd::platform::LinuxSandbox& sandbox) {
  if (!options.sandbox) {
    asl_log(log, LogLevel::Warning, "Running without a sandbox.");
    return true;
  }
  if (const auto error = sandbox.sandbox_init(kSandboxProfile)) {
    reportFailedStart(log, options, LogLevel::Error, fmt::format("sandbox_init() fails: {}", *error));
    return false;
  }
  const auto holes = sandbox.holes();
  if (holes.empty()) return true;
  reportFailedStart(log, options, LogLevel::Critical,
                    fmt::format("The sandbox does not hold. The process could: {}", fmt::join(holes, "; ")));
  return false;
}

int serve(const tallyd::DaemonOptions& options, const tallyd::platform::Root& root,
          tallyd::platform::Log& log, const tallyd::platform::Clock& clock,
          tallyd::platform::LinuxSandbox& sandbox) {
  // Taken first, as nothing in the sandbox may listen. Nobody is accepted before it has proved to hold.
  auto socket = std::make_unique<const tallyd::platform::ListeningSocket>(tallyd::tallydSocketPath(root));
  TakenSocket inspectionSocket = takeInspectionSocket(root, log);
  if (!confine(options, log, sandbox)) return kSandboxFailure;
  const tallyd::ProductionPlatform production(root, log, clock, sandbox, options.retryPosts);
  const tallyd::platform::Platform& platform = production.platform();
  auto listener = std::make_unique<tallyd::platform::DBusListener>(std::move(socket), platform.queues, log);
  const auto tap = std::make_shared<tallyd::Tap>(platform.queues, clock);
  const auto ledger = std::make_shared<tallyd::Ledger>(tap);
  tallyd::TallydAgent agent(platform, ledger, options.agent);
  tallyd::InspectionService inspection(log, *ledger, *tap, geteuid());
  std::unique_ptr<tallyd::platform::DBusListener> inspectionListener;
  if (inspectionSocket) {
    inspectionListener =
        std::make_unique<tallyd::platform::DBusListener>(std::move(inspectionSocket), platform.queues, log);
    inspectionListener->setDelegate(inspection);
    inspectionListener->resume();
  }
  listener->setDelegate(agent);
  listener->resume();
  asl_log(log, LogLevel::Info, "Listener resumes with sandbox, start loop.");
  tallyd::platform::releaseStartPages();
  sd_notify(0, "READY=1\nSTATUS=Listening");
  if (!options.drain) runMainLoop();

  waitForStopSignal();
  listener.reset();
  drain(platform, agent, *ledger, *options.drain);
  inspectionListener.reset();
  // What has not ended in time may block for longer: nothing waits for it.
  std::_Exit(EXIT_SUCCESS);
}

}  // namespace

int main(int argc, char** argv) {
  const auto parsed = tallyd::parseDaemonOptions(argc, argv);
  if (!parsed.options) return parsed.exitStatus;
  const tallyd::DaemonOptions& options = *parsed.options;

  std::signal(SIGPIPE, SIG_IGN);
  if (options.drain) holdStopSignal();
  raiseDescriptorLimit();
  tallyd::platform::keepFreedMemory();
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
