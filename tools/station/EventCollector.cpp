#include "station/EventCollector.h"

#include <fmt/format.h>

#include <exception>

#include "platform/JSON.h"
#include "station/Files.h"

namespace tallyd::station {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

PostResult problem(std::string text) { return {std::nullopt, std::move(text)}; }

}  // namespace

PostResult parsePost(std::string_view json) {
  const platform::JSONResult parsed = platform::valueFromJSON(json);
  if (!parsed.value) return problem(fmt::format("not JSON: {}", parsed.error));
  const Dictionary* body = parsed.value->dictionary();
  if (body == nullptr) return problem("not a JSON object");
  const auto postTime = body->string("postTime");
  if (!postTime) return problem("\"postTime\" is missing or not a string");
  const auto clientId = body->string("clientId");
  if (!clientId) return problem("\"clientId\" is missing or not a string");
  const Array* events = body->array("events");
  if (events == nullptr) return problem("\"events\" is missing or not an array");

  Post post{std::string(*postTime), std::string(*clientId), {}};
  for (const Value& event : *events) {
    if (event.dictionary() == nullptr) return problem("an element of \"events\" is not an object");
    post.events.push_back(*event.dictionary());
  }
  return {std::move(post), {}};
}

std::optional<std::string> EventCollector::collect(std::string_view json, const std::string& encoding) {
  const PostResult result = parsePost(json);
  if (!result.post) {
    refuse(result.problem);
    return result.problem;
  }
  const std::lock_guard lock(_mutex);
  ++_totals.posts;
  _totals.events += result.post->events.size();
  keep(*result.post, encoding);
  return std::nullopt;
}

void EventCollector::refuse(const std::string& problem) {
  const std::lock_guard lock(_mutex);
  ++_totals.refused;
  _view.showProblem(fmt::format("refused a post: {}", problem));
}

EventCollector::Totals EventCollector::totals() const {
  const std::lock_guard lock(_mutex);
  return _totals;
}

void EventCollector::keep(const Post& post, const std::string& encoding) {
  std::string lines;
  for (const Dictionary& event : post.events) {
    const Dictionary entry{
        {"clientId", post.clientId}, {"postTime", post.postTime}, {"encoding", encoding}, {"event", event}};
    const std::string record = platform::jsonFromValue(entry).value_or("{}");
    _view.showEvent(event, record);
    lines += record + "\n";
  }
  try {
    appendToFile(_file, lines);
  } catch (const std::exception& exception) {
    _view.showProblem(fmt::format("can't keep events: {}", exception.what()));
  }
}

}  // namespace tallyd::station
