// Reads posted documents back.
#pragma once

#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "platform/HTTPClient.h"
#include "platform/JSON.h"
#include "support/Gunzipped.h"

namespace tallyd {

inline std::string postedJSON(const platform::HTTPRequest& post) {
  for (const auto& [name, value] : post.headers) {
    if (name == "Content-Encoding" && value == "gzip") return test::gunzipped(post.body.bytes());
  }
  return std::string(post.body.bytes());
}

inline platform::Dictionary postedDocument(const platform::HTTPRequest& post) {
  const auto parsed = platform::valueFromJSON(postedJSON(post));
  EXPECT_TRUE(parsed.value && parsed.value->dictionary()) << parsed.error;
  return parsed.value && parsed.value->dictionary() ? *parsed.value->dictionary() : platform::Dictionary();
}

inline std::vector<platform::Dictionary> postedEvents(const platform::HTTPRequest& post) {
  const platform::Dictionary document = postedDocument(post);
  std::vector<platform::Dictionary> events;
  if (const platform::Array* list = document.array("events")) {
    for (const platform::Value& event : *list) events.push_back(*event.dictionary());
  }
  return events;
}

}  // namespace tallyd
