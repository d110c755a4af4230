/* The library as a C program sees it, in C99. */
#include "PlainC.h"

#include "tally/tally.h"

static void count(const tally_reply* reply, void* context) {
  if (tally_reply_status(reply) == TALLY_OK) ++*(int*)context;
}

tally_value* plainPayload(void) {
  tally_value* payload = tally_value_from_json("{\"speed\": 2.5, \"list\": [1, \"two\"], \"none\": null}");
  tally_value* list = tally_value_new_array();
  tally_array_append(list, tally_value_new_integer(-1));
  tally_array_append(list, tally_value_new_unsigned(UINT64_MAX));
  tally_array_append(list, tally_value_new_boolean(1));
  tally_array_append(list, tally_value_new_real(0.5));
  tally_array_append(list, tally_value_new_text("text"));
  tally_array_append(list, tally_value_new_date(12.5));
  tally_array_append(list, tally_value_new_data("\0b", 2));
  tally_array_append(list, tally_value_new_null());
  tally_array_append(list, tally_value_new_dictionary());
  tally_dictionary_set(payload, "kinds", list);
  tally_dictionary_set_boolean(payload, "boolean", 0);
  tally_dictionary_set_integer(payload, "integer", 7);
  tally_dictionary_set_real(payload, "real", 1.25);
  tally_dictionary_set_text(payload, "text", "\xc3\xbc");
  tally_dictionary_set_date(payload, "date", 1.5);
  tally_dictionary_set_data(payload, "data", "bytes", 5);
  tally_dictionary_set_json(payload, "json", "[true]");
  return payload;
}

int plainSend(tally_connection* connection, int* answered) {
  tally_value* payload = plainPayload();
  const tally_status status =
      tally_send_message_async(connection, 3, 65535, payload, TALLY_DEFAULT_TIMEOUT, count, answered);
  tally_value_free(payload);
  return status;
}
