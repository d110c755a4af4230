// Services that keep what is handed to them instead of letting it leave the tool.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include "platform/CodeBundle.h"
#include "platform/HTTPClient.h"
#include "platform/Log.h"
#include "platform/PowerLog.h"
#include "platform/Value.h"

namespace tallyd::storebagtool {

struct PowerEvent {
  std::int32_t number = 0;
  std::string name;
  platform::Dictionary record;
};

struct AdaptorCall {
  std::uint16_t method = 0;
  std::uint16_t respCode = 0;
  std::string plist;  ///< A binary property list; empty for a message without payload.
};

struct LogLine {
  platform::LogLevel level = platform::LogLevel::Debug;
  std::string text;
};

/// What one backend let go.
struct Recorded {
  std::vector<platform::HTTPRequest> posts;
  std::vector<std::string> datagrams;
  std::vector<PowerEvent> powerEvents;
  std::vector<AdaptorCall> adaptorCalls;
  std::vector<LogLine> lines;
};

class RecordingLog final : public platform::Log {
 public:
  explicit RecordingLog(std::vector<LogLine>& lines) : Log(platform::LogLevel::Debug), _lines(lines) {}
  void open(std::string_view /*identity*/, std::string_view /*facility*/) override {}
  void close() override {}
  void write(platform::LogLevel level, std::string_view message) override {
    _lines.push_back({level, std::string(message)});
  }

 private:
  std::vector<LogLine>& _lines;
};

/// A network on which every request succeeds with an empty answer.
class RecordingHTTPClient final : public platform::HTTPClient {
 public:
  explicit RecordingHTTPClient(std::vector<platform::HTTPRequest>& posts) : _posts(posts) {}
  [[nodiscard]] platform::HTTPResult sendSynchronousRequest(const platform::HTTPRequest& request) override;
  void sendAsynchronousRequest(platform::HTTPRequest request, std::shared_ptr<platform::SerialQueue> queue,
                               Completion completion) override;

 private:
  std::vector<platform::HTTPRequest>& _posts;
};

/// A storebag server with one answer.
class AnsweringHTTPClient final : public platform::HTTPClient {
 public:
  explicit AnsweringHTTPClient(std::string body) : _body(std::move(body)) {}
  [[nodiscard]] platform::HTTPResult sendSynchronousRequest(const platform::HTTPRequest& request) override;
  void sendAsynchronousRequest(platform::HTTPRequest request, std::shared_ptr<platform::SerialQueue> queue,
                               Completion completion) override;

 private:
  const platform::Data _body;
};

class RecordingPowerLog final : public platform::PowerLog {
 public:
  explicit RecordingPowerLog(std::vector<PowerEvent>& events) : _events(events) {}
  void WBLogRegisteredEvent(std::int32_t number, std::string_view name,
                            const platform::Dictionary& record) override {
    _events.push_back({number, std::string(name), record});
  }

 private:
  std::vector<PowerEvent>& _events;
};

/// Every bundle holds an adaptor, which keeps its calls. One thread at a time makes adaptors.
class RecordingCodeBundles final : public platform::CodeBundles {
 public:
  explicit RecordingCodeBundles(std::vector<AdaptorCall>& calls) : _calls(calls) {}
  [[nodiscard]] std::shared_ptr<platform::CodeBundle> load(const std::filesystem::path& path) override;

 private:
  std::vector<AdaptorCall>& _calls;
};

}  // namespace tallyd::storebagtool
