#include "tally-storebag/DescribedDevice.h"

#include "platform/ProcessValues.h"

namespace tallyd::storebagtool {

using platform::Value;

namespace {

class DescribedProperties final : public platform::DeviceProperties {
 public:
  explicit DescribedProperties(const DeviceDescription& description) : _clientID(description.clientID) {
    const auto answer = [&](const char* question, const std::optional<std::string>& text) {
      if (text) _answers[question] = *text;
    };
    answer("DeviceName", description.family);
    answer("ProductType", description.productType);
    answer("ProductVersion", description.productVersion);
    answer("BuildVersion", description.buildVersion);
    answer("HWModelStr", description.hardwareModel);
    answer("SerialNumber", description.serialNumber);
    answer("UniqueDeviceID", description.deviceID);
    if (description.internal) _answers["ReleaseType"] = "Internal";
  }

  [[nodiscard]] std::optional<std::string> GNCopyAnswer(std::string_view question) const override {
    const auto found = _answers.find(question);
    return found == _answers.end() ? std::nullopt : std::optional(found->second);
  }
  [[nodiscard]] std::optional<platform::UUIDBytes> machineIdentifier(
      std::string_view /*purpose*/) const override {
    return _clientID;
  }

 private:
  std::map<std::string, std::string, std::less<>> _answers;
  const platform::UUIDBytes _clientID;
};

class DescribedPreferences final : public platform::Preferences {
 public:
  explicit DescribedPreferences(const DeviceDescription& description) : _description(description) {}

  [[nodiscard]] std::optional<Value> value(std::string_view suite, std::string_view key) const override {
    if (suite == "com.quillon.diagnostics" && key == "DiagnosticLogSubmissionEnabled")
      return Value(_description.consented);
    if (suite != "com.quillon.tally") return std::nullopt;
    if (key == "environmentType" && _description.environmentType) return Value(*_description.environmentType);
    if (key == "httpsPostURL" && _description.httpsPostURL) return Value(*_description.httpsPostURL);
    return std::nullopt;
  }

 private:
  const DeviceDescription _description;
};

class MemoryDefaults final : public platform::UserDefaults {
 public:
  [[nodiscard]] std::optional<Value> value(std::string_view key) const override {
    const Value* found = _values.find(key);
    return found ? std::optional(*found) : std::nullopt;
  }
  void setValue(std::string_view key, std::optional<Value> value) override {
    if (value)
      _values.set(key, std::move(*value));
    else
      _values.remove(key);
  }

 private:
  platform::Dictionary _values;
};

class DescribedBundle final : public platform::Bundle {
 public:
  DescribedBundle(std::optional<std::string> version, std::string publicKeyDER)
      : _version(std::move(version)), _publicKeyDER(std::move(publicKeyDER)) {}
  [[nodiscard]] std::optional<Value> infoValue(std::string_view key) const override {
    return key == "CFBundleVersion" && _version ? std::optional<Value>(*_version) : std::nullopt;
  }
  [[nodiscard]] std::optional<platform::Data> resource(std::string_view name,
                                                       std::string_view type) const override {
    return name == "publicKey" && type == "der" ? std::optional(_publicKeyDER) : std::nullopt;
  }

 private:
  const std::optional<std::string> _version;
  const platform::Data _publicKeyDER;
};

class DescribedLocale final : public platform::Locale {
 public:
  explicit DescribedLocale(const DeviceDescription& description)
      : _countryCode(description.countryCode), _timezoneOffset(description.timezoneOffset) {}
  [[nodiscard]] std::optional<std::string> countryCode() const override { return _countryCode; }
  [[nodiscard]] std::chrono::seconds offsetFromGMT(platform::TimePoint /*time*/) const override {
    return _timezoneOffset;
  }

 private:
  const std::optional<std::string> _countryCode;
  const std::chrono::seconds _timezoneOffset;
};

class FixedRandomness final : public platform::Randomness {
 public:
  explicit FixedRandomness(double draw) : _draw(draw) {}
  double drand48() override { return _draw; }
  platform::UUIDBytes uuid() override { return {}; }

 private:
  const double _draw;
};

/// No messages need files.
class ClosedSandbox final : public platform::Sandbox {
 public:
  [[nodiscard]] std::optional<std::string> sandbox_init(std::string_view /*profileName*/) override {
    return std::nullopt;
  }
  [[nodiscard]] std::unique_ptr<Grant> offerGrant(std::string_view /*token*/,
                                                  std::vector<platform::FileDescriptor> /*files*/) override {
    return std::make_unique<Grant>();
  }
  ExtensionHandle sandbox_extension_consume(std::string_view /*token*/) override { return kNoExtension; }
  void sandbox_extension_release(ExtensionHandle /*handle*/) override {}
  [[nodiscard]] platform::FileDescriptor openForReading(std::string_view /*path*/) override { return {}; }
};

}  // namespace

struct DescribedDevice::Services {
  Services(const DeviceDescription& description, std::string publicKeyDER)
      : randomness(description.samplingFactor),
        locale(description),
        preferences(description),
        device(description),
        bundle(description.frameworkVersion, std::move(publicKeyDER)) {}

  TemporaryFolder folder;  ///< For the message log that sessions write.
  platform::Root root{folder.path()};
  SteppingClock clock;
  FixedRandomness randomness;
  DescribedLocale locale;
  StillQueues queues;
  DescribedPreferences preferences;
  MemoryDefaults defaults;
  DescribedProperties device;
  DescribedBundle bundle;
  ClosedSandbox sandbox;
  platform::ProcessValues process;
};

DescribedDevice::DescribedDevice(const DeviceDescription& description, std::string publicKeyDER)
    : _services(std::make_unique<Services>(description, std::move(publicKeyDER))) {}

DescribedDevice::~DescribedDevice() = default;

SteppingClock& DescribedDevice::clock() { return _services->clock; }

StillQueues& DescribedDevice::queues() { return _services->queues; }

platform::Platform DescribedDevice::platformWith(platform::Log& log, platform::HTTPClient& http,
                                                 platform::PowerLog& powerLog,
                                                 platform::CodeBundles& codeBundles) {
  Services& s = *_services;
  return {s.root,     log,      s.clock,  s.randomness, s.locale, s.queues,    http,     s.preferences,
          s.defaults, s.device, s.bundle, s.sandbox,    powerLog, codeBundles, s.process};
}

}  // namespace tallyd::storebagtool
