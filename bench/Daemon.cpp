#include "Daemon.h"

#include <fstream>

#include "fakes/SignedStorebag.h"
#include "framework/ClientSessionInterface.h"

namespace tallyd::bench {

using platform::Array;
using platform::Dictionary;
using platform::Root;
using platform::Value;

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

}  // namespace

std::string signedStorebag() {
  const Dictionary backend{{"clients", Array{Dictionary{{"filters", Array()}}}}};
  return fakes::StorebagSigner::server().envelope(
      Dictionary{{"version", "1.0"}, {"release", Dictionary{{"splunk", backend}}}});
}

Daemon::Daemon(const Settings& settings, const std::string& collectorURL) {
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
  std::vector<std::string> arguments{settings.program, "--root", root.directory().string(), "--log", "stderr",
                                     "--log-level",    "4"};
  if (!settings.sandbox) arguments.emplace_back("--no-sandbox");
  _process = std::make_unique<ServerProcess>(std::move(arguments), _folder.path());
}

std::filesystem::path Daemon::socket() const { return tallydSocketPath(Root(_folder.path())); }

}  // namespace tallyd::bench
