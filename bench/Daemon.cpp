#include "Daemon.h"

#include <algorithm>
#include <fstream>
#include <iterator>

#include "fakes/SignedStorebag.h"
#include "framework/ClientSessionInterface.h"

namespace tallyd::bench {

using platform::Dictionary;
using platform::Root;

namespace {

void write(const Root& root, const std::string& path, const std::string& bytes) {
  const auto file = root.under(path);
  std::filesystem::create_directories(file.parent_path());
  std::ofstream(file, std::ios::binary) << bytes;
}

void writePropertyList(const Root& root, const std::string& path, const Dictionary& values) {
  write(root, path, *dataWithPropertyList(values, platform::PropertyListFormat::XML));
}

void copy(const Root& root, const std::string& path, const std::filesystem::path& source) {
  const auto file = root.under(path);
  std::filesystem::create_directories(file.parent_path());
  std::filesystem::copy_file(source, file);
}

std::size_t linesIn(const std::filesystem::path& path) {
  std::ifstream file(path, std::ios::binary);
  return static_cast<std::size_t>(
      std::count(std::istreambuf_iterator<char>(file), std::istreambuf_iterator<char>(), '\n'));
}

}  // namespace

DaemonRoot::DaemonRoot(const Settings& settings, const std::string& collectorURL) {
  const Root root(_folder.path());
  const std::filesystem::path packaging = std::filesystem::path(settings.sources) / "packaging";
  constexpr const char* kProfile = "com.quillon.tallyd.plist";
  copy(root, std::string("/usr/share/tally/sandbox/") + kProfile, packaging / "sandbox" / kProfile);
  copy(root, "/usr/share/tally/Tally.framework/Info.plist", packaging / "Tally.framework/Info.plist");
  write(root, "/usr/share/tally/Tally.framework/Resources/publicKey.der",
        fakes::StorebagSigner::server().subjectPublicKeyInfo());
  writePropertyList(root, "/etc/tally/device.plist", {{"DeviceName", "Kasten"}});
  writePropertyList(
      root, "/etc/tally/preferences/com.quillon.tally.plist",
      {{"tally_storebag_url", collectorURL + "/bags"}, {"httpsPostURL", collectorURL + "/events"}});
}

std::filesystem::path DaemonRoot::socket() const { return tallydSocketPath(Root(path())); }

std::vector<std::string> DaemonRoot::arguments(const Settings& settings, Logging logging) const {
  std::vector<std::string> arguments{settings.program,
                                     "--root",
                                     path().string(),
                                     "--log",
                                     "stderr",
                                     "--log-level",
                                     logging == Logging::Everything ? "7" : "4"};
  if (!settings.sandbox) arguments.emplace_back("--no-sandbox");
  return arguments;
}

Daemon::Daemon(const Settings& settings, const std::string& collectorURL, Logging logging)
    : _root(settings, collectorURL),
      _process(std::make_unique<ServerProcess>(
          _root.arguments(settings, logging), _root.path(),
          logging == Logging::Everything ? logFile().string() : "/dev/null")) {}

std::size_t Daemon::logLines() const { return linesIn(logFile()); }

std::size_t Daemon::messageLogLines() const {
  std::size_t lines = 0;
  const auto folder = Root(_root.path()).under("/var/mobile/Library/Logs/CrashReporter/Retired");
  for (const auto& file : std::filesystem::directory_iterator(folder)) lines += linesIn(file.path());
  return lines;
}

}  // namespace tallyd::bench
