#include "station/UploadReceiver.h"

#include <fmt/chrono.h>
#include <fmt/format.h>

#include <chrono>
#include <exception>

#include "station/HTTPStatus.h"
#include "station/ReadableText.h"

namespace tallyd::station {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::string_view kSuccess = "success";

Value valueOf(const std::optional<std::string>& text) { return text ? Value(*text) : Value(); }

std::string readable(const std::optional<std::string>& text) { return text ? readableText(*text) : "-"; }

/// "20260301T120001.250-NAME": sorted by time, and hardly ever the same twice.
std::string stamped(platform::TimePoint time, const std::string& name) {
  const auto milliseconds = std::chrono::floor<std::chrono::milliseconds>(time.time_since_epoch()).count();
  return fmt::format("{:%Y%m%dT%H%M%S}.{:03}-{}", fmt::gmtime(static_cast<std::time_t>(milliseconds / 1000)),
                     milliseconds % 1000, name);
}

}  // namespace

Answer UploadReceiver::finish(IncomingFile& file, const Facts& facts) {
  try {
    const std::string name = file.keepAs(stamped(_clock.now(), uploadedFileName(facts)));
    try {
      _journal.keep({itemFor(file, name, facts)});
    } catch (...) {
      std::filesystem::remove(_folder / name);
      throw;
    }
  } catch (const std::exception& exception) {
    return refuse(kServerError, exception.what());
  }
  const std::lock_guard lock(_mutex);
  ++_totals.files;
  _totals.bytes += file.bytes();
  return {kOK, _answer};
}

Answer UploadReceiver::refuse(int status, const std::string& problem) {
  _view.showProblem(fmt::format("refused an upload: {}", problem));
  const std::lock_guard lock(_mutex);
  ++_totals.refused;
  const bool wouldDelete = problem.find(kSuccess) != std::string::npos;
  return {status,
          wouldDelete ? "The upload was not kept; the station's terminal says why.\n" : problem + "\n"};
}

UploadReceiver::Totals UploadReceiver::totals() const {
  const std::lock_guard lock(_mutex);
  return _totals;
}

Journal::Item UploadReceiver::itemFor(const IncomingFile& file, const std::string& name,
                                      const Facts& facts) const {
  const Value time(platform::secondsSince1970(_clock.now()));
  const std::string kept = _folder.filename() / name;
  const Dictionary record{{"time", time},
                          {"uuid", valueOf(facts.uuid)},
                          {"sequence", valueOf(facts.sequence)},
                          {"description", valueOf(facts.description)},
                          {"filename", valueOf(facts.filename)},
                          {"encoding", facts.encoding},
                          {"bytes", file.bytes()},
                          {"file", kept}};
  return {fmt::format("{}  upload  session {}  {}  {} bytes  {}  -> {}", readableTime(&time),
                      readable(facts.sequence), readable(facts.filename), file.bytes(),
                      readable(facts.description), readableText(kept)),
          recordOf(record)};
}

std::string uploadedFileName(const UploadReceiver::Facts& facts) {
  constexpr std::string_view kCompressedSuffix = ".gz";
  std::string_view name = facts.filename ? std::string_view(*facts.filename) : std::string_view();
  if (facts.encoding == "gzip" && name.ends_with(kCompressedSuffix)) {
    name.remove_suffix(kCompressedSuffix.size());
  }
  return safeFileName(name);
}

}  // namespace tallyd::station
