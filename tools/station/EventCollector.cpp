#include "station/EventCollector.h"

#include <fmt/format.h>

#include <exception>
#include <utility>

#include "platform/JSON.h"
#include "station/HTTPStatus.h"
#include "station/ReadableText.h"

namespace tallyd::station {

using platform::Array;
using platform::Dictionary;
using platform::Value;

namespace {

PostResult problem(std::string text) { return {std::nullopt, std::move(text)}; }

Journal::Item itemFor(const Post& post, const std::string& encoding, const Dictionary& event) {
  const Dictionary record{{"clientId", post.clientId ? Value(*post.clientId) : Value()},
                          {"postTime", post.postTime},
                          {"encoding", encoding},
                          {"event", event}};
  return {readableEvent(event) + (post.clientId ? "" : "  [clientId missing]"), recordOf(record)};
}

}  // namespace

PostResult parsePost(std::string_view json) {
  const platform::JSONResult parsed = platform::valueFromJSON(json);
  if (!parsed.value) return problem(fmt::format("not JSON: {}", parsed.error));
  const Dictionary* body = parsed.value->dictionary();
  if (body == nullptr) return problem("not a JSON object");
  const auto postTime = body->string("postTime");
  if (!postTime) return problem("\"postTime\" is missing or not a string");
  const auto clientId = body->string("clientId");
  if (!clientId && body->contains("clientId")) return problem("\"clientId\" is not a string");
  const Array* events = body->array("events");
  if (events == nullptr) return problem("\"events\" is missing or not an array");

  Post post{std::string(*postTime), std::nullopt, {}};
  if (clientId) post.clientId = *clientId;
  for (const Value& event : *events) {
    if (event.dictionary() == nullptr) return problem("an element of \"events\" is not an object");
    post.events.push_back(*event.dictionary());
  }
  return {std::move(post), {}};
}

Answer EventCollector::collect(std::string_view json, const std::string& encoding) {
  const PostResult result = parsePost(json);
  if (!result.post) return refuse(kBadRequest, result.problem);
  std::vector<Journal::Item> items;
  for (const Dictionary& event : result.post->events) items.push_back(itemFor(*result.post, encoding, event));
  try {
    _journal.keep(std::move(items));
  } catch (const std::exception& exception) {
    return refuse(kServerError, fmt::format("can't keep events: {}", exception.what()));
  }
  const std::lock_guard lock(_mutex);
  ++_totals.posts;
  _totals.events += result.post->events.size();
  return {kOK, ""};
}

Answer EventCollector::refuse(int status, const std::string& problem) {
  _view.showProblem(fmt::format("refused a post: {}", problem));
  const std::lock_guard lock(_mutex);
  ++_totals.refused;
  return {status, problem + "\n"};
}

EventCollector::Totals EventCollector::totals() const {
  const std::lock_guard lock(_mutex);
  return _totals;
}

}  // namespace tallyd::station
