/* An adaptor of a version that nobody knows yet, whose members mean something else. */
#include <stdlib.h>

#include "framework/PithAdaptor.h"

static void* create(void) { abort(); }
static void destroy(void* self) {
  (void)self;
  abort();
}
static void sendMessage(void* self, uint16_t method, uint16_t respCode, const void* plist, size_t length) {
  (void)self, (void)method, (void)respCode, (void)plist, (void)length;
  abort();
}

const struct PithAdaptorClass PithAdaptor = {PITH_ADAPTOR_STRUCTURE_VERSION + 1, create, destroy,
                                             sendMessage};
