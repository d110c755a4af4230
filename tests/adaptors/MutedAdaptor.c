/* An adaptor that does not respond to messages. */
#include "framework/PithAdaptor.h"

static int instance;

static void* create(void) { return &instance; }

const struct PithAdaptorClass PithAdaptor = {PITH_ADAPTOR_STRUCTURE_VERSION, create, NULL, NULL};
