// An answer as C sees it.
#pragma once

#include <optional>
#include <string>
#include <utility>
#include <vector>

#include "framework/TallyConnection.h"
#include "framework/c/tally.h"

struct tally_reply {
  tally_status status = TALLY_OK;
  std::string error{};
  std::optional<std::string> text{};
  bool truth = false;
  std::optional<std::vector<std::string>> list{};
};

namespace tallyd::c {

[[nodiscard]] tally_status statusOf(TallyError error);

// What each kind of value becomes.

inline void put(tally_reply& reply, std::string value) { reply.text = std::move(value); }
inline void put(tally_reply& reply, std::optional<std::string> value) { reply.text = std::move(value); }
inline void put(tally_reply& reply, std::optional<std::vector<std::string>> value) {
  reply.list = std::move(value);
}
inline void put(tally_reply& reply, bool value) { reply.truth = value; }
inline void put(tally_reply& reply, TallyConnection::UploadLogDataResult value) {
  reply.truth = value.uploaded;
  reply.text = std::move(value.error);
}

template <class T>
tally_reply replyFrom(TallyReply<T> answer) {
  tally_reply reply;
  reply.status = statusOf(answer.kind);
  if (answer.error) {
    reply.error = *std::move(answer.error);
  } else {
    put(reply, std::move(answer.value));
  }
  return reply;
}

}  // namespace tallyd::c
