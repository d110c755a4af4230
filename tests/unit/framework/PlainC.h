/* What PlainC.c does for the test. */
#pragma once

#include "tally/tally.h"

#ifdef __cplusplus
extern "C" {
#endif

tally_value* plainPayload(void);
/* Sends it without waiting; counts in `answered`. */
int plainSend(tally_connection* connection, int* answered);

#ifdef __cplusplus
}
#endif
