#include "tally-storebag/Linter.h"

#include <fmt/format.h>

#include "backends/TallyBackend.h"
#include "backends/upload/UploadURL.h"
#include "framework/TallyKeys.h"
#include "tally-storebag/ValueLint.h"

namespace tallyd::storebagtool {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::int64_t kHighestPort = 65'535;

void lintPort(const Dictionary& profile, const std::string& path, Findings& findings) {
  const auto port = profile.integer("port");
  if (!port || (*port >= 1 && *port <= kHighestPort)) return;
  findings.push_back({Severity::Error, pathOf(path, "port"), fmt::format("{} is not from 1 to 65535", *port),
                      fmt::format("reads as {}", static_cast<std::uint16_t>(*port))});
}

void lintReliable(const Dictionary& profile, const std::string& path, Findings& findings) {
  const auto period = profile.integer("reliable");
  if (!profile.contains("reliable") || (period && *period > 0)) return;
  findings.push_back({Severity::Warning, pathOf(path, "reliable"), "is not above 0",
                      "the delivery is reliable, with the default period of 8000 ms"});
}

void lintDashboard(const Dictionary& profile, const std::string& path, Findings& findings) {
  if (const auto address = profile.string("ip")) lintAddress(*address, pathOf(path, "ip"), findings);
  lintPort(profile, path, findings);
  lintReliable(profile, path, findings);
}

void lintUploadServer(const Dictionary& profile, const std::string& path, Findings& findings) {
  const auto url = profile.string("post_url");
  if (!url) return;
  if (!hasURLCharactersOnly(*url)) {
    findings.push_back({Severity::Error, pathOf(path, "post_url"),
                        "holds characters that no URL may hold unescaped", "no file is uploaded"});
  }
  if (url->find('?') != std::string_view::npos) {
    findings.push_back({Severity::Warning, pathOf(path, "post_url"), "holds a question mark",
                        "another one, with the file's facts, is put behind it"});
  }
}

void lintHTTPSPost(const Dictionary& profile, const std::string& path, Findings& findings) {
  if (const Array* clients = profile.array("clients")) lintClients(*clients, path, findings);
}

struct BackendLint {
  Place place;
  void (*special)(const Dictionary& profile, const std::string& path, Findings& findings);
};

std::optional<BackendLint> backendLint(std::string_view name) {
  if (name == kTallyBackendDashboard) return BackendLint{Place::Dashboard, lintDashboard};
  if (name == kTallyBackendUploadServer) return BackendLint{Place::UploadServer, lintUploadServer};
  if (name == kTallyBackendHTTPPost || name == kTallyBackendHTTPPost2)
    return BackendLint{Place::HTTPSPost, lintHTTPSPost};
  if (name == kTallyBackendWattbook) return BackendLint{Place::PowerLog, nullptr};
  if (name == kTallyBackendPith) return BackendLint{Place::Adaptor, nullptr};
  return std::nullopt;
}

void lintBackend(std::string_view name, const Value& value, const std::string& path, Findings& findings) {
  const auto lint = backendLint(name);
  const Dictionary* profile = value.dictionary();
  if (!lint || !profile) return;
  lintKeys(*profile, lint->place, path, findings);
  for (const std::string_view key : {"post_url", "display_url"}) lintURL(*profile, key, path, findings);
  if (lint->special) lint->special(*profile, path, findings);
}

void lintSecondName(const Dictionary& section, const std::string& path, Findings& findings) {
  if (!section.contains(kTallyBackendHTTPPost2)) return;
  const bool both = section.contains(kTallyBackendHTTPPost);
  findings.push_back({Severity::Note, pathOf(path, kTallyBackendHTTPPost2),
                      both ? "stands beside \"splunk\"" : "stands without \"splunk\"",
                      both ? "each event is posted by both"
                           : "the session has no hierarchy, and its client hears no posted text"});
}

void lintSection(const Dictionary& section, const std::string& path, Findings& findings) {
  if (section.empty()) findings.push_back({Severity::Warning, path, "is empty", "no backend is made"});
  lintKeys(section, Place::Section, path, findings);
  for (const auto& [name, value] : section) lintBackend(name, value, pathOf(path, name), findings);
  lintSecondName(section, path, findings);
}

}  // namespace

Findings lintBag(const Dictionary& bag) {
  Findings findings;
  lintKeys(bag, Place::Bag, "", findings);
  bool hasSection = false;
  for (const auto& [key, value] : bag) {
    const KnownKey* row = knownKey(Place::Bag, key);
    const Dictionary* section = row && row->kind == KeyKind::Dictionary ? value.dictionary() : nullptr;
    if (!section) continue;
    hasSection = true;
    lintSection(*section, key, findings);
  }
  if (!hasSection)
    findings.push_back(
        {Severity::Error, "", "there is no section for any environment", "no device gets a storebag"});
  return findings;
}

}  // namespace tallyd::storebagtool
