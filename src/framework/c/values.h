/* Values for C: what payloads, session info and user info are made of. Included by tally.h. C99. */
#ifndef TALLY_VALUES_H
#define TALLY_VALUES_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef int32_t tally_status;
enum {
  TALLY_OK = 0,
  TALLY_ERROR_ARGUMENT = 1,     /* An argument is not as it must be; nothing was sent. */
  TALLY_ERROR_REFUSED = 2,      /* Too many calls are unfinished; nothing was sent. */
  TALLY_ERROR_TIMED_OUT = 3,    /* No answer in time; the daemon may have heard the call. */
  TALLY_ERROR_DISCONNECTED = 4, /* The connection broke meanwhile; the daemon may have heard the call. */
  TALLY_ERROR_CLOSED = 5,       /* The connection is of no more use, or cannot be made; nothing was sent. */
  TALLY_ERROR_REJECTED = 6,     /* The daemon answered with an error. */
  TALLY_ERROR_OWN_THREAD = 7,   /* A call that waits was made from a callback. */
  TALLY_ERROR_MEMORY = 8        /* There is no memory, or something else inside the library failed. */
};

/* Why the last call on this thread that failed did so. Never NULL; valid until the next one fails here. */
const char* tally_last_error(void);

/*
 * A value: null, boolean, integer, real, text, date, data, array or dictionary.
 *
 * The functions that make one return NULL when there is no memory or the argument is wrong. Give a value back
 * with tally_value_free(), unless it went into an array or a dictionary.
 */
typedef struct tally_value tally_value;

void tally_value_free(tally_value* value);

/* From JSON text (RFC 8259): numbers without fraction and exponent become integers, objects dictionaries. */
tally_value* tally_value_from_json(const char* text);
tally_value* tally_value_new_null(void);
tally_value* tally_value_new_boolean(int value);
tally_value* tally_value_new_integer(int64_t value);
tally_value* tally_value_new_unsigned(uint64_t value);
tally_value* tally_value_new_real(double value);
tally_value* tally_value_new_text(const char* text);
tally_value* tally_value_new_date(double seconds_since_1970);
tally_value* tally_value_new_data(const void* bytes, size_t length);
tally_value* tally_value_new_array(void);
tally_value* tally_value_new_dictionary(void);

/* Take `element` over, also when they fail: TALLY_ERROR_ARGUMENT when it is NULL or the container is not of
 * the kind. An array takes it at its end, a dictionary in place of what the key had. */
tally_status tally_array_append(tally_value* array, tally_value* element);
tally_status tally_dictionary_set(tally_value* dictionary, const char* key, tally_value* element);

/* The same for elements that are made on the way. */
tally_status tally_dictionary_set_boolean(tally_value* dictionary, const char* key, int value);
tally_status tally_dictionary_set_integer(tally_value* dictionary, const char* key, int64_t value);
tally_status tally_dictionary_set_real(tally_value* dictionary, const char* key, double value);
tally_status tally_dictionary_set_text(tally_value* dictionary, const char* key, const char* text);
tally_status tally_dictionary_set_date(tally_value* dictionary, const char* key, double seconds_since_1970);
tally_status tally_dictionary_set_data(tally_value* dictionary, const char* key, const void* bytes,
                                       size_t length);
tally_status tally_dictionary_set_json(tally_value* dictionary, const char* key, const char* text);

/* The value as readable text, for logs; give back with tally_text_free(). NULL when there is no memory. */
char* tally_value_description(const tally_value* value);
void tally_text_free(char* text);

#ifdef __cplusplus
}
#endif

#endif
