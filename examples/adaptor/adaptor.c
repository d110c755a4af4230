/*
 * An adaptor bundle's executable: the daemon loads it and hands it every message of the clients that the bundle belongs to.
 * This one writes a line for each message to the file that the environment variable TALLY_ADAPTOR_FILE names.
 *
 *   cc -shared -fPIC -I/usr/include/tally adaptor.c -o Fennel.so
 *
 * Install it as /System/Library/PrivateFrameworks/Fennel.framework/Fennel.so; docs/wire.md says which bundle belongs to
 * which client type.
 */
#include <stdio.h>
#include <stdlib.h>

#include "framework/PithAdaptor.h"

static void* create(void) {
  const char* path = getenv("TALLY_ADAPTOR_FILE");
  return path ? fopen(path, "a") : NULL;
}

static void destroy(void* self) { fclose(self); }

/* `plist` is the payload as a binary property list; NULL when the message has none. */
static void sendMessage(void* self, uint16_t method, uint16_t respCode, const void* plist, size_t length) {
  (void)plist;
  fprintf(self, "method %u, status %u, %zu bytes\n", (unsigned)method, (unsigned)respCode, length);
  fflush(self);
}

const struct PithAdaptorClass PithAdaptor = {PITH_ADAPTOR_STRUCTURE_VERSION, create, destroy, sendMessage};
