/* What an adaptor bundle exports: the class that the daemon hands a client's messages to. Plain C. */
#pragma once

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

/* The structureVersion of the shape below. */
#define PITH_ADAPTOR_STRUCTURE_VERSION 1

/*
 * The class, as a structure of functions. A null member is a method that the adaptor does not respond to; so
 * is every member of a structure whose version the daemon does not know.
 *
 * Life cycle: one instance for each session that the adaptor's clients have, made when the session starts and
 * destroyed when it ends. The bundle's library stays loaded as long as the daemon runs.
 *
 * Threading: the calls on one instance come one at a time, from varying threads; those on different instances
 * may come at the same time. The session waits for each call.
 *
 * A C++ exception that leaves a function is caught by the daemon and logged.
 */
struct PithAdaptorClass {
  uint32_t structureVersion; /* PITH_ADAPTOR_STRUCTURE_VERSION */

  /* One instance, or NULL. */
  void* (*create)(void);

  void (*destroy)(void* self);

  /*
   * One message. `plist` is its payload, a dictionary as a binary property list of `length` bytes that are
   * valid during the call; NULL and 0 for a message without payload.
   */
  void (*sendMessageWithMethod_respCode_dict)(void* self, uint16_t method, uint16_t respCode,
                                              const void* plist, size_t length);
};

/* To be defined by the bundle's executable and exported under this name. */
extern const struct PithAdaptorClass PithAdaptor;

#ifdef __cplusplus
}
#endif
