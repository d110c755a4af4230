/* The client library for C and for everything that calls C: one session with the reporting daemon. C99. */
#ifndef TALLY_TALLY_H
#define TALLY_TALLY_H

#include <stddef.h>
#include <stdint.h>

#include "framework/c/values.h"

#ifdef __cplusplus
extern "C" {
#endif

/*
 * Rules for all functions.
 *
 * Texts are UTF-8, end with a NUL and are copied. An object that a function returns belongs to the caller,
 * who gives it back with the function that its comment names; giving back NULL does nothing. What a function
 * is given stays the caller's, unless its comment says that it is taken over.
 *
 * Errors: a function that can fail returns a status, or NULL for an object. tally_last_error() then tells
 * why. Nothing aborts, no C++ exception leaves the library.
 *
 * Threads: a connection may be used from any thread at any time. Every other object belongs to one thread at
 * a time.
 */

#define TALLY_VERSION_MAJOR 1
#define TALLY_VERSION_MINOR 0
#define TALLY_VERSION_PATCH 0

/* "MAJOR.MINOR.PATCH" of the library that runs. Static. */
const char* tally_version(void);

/* The connection */

typedef struct tally_options tally_options;
typedef struct tally_connection tally_connection;
typedef struct tally_reply tally_reply;

enum {
  TALLY_NEVER_RECONNECT = 0,    /* A connection that breaks, or cannot be made, is of no more use. */
  TALLY_RECONNECT_WHEN_LOST = 1 /* It is made again, and the session is configured as it was. The default. */
};

/* Defaults: see each setter. NULL when there is no memory. Give back with tally_options_free(). */
tally_options* tally_options_new(void);
void tally_options_free(tally_options* options);

/* Default: /run/tallyd/com.quillon.tallyd, below the folder that the environment's TALLY_ROOT names. */
tally_status tally_options_set_socket_path(tally_options* options, const char* path);
/* Milliseconds that a call may take which states none of its own. Default: 60000. */
tally_status tally_options_set_timeout(tally_options* options, int64_t milliseconds);
/* Milliseconds that tally_disconnect() waits at most. Default: 5000. */
tally_status tally_options_set_close_timeout(tally_options* options, int64_t milliseconds);
/* TALLY_NEVER_RECONNECT or TALLY_RECONNECT_WHEN_LOST. */
tally_status tally_options_set_reconnect(tally_options* options, int reconnect);
/* The first pause before connecting again, and the longest, in milliseconds. Default: 100 and 30000. */
tally_status tally_options_set_pauses(tally_options* options, int64_t first, int64_t maximum);
/* Calls that may be unfinished at a time. Default: 4096. */
tally_status tally_options_set_maximum_calls(tally_options* options, size_t calls);

/*
 * A session with the daemon; `options` may be NULL. With TALLY_RECONNECT_WHEN_LOST it returns at once and the
 * daemon need not be there yet. With TALLY_NEVER_RECONNECT it is NULL when the daemon cannot be reached.
 * Ends with tally_disconnect(). A child process must not use its parent's connection.
 */
tally_connection* tally_connect(const tally_options* options);

/*
 * Ends the session. Calls that were made may still leave and be answered, for as long as the close timeout
 * and their own timeouts allow; the rest fails. Every callback has run when it returns, none runs later. Not
 * to be called from a callback.
 */
void tally_disconnect(tally_connection* connection);

/* Called on the connection's own thread; NULL for nothing. */
typedef void (*tally_handler)(void* context);
/* The connection has broken; it will be made again, or the invalidation handler is called next. */
tally_status tally_set_interruption_handler(tally_connection* connection, tally_handler handler,
                                            void* context);
/* The connection is of no more use. Once; at once if it is so already. */
tally_status tally_set_invalidation_handler(tally_connection* connection, tally_handler handler,
                                            void* context);
/* The connection was made again, and the session is being configured as it was. */
tally_status tally_set_reconnection_handler(tally_connection* connection, tally_handler handler,
                                            void* context);

/* Replies */

/* TALLY_OK when the daemon has answered. */
tally_status tally_reply_status(const tally_reply* reply);
/* Why it has not; NULL when it has. Valid as long as the reply. */
const char* tally_reply_error(const tally_reply* reply);
/* The operation's text; NULL when there is none. Valid as long as the reply. */
const char* tally_reply_text(const tally_reply* reply);
/* 1 when the operation says yes, else 0. */
int tally_reply_truth(const tally_reply* reply);
/* 1 when the operation gave a list, which may be empty; else 0. Its elements are valid as long as the reply;
 * one beyond its end is NULL. */
int tally_reply_has_list(const tally_reply* reply);
size_t tally_reply_count(const tally_reply* reply);
const char* tally_reply_item(const tally_reply* reply, size_t index);
void tally_reply_free(tally_reply* reply);

/*
 * Operations, each in two forms.
 *
 * The plain one waits for the answer, at most `timeout` milliseconds, or the connection's when it is
 * TALLY_DEFAULT_TIMEOUT. It returns a reply for every outcome, to be given back with tally_reply_free(); NULL
 * only when there is no memory.
 *
 * The asynchronous one returns at once, also while the daemon hangs or is away. When it returns TALLY_OK the
 * callback is called exactly once, on the connection's own thread, with a reply that is valid during the
 * call; otherwise it is not called. A NULL callback asks for no answer. Callbacks may make asynchronous
 * calls; a plain one fails there with TALLY_ERROR_OWN_THREAD. They hold up the connection while they run.
 *
 * Dictionaries may be NULL for none.
 */
#define TALLY_DEFAULT_TIMEOUT ((int64_t)-1)
typedef void (*tally_callback)(const tally_reply* reply, void* context);

/* Sets the session up; `frameworks` has `framework_count` texts. Text: "received". */
tally_reply* tally_set_session_info(tally_connection* connection, const tally_value* session_info,
                                    const tally_value* user_info, const char* const* frameworks,
                                    size_t framework_count, int64_t timeout);
tally_status tally_set_session_info_async(tally_connection* connection, const tally_value* session_info,
                                          const tally_value* user_info, const char* const* frameworks,
                                          size_t framework_count, int64_t timeout, tally_callback callback,
                                          void* context);

/* Starts the session. List: the backends that report; none when the daemon has no storebag for the client. */
tally_reply* tally_start_config(tally_connection* connection, int64_t timeout);
tally_status tally_start_config_async(tally_connection* connection, int64_t timeout, tally_callback callback,
                                      void* context);

/* List: the backends that report; none before the start. */
tally_reply* tally_fetch_states(tally_connection* connection, const tally_value* user_info, int64_t timeout);
tally_status tally_fetch_states_async(tally_connection* connection, const tally_value* user_info,
                                      int64_t timeout, tally_callback callback, void* context);

/* Text: where the session can be looked at, or "URL not available". */
tally_reply* tally_fetch_display_url(tally_connection* connection, int64_t timeout);
tally_status tally_fetch_display_url_async(tally_connection* connection, int64_t timeout,
                                           tally_callback callback, void* context);

/* Text: what was reported, where the user consents. */
tally_reply* tally_send_message(tally_connection* connection, uint16_t category, uint16_t type,
                                const tally_value* payload, int64_t timeout);
tally_status tally_send_message_async(tally_connection* connection, uint16_t category, uint16_t type,
                                      const tally_value* payload, int64_t timeout, tally_callback callback,
                                      void* context);

/* Posts what was held back. Text: as above. */
tally_reply* tally_flush_messages(tally_connection* connection, int64_t timeout);
tally_status tally_flush_messages_async(tally_connection* connection, int64_t timeout,
                                        tally_callback callback, void* context);

/* Truth: whether a backend has uploaded the file. It is opened here and passed to the daemon. */
tally_reply* tally_upload_file(tally_connection* connection, const char* path, int64_t timeout);
tally_status tally_upload_file_async(tally_connection* connection, const char* path, int64_t timeout,
                                     tally_callback callback, void* context);

/* `log_data` is an array. Truth: whether it was uploaded. Text: what went wrong, where the daemon says so. */
tally_reply* tally_upload_log_data(tally_connection* connection, const tally_value* log_data,
                                   int64_t timeout);
tally_status tally_upload_log_data_async(tally_connection* connection, const tally_value* log_data,
                                         int64_t timeout, tally_callback callback, void* context);

/* One message without a session of its own: text "finished" or "storebag not available". Without a session ID
 * and a client type in `session_info` the daemon gives no answer. */
tally_reply* tally_send_message_with_session_info(tally_connection* connection,
                                                  const tally_value* session_info,
                                                  const tally_value* user_info, uint16_t category,
                                                  uint16_t type, const tally_value* payload, int64_t timeout);
tally_status tally_send_message_with_session_info_async(tally_connection* connection,
                                                        const tally_value* session_info,
                                                        const tally_value* user_info, uint16_t category,
                                                        uint16_t type, const tally_value* payload,
                                                        int64_t timeout, tally_callback callback,
                                                        void* context);

#ifdef __cplusplus
}
#endif

#endif
