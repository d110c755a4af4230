#include "tally-storebag/ExplanationText.h"

#include <fmt/format.h>

#include <iterator>

#include "backends/TallyBackend.h"
#include "backends/dashboard/LocalLog.h"
#include "platform/JSON.h"
#include "platform/property-list/PropertyList.h"
#include "tally-storebag/Documents.h"
#include "tally-storebag/Files.h"

namespace tallyd::storebagtool {

using platform::LogLevel;

namespace {

constexpr mode_t kReadableByAll = 0644;
constexpr int kBytesALine = 16;

/// Lines with one indentation each.
class Text {
 public:
  template <class... Arguments>
  void line(int indentation, fmt::format_string<Arguments...> format, Arguments&&... arguments) {
    lines(indentation, fmt::format(format, std::forward<Arguments>(arguments)...));
  }
  void lines(int indentation, std::string_view text) {
    while (true) {
      const auto end = text.find('\n');
      fmt::format_to(std::back_inserter(_text), "{:{}}{}\n", "", indentation, text.substr(0, end));
      if (end == std::string_view::npos) return;
      text.remove_prefix(end + 1);
    }
  }
  [[nodiscard]] std::string take() { return std::move(_text); }

 private:
  std::string _text;
};

std::string_view stateText(std::int32_t state) {
  switch (state) {
    case ReportingStatePending:
      return "pending: events are held back";
    case ReportingStateOff:
      return "off: nothing is reported";
    default:
      return "on";
  }
}

bool isWorthSaying(const LogLine& line) { return line.level <= LogLevel::Warning; }

void addLines(Text& text, int indentation, const std::vector<LogLine>& lines) {
  for (const LogLine& line : lines) {
    if (isWorthSaying(line))
      text.line(indentation, "log, level {}: {}", static_cast<int>(line.level), line.text);
  }
}

void addBackend(Text& text, const ExplainedBackend& backend, const Occasion& occasion) {
  text.line(0, "backend {}", backend.name);
  if (!backend.isMade) {
    text.line(2, "is not made");
    return addLines(text, 2, backend.refusal);
  }
  for (const ReportingStep& step : backend.trace) text.line(2, "{}", ruleText(step, backend, occasion));
  for (const std::string& filter : filterTexts(backend, occasion)) text.line(2, "{}", filter);
  text.line(2, "state: {}", stateText(backend.state));
  if (backend.name == kTallyBackendUploadServer)
    text.line(2, "takes no messages; files are posted to {}",
              backend.profile.string("post_url").value_or(""));
}

void addPost(Text& text, const platform::HTTPRequest& post) {
  text.line(4, "{} {}", post.method, post.url.empty() ? "(no URL: the post fails)" : post.url);
  for (const auto& [name, value] : post.headers) text.line(6, "{}: {}", name, value);
  text.lines(6, indentedJSON(documentOf(post)));
}

void addDatagram(Text& text, std::string_view datagram) {
  text.line(4, "datagram of {} bytes: {}", datagram.size(), writeLocalLog(datagram));
  for (std::size_t start = 0; start < datagram.size(); start += kBytesALine) {
    std::string row;
    for (const char byte : datagram.substr(start, kBytesALine))
      fmt::format_to(std::back_inserter(row), " {:02x}", static_cast<unsigned char>(byte));
    text.line(6, "{:04x} {}", start, row);
  }
}

void addAdaptorCall(Text& text, const AdaptorCall& call) {
  const auto payload = platform::propertyListWithData(call.plist).value;
  text.line(4, "adaptor call: method {}, respCode {}, payload {}", call.method, call.respCode,
            payload ? payload->description() : "(none)");
}

bool isNothing(const Recorded& sent) {
  return sent.posts.empty() && sent.datagrams.empty() && sent.powerEvents.empty() &&
         sent.adaptorCalls.empty();
}

void addAct(Text& text, const Act& act) {
  text.line(0, "{}", act.name);
  for (const auto& [backend, sent] : act.sent) {
    text.line(2, "{}{}", backend, isNothing(sent) ? ": nothing leaves the device" : "");
    for (const auto& post : sent.posts) addPost(text, post);
    for (const auto& datagram : sent.datagrams) addDatagram(text, datagram);
    for (const auto& event : sent.powerEvents)
      text.line(4, "power log event {} {}: {}", event.number, event.name,
                platform::Value(event.record).description());
    for (const auto& call : sent.adaptorCalls) addAdaptorCall(text, call);
    addLines(text, 4, sent.lines);
  }
  if (act.reply) text.line(2, "the client hears: {}", *act.reply);
}

bool isMessageAct(const Act& act) { return act.name == "message" || act.name == "flush"; }

void writeAct(const Act& act, const std::filesystem::path& folder) {
  for (const auto& [backend, sent] : act.sent) {
    int number = 0;
    const auto write = [&, &name = backend](std::string_view bytes, const char* suffix) {
      writeFile(folder / fmt::format("{}-{}-{}.{}", act.name, name, ++number, suffix), bytes, kReadableByAll,
                Existing::Replace);
    };
    for (const auto& post : sent.posts) write(post.body.bytes(), "body");
    for (const auto& datagram : sent.datagrams) write(datagram, "datagram");
    for (const auto& call : sent.adaptorCalls) write(call.plist, "plist");
    for (const auto& event : sent.powerEvents)
      write(platform::jsonFromValue(event.record).value_or(platform::Value(event.record).description()),
            "json");
  }
}

}  // namespace

std::string explanationText(const Explanation& explanation, const Occasion& occasion, Acts acts) {
  Text text;
  text.line(0, "storebag {}, version {}, environment {}", explanation.storebagName, explanation.version,
            explanation.environment);
  addLines(text, 2, explanation.lines);
  for (const auto& backend : explanation.backends) addBackend(text, backend, occasion);
  for (const auto& act : explanation.acts) {
    if (acts == Acts::All || isMessageAct(act)) addAct(text, act);
  }
  return text.take();
}

void writeRawFiles(const Explanation& explanation, const std::filesystem::path& folder) {
  std::filesystem::create_directories(folder);
  for (const Act& act : explanation.acts) writeAct(act, folder);
}

}  // namespace tallyd::storebagtool
