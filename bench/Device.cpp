#include "Device.h"

#include <filesystem>
#include <fstream>

#include "Samples.h"
#include "fakes/FakeCodeBundles.h"
#include "fakes/FakePowerLog.h"
#include "fakes/FakeSandbox.h"
#include "fakes/TemporaryFolder.h"
#include "platform/HTTPClient.h"
#include "platform/property-list/PropertyList.h"
#include "platform/queues/AsioQueues.h"
#include "platform/settings/FileBundle.h"
#include "platform/settings/FilePreferences.h"
#include "platform/settings/FileUserDefaults.h"
#include "platform/settings/SystemDeviceProperties.h"
#include "platform/system/SystemClock.h"
#include "platform/system/SystemLocale.h"
#include "platform/system/SystemRandomness.h"
#include "signing/StorebagSigning.h"

namespace tallyd::bench {

using platform::Dictionary;
using platform::PropertyListFormat;

namespace {

constexpr const char* kFrameworkBundle = "/usr/share/tally/Tally.framework";

/// Every request succeeds at once.
class Network final : public platform::HTTPClient {
 public:
  platform::HTTPResult sendSynchronousRequest(const platform::HTTPRequest& /*request*/) override {
    return {std::nullopt, platform::HTTPResponse{200, {{"Cache-Control", "max-age=86400"}}}, served};
  }
  void sendAsynchronousRequest(platform::HTTPRequest /*request*/,
                               std::shared_ptr<platform::SerialQueue> queue, Completion completion) override {
    queue->async([completion = std::move(completion)] {
      completion({std::nullopt, platform::HTTPResponse{200, {}}, {}});
    });
  }

  platform::Data served;
};

}  // namespace

struct Device::Services {
  Services() {
    constexpr auto kPreferences = "/etc/tally/preferences/";
    write(std::string(kFrameworkBundle) + "/Info.plist", list({{"CFBundleVersion", "7.0"}}));
    write(std::string(kFrameworkBundle) + "/Resources/publicKey.der", signing::publicKeyDER(key.get()));
    write("/etc/tally/device.plist", list({{"DeviceName", "Kasten"},
                                           {"UniqueDeviceID", "0123456789abcdef0123456789abcdef01234567"},
                                           {"ProductType", "Kasten7,1"},
                                           {"ProductVersion", "12"},
                                           {"BuildVersion", "12D500"}}));
    write(std::string(kPreferences) + "com.quillon.diagnostics.plist",
          list({{"DiagnosticLogSubmissionEnabled", true}}));
    write(std::string(kPreferences) + "com.quillon.tally.plist", list({{"environmentType", 4}}));
  }

  static std::string list(const Dictionary& values) {
    return *platform::dataWithPropertyList(values, PropertyListFormat::XML);
  }
  void write(const std::string& path, const std::string& bytes) const {
    const auto file = root.under(path);
    std::filesystem::create_directories(file.parent_path());
    std::ofstream(file, std::ios::binary) << bytes;
  }

  const signing::OpenSSLPointer<EVP_PKEY> key = signing::makeStorebagKey();
  fakes::TemporaryFolder folder;
  platform::Root root{folder.path()};
  NoLog log;
  platform::SystemClock clock;
  platform::SystemRandomness randomness;
  platform::SystemLocale locale;
  Network network;
  platform::FilePreferences preferences{root, log};
  platform::FileUserDefaults defaults{root, log};
  platform::SystemDeviceProperties device{root, log};
  platform::FileBundle frameworkBundle{root.under(kFrameworkBundle), log};
  fakes::FakeSandbox sandbox;
  fakes::FakePowerLog powerLog;
  fakes::FakeCodeBundles codeBundles;
  platform::ProcessValues process;
  platform::AsioQueues queues;  // Goes first: its threads use the others.
  platform::Platform platform{root,     log,         clock,    randomness, locale,          queues,
                              network,  preferences, defaults, device,     frameworkBundle, sandbox,
                              powerLog, codeBundles, process};
};

Device::Device() : _services(std::make_unique<Services>()) {}
Device::~Device() = default;

const platform::Platform& Device::platform() const { return _services->platform; }

void Device::serve(const Dictionary& bag) {
  _services->network.served =
      platform::Data(signing::signedStorebag(_services->key.get(), bag, PropertyListFormat::XML));
}

}  // namespace tallyd::bench
