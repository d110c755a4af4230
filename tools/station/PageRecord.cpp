#include "station/PageRecord.h"

#include <vector>

#include "platform/JSON.h"
#include "station/ReadableText.h"

namespace tallyd::station {

using platform::Dictionary;
using platform::Value;

namespace {

constexpr std::string_view kClientName = "ClientName";
constexpr std::string_view kServiceName = "ServiceName";

struct Draft {
  PageRecord record;
  Dictionary shown;
  std::size_t omitted = 0;
};

std::string textOf(const Dictionary& source, std::string_view key) {
  const Value* value = source.find(key);
  return value == nullptr || value->isNull() ? std::string()
                                             : shortened(value->description(), kShownFieldBytes);
}

void show(Draft& draft, std::string_view key, const std::string& text) {
  if (!text.empty()) draft.shown.set(key, text);
}

/// A value that is small whatever it was: numbers and booleans as they are, everything else as text.
Value shownValue(const Value& value) {
  if (value.isNumber()) return value;
  if (const auto text = value.string()) return shortened(*text, kShownFieldBytes);
  return shortened(platform::jsonFromValue(value).value_or(value.description()), kShownFieldBytes);
}

/// The fields of `source` that `isWanted` takes, as many as are shown.
template <class IsWanted>
Dictionary shownFields(Draft& draft, const Dictionary& source, const IsWanted& isWanted) {
  std::vector<Dictionary::Entry> fields;
  for (const auto& [key, value] : source) {
    if (!isWanted(key)) continue;
    if (fields.size() < kShownFields) {
      fields.push_back({shortened(key, kShownFieldBytes), shownValue(value)});
    } else {
      ++draft.omitted;
    }
  }
  return Dictionary(std::move(fields));
}

void setSession(PageRecord& record, std::string_view combined) {
  const std::size_t point = combined.rfind('.');
  record.session = combined.substr(point == std::string_view::npos ? 0 : point + 1);
  if (point == std::string_view::npos) return;
  const std::string_view above = combined.substr(0, point);
  const std::size_t before = above.rfind('.');
  record.parent = above.substr(before == std::string_view::npos ? 0 : before + 1);
}

void setEventNumber(PageRecord& record, const Dictionary& source, std::string_view key) {
  const Value* value = source.find(key);
  const auto number = value == nullptr ? std::nullopt : value->integerValue();
  if (number && *number >= 0 && *number <= UINT16_MAX)
    record.eventNumber = static_cast<std::uint16_t>(*number);
}

/// Whether the reporting side added the field itself.
bool isFact(std::string_view key) {
  return key.starts_with('_') || key == "eventTime" || key == kClientName || key == kServiceName;
}

void readEvent(Draft& draft, const Dictionary& source) {
  const Dictionary* found = source.dictionary("event");
  const Dictionary event = found == nullptr ? Dictionary() : *found;
  PageRecord& record = draft.record;
  setSession(record, textOf(event, "_sessionID"));
  setEventNumber(record, event, "_eventNumber");
  record.sender = textOf(event, "_sender");
  record.started = textOf(event, "_startTS");
  record.device = textOf(event, "_productFamily");
  if (record.device.empty()) record.device = textOf(source, "clientId");
  const std::string name = textOf(event, kClientName);
  const std::string service = textOf(event, kServiceName);
  record.client = name.empty() || service.empty() ? name + service : name + ", " + service;
  if (const Value* time = event.find("eventTime")) draft.shown.set("time", time->realValue().value_or(0));
  show(draft, "method", textOf(event, "_method"));
  show(draft, "status", textOf(event, "_status"));
  draft.shown.set("fields", shownFields(draft, event, [](std::string_view key) { return !isFact(key); }));
  Dictionary facts = shownFields(draft, event, isFact);
  for (const char* key : {"clientId", "postTime", "encoding"})
    if (const Value* value = source.find(key)) facts.set(key, shownValue(*value));
  draft.shown.set("facts", facts);
}

void readDatagram(Draft& draft, const Dictionary& source) {
  PageRecord& record = draft.record;
  setSession(record, textOf(source, "session"));
  setEventNumber(record, source, "eventNumber");
  record.sender = textOf(source, "sender");
  record.device = textOf(source, "device");
  record.isLost = source.boolean("lost");
  record.isRetried = source.boolean("retransmission");
  if (const auto time = source.real("sentTime")) draft.shown.set("time", *time);
  show(draft, "method", textOf(source, "method"));
  show(draft, "status", textOf(source, "status"));
  if (const Dictionary* fields = source.dictionary("fields"))
    draft.shown.set("fields", shownFields(draft, *fields, [](std::string_view) { return true; }));
  draft.shown.set("facts", shownFields(draft, source, [](std::string_view key) { return key != "fields"; }));
  if (record.isLost) draft.shown.set("lost", true);
  if (record.isRetried) draft.shown.set("retried", true);
  if (source.boolean("duplicate")) draft.shown.set("repeated", true);
}

void readFile(Draft& draft, const Dictionary& source) {
  PageRecord& record = draft.record;
  setSession(record, textOf(source, "sequence"));
  record.device = textOf(source, "uuid");
  const auto bytes = source.integer("bytes").value_or(0);
  record.bytes = bytes > 0 ? static_cast<std::uint64_t>(bytes) : 0;
  if (const auto time = source.real("time")) draft.shown.set("time", *time);
  draft.shown.set("bytes", record.bytes);
  const std::string kept = textOf(source, "file");
  const std::string keptName = kept.substr(kept.rfind('/') + 1);
  // Kept as TIME-NAME.
  show(draft, "name",
       record.kind == Feed::Kind::Upload ? keptName.substr(keptName.find('-') + 1)
                                         : textOf(source, "location"));
  if (record.kind == Feed::Kind::Upload && !keptName.empty()) draft.shown.set("link", uploadLink(keptName));
  draft.shown.set("facts", shownFields(draft, source, [](std::string_view) { return true; }));
}

const char* nameOf(Feed::Kind kind) {
  switch (kind) {
    case Feed::Kind::Event:
      return "event";
    case Feed::Kind::Datagram:
      return "datagram";
    case Feed::Kind::Upload:
      return "upload";
    case Feed::Kind::LogData:
      return "logData";
  }
  return "";
}

}  // namespace

PageRecord pageRecordOf(const Feed::Entry& entry) {
  const auto parsed = platform::valueFromJSON(*entry.record);
  const Dictionary* found = parsed.value ? parsed.value->dictionary() : nullptr;
  const Dictionary source = found == nullptr ? Dictionary() : *found;
  Draft draft;
  PageRecord& record = draft.record;
  record.number = entry.number;
  record.kind = entry.kind;
  if (entry.kind == Feed::Kind::Event) {
    readEvent(draft, source);
  } else if (entry.kind == Feed::Kind::Datagram) {
    readDatagram(draft, source);
  } else {
    readFile(draft, source);
  }
  draft.shown.set("n", record.number);
  draft.shown.set("kind", nameOf(record.kind));
  show(draft, "session", record.session);
  show(draft, "sender", record.sender);
  if (record.eventNumber) draft.shown.set("number", static_cast<int>(*record.eventNumber));
  if (draft.omitted > 0) draft.shown.set("omitted", static_cast<std::uint64_t>(draft.omitted));
  record.json = recordOf(draft.shown);
  return record;
}

std::string uploadLink(std::string_view name) { return "/uploads/" + std::string(name); }

}  // namespace tallyd::station
