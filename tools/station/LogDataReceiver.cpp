#include "station/LogDataReceiver.h"

#include <fmt/format.h>

#include <algorithm>
#include <exception>
#include <filesystem>

#include "platform/JSON.h"
#include "station/BodyDecoder.h"
#include "station/Files.h"
#include "station/HTTPStatus.h"
#include "station/KeyedArchiveReader.h"
#include "station/Limits.h"
#include "station/ReadableText.h"

namespace tallyd::station {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

/// RFC 1952, section 2.3.1.
constexpr std::string_view kGzipStart = "\x1F\x8B";

}  // namespace

LogDataReceiver::LogDataReceiver(const platform::Clock& clock, Journal& journal, TerminalView& view)
    : _clock(clock), _journal(journal), _view(view) {
  if (!std::filesystem::exists(journal.file())) return;
  const std::string kept = readFile(journal.file());
  _lines = static_cast<std::uint64_t>(std::count(kept.begin(), kept.end(), '\n'));
}

Answer LogDataReceiver::receive(std::string_view body) {
  std::string decoded;
  if (body.starts_with(kGzipStart)) {
    try {
      decoded = decodedBody(BodyDecoder::Encoding::Gzip, kMaximumLogDataBytes, body);
    } catch (const BodyError& error) {
      return refuse(error.status(), error.what());
    }
    body = decoded;
  }
  const ArchiveResult archive = readKeyedArchive(body);
  if (!archive.root) return refuse(kBadRequest, archive.problem);
  try {
    return keep(*archive.root, body.size());
  } catch (const std::exception& exception) {
    return refuse(kServerError, exception.what());
  }
}

Answer LogDataReceiver::refuse(int status, const std::string& problem) {
  _view.showProblem(fmt::format("refused log data: {}", problem));
  const std::lock_guard lock(_mutex);
  ++_totals.refused;
  return {status, problem + "\n"};
}

LogDataReceiver::Totals LogDataReceiver::totals() const {
  const std::lock_guard lock(_mutex);
  return _totals;
}

Answer LogDataReceiver::keep(const Value& logData, std::size_t archiveBytes) {
  const Value time(platform::secondsSince1970(_clock.now()));
  const std::lock_guard lock(_mutex);
  const std::string location = fmt::format("{}:{}", _journal.file().string(), _lines + 1);
  const Dictionary record{
      {"time", time}, {"bytes", std::uint64_t{archiveBytes}}, {"location", location}, {"logData", logData}};
  _journal.keep({{fmt::format("{}  log data  {} bytes  -> {}{}", readableTime(&time), archiveBytes,
                              readableText(location), readableElements(logData)),
                  recordOf(record)}});
  ++_lines;
  ++_totals.archives;
  return {kOK, location};
}

std::string readableElements(const Value& logData) {
  const Array elements = logData.array() != nullptr ? *logData.array() : Array{logData};
  const std::size_t shown = std::min(elements.size(), kShownElements);
  std::string lines;
  for (std::size_t i = 0; i < shown; ++i) {
    const std::string text = platform::jsonFromValue(jsonForm(elements[i])).value_or("");
    lines += fmt::format("\n  [{}] {}", i, shortened(text, kShownElementBytes));
  }
  if (shown < elements.size()) lines += fmt::format("\n  … {} more", elements.size() - shown);
  return lines;
}

}  // namespace tallyd::station
