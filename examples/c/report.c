/*
 * Sends one event to the reporting daemon and says what became of it, in C99.
 *
 * With CMake (examples/CMakeLists.txt):  find_package(Tally) and target_link_libraries(report Tally::tally)
 * With pkg-config:  cc -std=c99 report.c $(pkg-config --cflags --libs tally) -o report
 * Use:  report [SOCKET]
 */
#include <stdio.h>
#include <tally/tally.h>

/* Says what the daemon answered; 1 when it did not. */
static int finish(const char* operation, tally_reply* reply) {
  const int failed = tally_reply_status(reply) != TALLY_OK;
  if (failed) fprintf(stderr, "%s: %s\n", operation, tally_reply_error(reply));
  tally_reply_free(reply);
  return failed;
}

static void whenSent(const tally_reply* reply, void* context) {
  int* failed = context;
  *failed = tally_reply_status(reply) != TALLY_OK;
}

static int report(tally_connection* connection) {
  tally_value* info = tally_value_from_json("{\"SessionID\": 1001, \"ClientType\": 5, \"ClientVersion\": 1}");
  int failed =
      finish("configuring", tally_set_session_info(connection, info, NULL, NULL, 0, TALLY_DEFAULT_TIMEOUT));
  tally_value_free(info);
  if (failed || finish("starting", tally_start_config(connection, TALLY_DEFAULT_TIMEOUT))) return 1;

  /* JSON where it is convenient, setters for what JSON cannot say. */
  tally_value* event = tally_value_from_json("{\"from\": \"C\", \"speed\": 2.5, \"stops\": 2}");
  tally_dictionary_set_date(event, "departed", 1.5);
  failed = finish("sending", tally_send_message(connection, 3, 0, event, 10000));
  /* The same without waiting: the last argument but one hears the answer, on the connection's thread. */
  int laterFailed = 1;
  if (tally_send_message_async(connection, 4, 0, event, TALLY_DEFAULT_TIMEOUT, whenSent, &laterFailed) !=
      TALLY_OK)
    fprintf(stderr, "sending: %s\n", tally_last_error());
  tally_value_free(event);
  /* Calls are answered in their order: after this one, laterFailed is set. */
  return finish("flushing", tally_flush_messages(connection, TALLY_DEFAULT_TIMEOUT)) || failed || laterFailed;
}

int main(int argc, char** argv) {
  tally_options* options = tally_options_new();
  if (argc > 1) tally_options_set_socket_path(options, argv[1]);
  tally_options_set_timeout(options, 30000);
  tally_connection* connection = tally_connect(options);
  tally_options_free(options);
  if (!connection) {
    fprintf(stderr, "connecting: %s\n", tally_last_error());
    return 1;
  }
  const int failed = report(connection);
  tally_disconnect(connection);
  if (!failed) puts("reported");
  return failed;
}
