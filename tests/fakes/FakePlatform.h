// All fakes as one platform, with a root in a temporary folder.
#pragma once

#include <filesystem>

#include "fakes/FakeClock.h"
#include "fakes/FakeCodeBundles.h"
#include "fakes/FakeHTTPClient.h"
#include "fakes/FakeLocale.h"
#include "fakes/FakeLog.h"
#include "fakes/FakePowerLog.h"
#include "fakes/FakeQueues.h"
#include "fakes/FakeRandomness.h"
#include "fakes/FakeSandbox.h"
#include "fakes/FakeSettings.h"
#include "fakes/TemporaryFolder.h"
#include "platform/Platform.h"

namespace tallyd::fakes {

/// A device with answers to every question unless the test takes them away.
struct FakePlatform {
  FakePlatform() {
    device.answers = {{"UniqueDeviceID", "0123456789abcdef0123456789abcdef01234567"},
                      {"ProductVersion", "12.4"},
                      {"BuildVersion", "12D500"},
                      {"ProductType", "Kasten3,1"},
                      {"DeviceName", "Kasten"},
                      {"HWModelStr", "K31AP"},
                      {"SerialNumber", "QX1234"}};
    frameworkBundle.info.set("CFBundleVersion", "7.42.1");
  }

  TemporaryFolder folder;
  platform::Root root{folder.path()};
  FakeLog log;
  FakeClock clock;
  FakeRandomness randomness;
  FakeLocale locale;
  FakeQueues queues;
  FakeHTTPClient http;
  FakePreferences preferences;
  FakeUserDefaults defaults;
  FakeDeviceProperties device;
  FakeBundle frameworkBundle;
  FakeSandbox sandbox;
  FakePowerLog powerLog;
  FakeCodeBundles codeBundles;
  platform::ProcessValues process;

  platform::Platform platform{root,     log,         clock,    randomness, locale,          queues,
                              http,     preferences, defaults, device,     frameworkBundle, sandbox,
                              powerLog, codeBundles, process};
};

}  // namespace tallyd::fakes
