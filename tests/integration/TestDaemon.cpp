#include "integration/TestDaemon.h"

#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>

#include <algorithm>
#include <fstream>
#include <sstream>

#include "fakes/SignedStorebag.h"
#include "framework/ClientSessionInterface.h"
#include "framework/TallyKeys.h"
#include "platform/JSON.h"
#include "platform/property-list/PropertyList.h"

namespace tallyd::test {

using platform::Array;
using platform::Dictionary;
using platform::PropertyListFormat;
using platform::Value;

namespace {

constexpr std::string_view kBagPath = "/bags/sorrel";

std::string propertyList(const Value& value) { return *dataWithPropertyList(value, PropertyListFormat::XML); }

bool isDigit(char c) { return c >= '0' && c <= '9'; }

std::string fileText(const std::filesystem::path& path) {
  std::ostringstream text;
  text << std::ifstream(path).rdbuf();
  return text.str();
}

/// The socket on which the daemon tells that it is ready, as sd_notify(3) has it.
class ReadinessSocket {
 public:
  explicit ReadinessSocket(const std::filesystem::path& folder)
      : _path(folder / "ready"), _socket(::socket(AF_UNIX, SOCK_DGRAM | SOCK_CLOEXEC, 0)) {
    std::filesystem::remove(_path);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    _path.string().copy(address.sun_path, sizeof address.sun_path - 1);
    if (::bind(_socket.get(), reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
      throw std::system_error(errno, std::generic_category(), _path.string());
    }
    const timeval patience{WatchedProcess::kPatience.count(), 0};
    ::setsockopt(_socket.get(), SOL_SOCKET, SO_RCVTIMEO, &patience, sizeof patience);
  }
  [[nodiscard]] std::string path() const { return _path.string(); }
  [[nodiscard]] bool wait() const {
    char message[256];
    const ssize_t length = ::recv(_socket.get(), message, sizeof message, 0);
    return length > 0 && std::string_view(message, static_cast<std::size_t>(length)).starts_with("READY=1");
  }

 private:
  const std::filesystem::path _path;
  const platform::FileDescriptor _socket;
};

}  // namespace

// StorebagServer

StorebagServer::StorebagServer() : _authority("Test authority") {
  _server = std::make_unique<LoopbackServer>(
      loopbackIdentity(_authority), [this](const ReceivedRequest& request) { return answer(request); });
}

std::string StorebagServer::publicKeyDER() { return fakes::StorebagSigner::server().subjectPublicKeyInfo(); }

std::string StorebagServer::baseURL() const { return _server->url(std::string(kBagPath)); }

void StorebagServer::serve(const std::string& name, const Dictionary& section,
                           const std::string& cacheControl) {
  serveBag(name, Dictionary{{"version", "1.0"}, {"release", section}}, cacheControl);
}

void StorebagServer::serveBag(const std::string& name, const Value& bag, const std::string& cacheControl) {
  serveWith(name, [response = signedBag(bag, cacheControl)](const ReceivedRequest&) { return response; });
}

void StorebagServer::serveWith(const std::string& name, LoopbackServer::Handler handler) {
  const std::lock_guard lock(_mutex);
  _handlers[name] = std::move(handler);
}

ServedResponse StorebagServer::signedBag(const Value& bag, const std::string& cacheControl) const {
  return {.body = fakes::StorebagSigner::server().envelope(bag),
          .headers = {{"Cache-Control", cacheControl}}};
}

ServedResponse StorebagServer::answer(const ReceivedRequest& request) {
  const std::string path = request.target.substr(0, request.target.find('?'));
  LoopbackServer::Handler handler;
  {
    const std::lock_guard lock(_mutex);
    const auto found = _handlers.find(path.substr(path.rfind('/') + 1));
    if (found != _handlers.end()) handler = found->second;
  }
  return handler ? handler(request) : ServedResponse{.status = 404, .body = "no such storebag"};
}

// TestRoot

TestRoot::TestRoot(const StorebagServer& server) : _root(_folder.path()) {
  const std::filesystem::path source = TALLYD_SOURCE_DIR;
  write("/usr/share/tally/sandbox/com.quillon.tallyd.plist",
        fileText(source / "packaging/sandbox/com.quillon.tallyd.plist"));
  write("/usr/share/tally/Tally.framework/Info.plist",
        fileText(source / "packaging/Tally.framework/Info.plist"));
  write("/usr/share/tally/Tally.framework/Resources/publicKey.der", StorebagServer::publicKeyDER());
  write("/etc/tally/ca.pem", server.authorityPEM());
  setPreferences("com.quillon.tally", {{"tally_storebag_url", server.baseURL()}});
  setDevice({{"DeviceName", "Kasten"}});
}

std::filesystem::path TestRoot::socket() const { return tallydSocketPath(_root); }

void TestRoot::write(const std::string& path, const std::string& bytes) const {
  std::filesystem::create_directories(under(path).parent_path());
  // Replaced as a whole, so that the daemon never reads half a file.
  const std::string temporary = under(path).string() + ".new";
  std::ofstream(temporary, std::ios::binary) << bytes;
  std::filesystem::rename(temporary, under(path));
}

void TestRoot::setPreferences(const std::string& suite, const Dictionary& values) const {
  write("/etc/tally/preferences/" + suite + ".plist", propertyList(values));
}

void TestRoot::setDevice(const Dictionary& answers) const {
  write("/etc/tally/device.plist", propertyList(answers));
}

std::string TestRoot::read(const std::string& path) const { return fileText(under(path)); }

std::vector<std::string> TestRoot::messageLog() const {
  constexpr std::string_view kStampPattern = "(dddd-dd-dd dd:dd:dd +0000) ";
  std::vector<std::string> messages;
  for (const auto& entry :
       std::filesystem::directory_iterator(under("/var/mobile/Library/Logs/CrashReporter/Retired"))) {
    std::ifstream file(entry.path());
    for (std::string line; std::getline(file, line);) {
      std::string stamp = line.substr(0, kStampPattern.size());
      const auto zoneStart = std::min(stamp.size(), kStampPattern.find("+0000"));
      std::replace_if(stamp.begin(), stamp.begin() + static_cast<std::ptrdiff_t>(zoneStart), isDigit, 'd');
      EXPECT_EQ(stamp, kStampPattern) << line;
      messages.push_back(line.substr(std::min(line.size(), kStampPattern.size())));
    }
  }
  return messages;
}

// TestDaemon

std::string TestDaemon::program() { return TALLYD_BIN_DIR "/tallyd"; }

TestDaemon::TestDaemon(const TestRoot& root, const Options& options) : _root(root) {
  const ReadinessSocket readiness(root.root().directory());
  WatchedProcess::Options process;
  process.arguments = {program(), "--root", root.root().directory().string(), "--log", "stderr"};
  process.arguments.insert(process.arguments.end(), options.arguments.begin(), options.arguments.end());
  process.environment = options.environment;
  process.environment["NOTIFY_SOCKET"] = readiness.path();
  process.descriptorLimit = options.descriptorLimit;
  process.passedSocket = options.passedSocket;
  process.limits = options.limits;
  process.umask = options.umask;
  _process = std::make_unique<WatchedProcess>(process);
  EXPECT_TRUE(readiness.wait()) << "the daemon is not ready:\n" << _process->output();
}

std::unique_ptr<TallyConnection> TestDaemon::connect() const {
  return std::make_unique<TallyConnection>(_root.socket(), WatchedProcess::kPatience);
}

// What was received

std::vector<Dictionary> receivedDocuments(const LoopbackServer& server) {
  std::vector<Dictionary> documents;
  for (const auto& request : server.requests()) {
    const auto parsed = platform::valueFromJSON(request.body);
    EXPECT_TRUE(parsed.value && parsed.value->dictionary()) << parsed.error << ": " << request.body;
    if (parsed.value && parsed.value->dictionary()) documents.push_back(*parsed.value->dictionary());
  }
  return documents;
}

std::vector<Dictionary> receivedEvents(const LoopbackServer& server) {
  std::vector<Dictionary> events;
  for (const Dictionary& document : receivedDocuments(server)) {
    const Array* list = document.array("events");
    EXPECT_TRUE(list) << Value(document).description();
    if (!list) continue;
    for (const Value& event : *list) events.push_back(*event.dictionary());
  }
  return events;
}

Dictionary sessionInfo(std::uint32_t sessionID, std::int32_t clientType, const Dictionary& more) {
  Dictionary info{{std::string(kTallySessionInfoSessionID), sessionID},
                  {std::string(kTallySessionInfoClientType), clientType}};
  info.merge(more);
  return info;
}

Dictionary storebagWithHTTPSPost() {
  return {{"splunk", Dictionary{{"clients", Array{Dictionary{{"filters", Array()},
                                                             {"locale_whitelist", Array{Value("US")}},
                                                             {"sampling_threshold", 1}}}}}}};
}

}  // namespace tallyd::test
