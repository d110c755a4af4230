#include "support/HeadlessBrowser.h"

#include <fcntl.h>
#include <openssl/evp.h>
#include <sys/wait.h>
#include <unistd.h>

#include <array>
#include <csignal>
#include <filesystem>
#include <stdexcept>

#include "platform/JSON.h"

namespace tallyd::test {

using platform::Array;
using platform::Dictionary;
using platform::FileDescriptor;
using platform::Value;

namespace {

struct Pipe {
  FileDescriptor readEnd;
  FileDescriptor writeEnd;
};

/// Both ends above the descriptors 3 and 4, over which the browser's ends are put.
Pipe makePipe() {
  constexpr int kFirstFree = 10;
  std::array<int, 2> ends{};
  if (::pipe2(ends.data(), O_CLOEXEC) != 0) throw std::runtime_error("no pipe");
  const FileDescriptor readEnd(ends[0]);
  const FileDescriptor writeEnd(ends[1]);
  return {FileDescriptor(::fcntl(readEnd.get(), F_DUPFD_CLOEXEC, kFirstFree)),
          FileDescriptor(::fcntl(writeEnd.get(), F_DUPFD_CLOEXEC, kFirstFree))};
}

std::string installedBrowser() {
  for (const char* program : {"/usr/bin/chromium-headless-shell", "/usr/bin/chromium"})
    if (std::filesystem::exists(program)) return program;
  throw std::runtime_error("no browser: the package chromium-headless-shell is missing");
}

std::vector<std::string> browserArguments(const std::string& program, const std::filesystem::path& profile) {
  std::vector<std::string> arguments{program,
                                     "--headless",
                                     "--remote-debugging-pipe",
                                     "--user-data-dir=" + profile.string(),
                                     "--host-resolver-rules=MAP * ~NOTFOUND, EXCLUDE 127.0.0.1",
                                     "--no-proxy-server",
                                     "--ignore-certificate-errors",
                                     "--disable-background-networking",
                                     "--disable-component-update",
                                     "--disable-dev-shm-usage",
                                     "--disable-gpu",
                                     "--hide-scrollbars",
                                     "--no-first-run"};
  if (::geteuid() == 0) arguments.emplace_back("--no-sandbox");  // It refuses to be root's otherwise.
  arguments.emplace_back("about:blank");
  return arguments;
}

/// What went wrong within the page, of a result of Runtime.evaluate's; empty when nothing did.
std::string exceptionText(const Dictionary& result) {
  const Dictionary* details = result.dictionary("exceptionDetails");
  if (details == nullptr) return {};
  const Dictionary* exception = details->dictionary("exception");
  const auto text = exception == nullptr ? std::nullopt : exception->string("description");
  return std::string(text ? *text : details->string("text").value_or("an exception"));
}

std::string decodedBase64(std::string_view text) {
  std::string bytes(text.size(), '\0');
  const int size =
      EVP_DecodeBlock(reinterpret_cast<unsigned char*>(bytes.data()),
                      reinterpret_cast<const unsigned char*>(text.data()), static_cast<int>(text.size()));
  if (size < 0) throw std::runtime_error("the picture is no Base64");
  const std::size_t padding = text.size() - (text.find_last_not_of('=') + 1);
  bytes.resize(static_cast<std::size_t>(size) - padding);
  return bytes;
}

}  // namespace

HeadlessBrowser::HeadlessBrowser() {
  start(installedBrowser());
  attach();
  setViewport({});
}

HeadlessBrowser::~HeadlessBrowser() {
  _pipe.reset();           // The browser ends with it.
  ::kill(-_pid, SIGKILL);  // Its own process group: the helpers too.
  ::waitpid(_pid, nullptr, 0);
}

void HeadlessBrowser::start(const std::string& program) {
  Pipe commands = makePipe();
  Pipe answers = makePipe();
  const std::vector<std::string> arguments = browserArguments(program, _profile.path());
  std::vector<char*> words;
  words.reserve(arguments.size() + 1);
  for (const std::string& argument : arguments) words.push_back(const_cast<char*>(argument.c_str()));
  words.push_back(nullptr);
  _pid = ::fork();
  if (_pid < 0) throw std::runtime_error("can't start " + program);
  if (_pid == 0) {
    ::setpgid(0, 0);
    const int nowhere = ::open("/dev/null", O_RDWR | O_CLOEXEC);
    for (const int stream : {STDIN_FILENO, STDOUT_FILENO, STDERR_FILENO}) ::dup2(nowhere, stream);
    ::dup2(commands.readEnd.get(), 3);  // The browser's own choice of descriptors.
    ::dup2(answers.writeEnd.get(), 4);
    ::execv(program.c_str(), words.data());
    ::_exit(127);
  }
  ::setpgid(_pid, _pid);
  std::signal(SIGPIPE, SIG_IGN);  // A browser that ends must not end the test.
  _pipe = std::make_unique<DevToolsPipe>(
      std::move(commands.writeEnd), std::move(answers.readEnd),
      [this](const std::string& method, const Dictionary& parameters) { takeEvent(method, parameters); });
}

void HeadlessBrowser::attach() {
  const Dictionary target = _pipe->call("Target.createTarget", {{"url", "about:blank"}});
  const Dictionary attached = _pipe->call(
      "Target.attachToTarget", {{"targetId", target.string("targetId").value()}, {"flatten", true}});
  _pipe->setSession(std::string(attached.string("sessionId").value()));
  for (const char* domain : {"Page", "Runtime", "Network", "Log"})
    _pipe->call(std::string(domain) + ".enable");
}

void HeadlessBrowser::setViewport(const Viewport& viewport) {
  const bool phone = viewport.device == Device::Phone;
  _pipe->call(
      "Emulation.setDeviceMetricsOverride",
      {{"width", viewport.width}, {"height", viewport.height}, {"deviceScaleFactor", 1}, {"mobile", phone}});
  _pipe->call("Emulation.setTouchEmulationEnabled", {{"enabled", phone}});
}

void HeadlessBrowser::setColorScheme(ColorScheme scheme) {
  const Dictionary feature{{"name", "prefers-color-scheme"},
                           {"value", scheme == ColorScheme::Dark ? "dark" : "light"}};
  _pipe->call("Emulation.setEmulatedMedia", {{"features", Array{feature}}});
}

void HeadlessBrowser::open(const std::string& url) {
  const Dictionary result = _pipe->call("Page.navigate", {{"url", url}});
  if (const auto error = result.string("errorText"))
    throw std::runtime_error(url + ": " + std::string(*error));
  if (!waitUntil("document.readyState === 'complete'")) throw std::runtime_error(url + " does not load");
}

Value HeadlessBrowser::evaluate(const std::string& expression) {
  const Dictionary result = _pipe->call(
      "Runtime.evaluate", {{"expression", expression}, {"awaitPromise", true}, {"returnByValue", true}});
  if (const std::string problem = exceptionText(result); !problem.empty())
    throw std::runtime_error(expression + ": " + problem);
  const Dictionary* object = result.dictionary("result");
  const Value* value = object == nullptr ? nullptr : object->find("value");
  return value == nullptr ? Value() : *value;
}

std::string HeadlessBrowser::evaluateText(const std::string& expression) {
  return evaluate(expression).description();
}

bool HeadlessBrowser::waitUntil(const std::string& expression) {
  // Looked at from outside the page, in steps within it: a page that goes takes its promises with it.
  constexpr std::chrono::seconds kPatience{20};
  const auto deadline = std::chrono::steady_clock::now() + kPatience;
  const std::string step = "new Promise(resolve => setTimeout(() => resolve(!!(" + expression + ")), 20))";
  while (std::chrono::steady_clock::now() < deadline) {
    try {
      if (evaluate(step).booleanValue()) return true;
    } catch (const std::runtime_error& error) {
      const std::string_view text = error.what();
      const bool pageWent = text.find("context was destroyed") != std::string_view::npos ||
                            text.find("navigated or closed") != std::string_view::npos;
      if (!pageWent) throw;
    }
  }
  return false;
}

void HeadlessBrowser::pressKey(const std::string& key) {
  for (const char* type : {"keyDown", "keyUp"})
    _pipe->call("Input.dispatchKeyEvent", {{"type", type}, {"key", key}, {"code", key}});
}

void HeadlessBrowser::moveMouse(double x, double y) {
  _pipe->call("Input.dispatchMouseEvent", {{"type", "mouseMoved"}, {"x", x}, {"y", y}});
}

std::string HeadlessBrowser::screenshot() {
  const Dictionary result = _pipe->call("Page.captureScreenshot", {{"format", "png"}});
  return decodedBase64(result.string("data").value());
}

void HeadlessBrowser::takeEvent(const std::string& method, const Dictionary& parameters) {
  const auto keep = [this](const Dictionary* about, std::string_view key) {
    if (about != nullptr) _problems.emplace_back(about->string(key).value_or("unknown"));
  };
  if (method == "Network.requestWillBeSent") {
    if (const Dictionary* request = parameters.dictionary("request"))
      _requestedURLs.emplace_back(request->string("url").value_or("unknown"));
  } else if (method == "Log.entryAdded") {
    const Dictionary* entry = parameters.dictionary("entry");
    const auto level = entry == nullptr ? std::nullopt : entry->string("level");
    if (level == "error" || level == "warning") keep(entry, "text");
  } else if (method == "Runtime.exceptionThrown") {
    _problems.push_back(exceptionText(parameters));
  } else if (method == "Runtime.consoleAPICalled") {
    if (const auto type = parameters.string("type"); type == "error" || type == "warning")
      _problems.push_back(platform::jsonFromValue(parameters).value_or("a message on the console"));
  }
}

}  // namespace tallyd::test
