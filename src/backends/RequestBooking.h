// What the books and the tap say about a finished HTTP request.
#pragma once

#include "platform/HTTPClient.h"
#include "support/Account.h"

namespace tallyd {

/// A response of any status means that the server has what was sent; from 400 on (RFC 9110, section 15.5) it
/// says that it does not want it.
[[nodiscard]] inline Account::Answer answerOf(const platform::HTTPResult& result) {
  constexpr int kLeastErrorStatus = 400;
  return result.response && result.response->status >= kLeastErrorStatus ? Account::Answer::Refused
                                                                         : Account::Answer::Taken;
}

/// Adds "result": {"status"} or {"error"}.
inline void addResult(TapLine& line, const platform::HTTPResult& result) {
  platform::Dictionary fields;
  if (result.error) fields.set("error", *result.error);
  if (result.response) fields.set("status", result.response->status);
  line.add("result", fields);
}

}  // namespace tallyd
