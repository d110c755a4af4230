/* An adaptor that needs a function which is nowhere to be had. */
#include "framework/PithAdaptor.h"

void* tallydTestMissingFunction(void);

const struct PithAdaptorClass PithAdaptor = {PITH_ADAPTOR_STRUCTURE_VERSION, tallydTestMissingFunction, NULL,
                                             NULL};
