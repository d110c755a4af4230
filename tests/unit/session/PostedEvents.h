// Reads posted documents back.
#pragma once

#include <gtest/gtest.h>
#include <zlib.h>

#include <string>
#include <vector>

#include "platform/HTTPClient.h"
#include "platform/JSON.h"

namespace tallyd {

inline std::string gunzipped(std::string_view compressed) {
  std::string plain(1 << 20, '\0');
  z_stream stream{};
  constexpr int kGzipWindow = 15 + 16;
  if (inflateInit2(&stream, kGzipWindow) != Z_OK) return {};
  stream.next_in = reinterpret_cast<Bytef*>(const_cast<char*>(compressed.data()));
  stream.avail_in = static_cast<uInt>(compressed.size());
  stream.next_out = reinterpret_cast<Bytef*>(plain.data());
  stream.avail_out = static_cast<uInt>(plain.size());
  EXPECT_EQ(inflate(&stream, Z_FINISH), Z_STREAM_END);
  plain.resize(stream.total_out);
  inflateEnd(&stream);
  return plain;
}

inline std::string postedJSON(const platform::HTTPRequest& post) {
  for (const auto& [name, value] : post.headers) {
    if (name == "Content-Encoding" && value == "gzip") return gunzipped(post.body.bytes());
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
