// Everything that an operating system gives to the daemon, in one object.
#pragma once

#include "platform/DatagramSocket.h"
#include "platform/ProcessValues.h"
#include "platform/Root.h"

namespace tallyd::platform {

class Bundle;
class Clock;
class CodeBundles;
class DeviceProperties;
class HTTPClient;
class Locale;
class Log;
class PowerLog;
class Preferences;
class Queues;
class Randomness;
class Sandbox;
class UserDefaults;

/// The platform's services, handed to constructors. Borrows them all; whoever wires the process owns them,
/// and they outlive every user.
///
/// Threading: the references never change; each service states its own rules.
struct Platform {
  const Root& root;
  Log& log;
  const Clock& clock;
  Randomness& randomness;
  const Locale& locale;
  Queues& queues;
  HTTPClient& http;
  const Preferences& preferences;
  UserDefaults& defaults;
  const DeviceProperties& device;
  const Bundle& frameworkBundle;  ///< The bundle that holds the client framework.
  Sandbox& sandbox;
  PowerLog& powerLog;
  CodeBundles& codeBundles;
  ProcessValues& process;
  DatagramSockets& datagrams = systemDatagramSockets();  ///< Another network only where a day is replayed.
};

}  // namespace tallyd::platform
