// The command line of each command. Each class declares the command's options with addTo() and gives, once
// the line has been read, what they say with result(); it stays where it is in between.
#pragma once

#include <string>

#include "tallyctl/Options.h"
#include "tallyctl/SessionArguments.h"

namespace tallyd::tallyctl {

class ReportArguments {
 public:
  void addTo(CLI::App& command);
  [[nodiscard]] ReportOptions result() const;

 private:
  SessionArguments _session;
  MessageArguments _message;
  ReportOptions _options;
  bool _strict = false;
};

class OnceArguments {
 public:
  void addTo(CLI::App& command);
  [[nodiscard]] OnceOptions result() const { return {_session.options(), _message.message()}; }

 private:
  SessionArguments _session;
  MessageArguments _message;
};

class StatesArguments {
 public:
  void addTo(CLI::App& command);
  [[nodiscard]] StatesOptions result() const { return {_session.options(), _waitForUserInfo}; }

 private:
  SessionArguments _session;
  bool _waitForUserInfo = false;
};

class FlushArguments {
 public:
  void addTo(CLI::App& command);
  [[nodiscard]] FlushOptions result() const { return {_session.options()}; }

 private:
  SessionArguments _session;
};

class DisplayURLArguments {
 public:
  void addTo(CLI::App& command);
  [[nodiscard]] DisplayURLOptions result() const { return {_session.options()}; }

 private:
  SessionArguments _session;
};

class UploadArguments {
 public:
  void addTo(CLI::App& command);
  [[nodiscard]] UploadOptions result() const { return {_session.options(), _file}; }

 private:
  SessionArguments _session;
  std::string _file;
};

class UploadLogArguments {
 public:
  void addTo(CLI::App& command);
  [[nodiscard]] UploadLogOptions result() const { return {_session.options(), _files}; }

 private:
  SessionArguments _session;
  std::vector<std::string> _files;
};

class StatsArguments {
 public:
  void addTo(CLI::App& command);
  [[nodiscard]] StatsOptions result() const { return {}; }
};

class TapArguments {
 public:
  void addTo(CLI::App& command);
  [[nodiscard]] TapOptions result() const { return {}; }
};

class WatchArguments {
 public:
  void addTo(CLI::App& command);
  [[nodiscard]] WatchOptions result() const;

 private:
  SessionArguments _session;
  WatchOptions _options;
};

}  // namespace tallyd::tallyctl
