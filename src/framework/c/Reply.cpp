#include "framework/c/Reply.h"

#include "framework/c/Boundary.h"

namespace tallyd::c {

tally_status statusOf(TallyError error) {
  switch (error) {
    case TallyError::None:
      return TALLY_OK;
    case TallyError::Argument:
      return TALLY_ERROR_ARGUMENT;
    case TallyError::Refused:
      return TALLY_ERROR_REFUSED;
    case TallyError::TimedOut:
      return TALLY_ERROR_TIMED_OUT;
    case TallyError::Disconnected:
      return TALLY_ERROR_DISCONNECTED;
    case TallyError::Closed:
      return TALLY_ERROR_CLOSED;
    case TallyError::Rejected:
      return TALLY_ERROR_REJECTED;
    case TallyError::OwnThread:
      return TALLY_ERROR_OWN_THREAD;
  }
  return TALLY_ERROR_MEMORY;
}

}  // namespace tallyd::c

// A reply that there was no memory for reads like one that failed.

tally_status tally_reply_status(const tally_reply* reply) {
  return reply ? reply->status : TALLY_ERROR_MEMORY;
}

const char* tally_reply_error(const tally_reply* reply) {
  if (!reply) return "no memory";
  return reply->status == TALLY_OK ? nullptr : reply->error.c_str();
}

const char* tally_reply_text(const tally_reply* reply) {
  return reply && reply->text ? reply->text->c_str() : nullptr;
}

int tally_reply_truth(const tally_reply* reply) { return reply && reply->truth ? 1 : 0; }

int tally_reply_has_list(const tally_reply* reply) { return reply && reply->list ? 1 : 0; }

size_t tally_reply_count(const tally_reply* reply) { return reply && reply->list ? reply->list->size() : 0; }

const char* tally_reply_item(const tally_reply* reply, size_t index) {
  return index < tally_reply_count(reply) ? (*reply->list)[index].c_str() : nullptr;
}

void tally_reply_free(tally_reply* reply) { delete reply; }
