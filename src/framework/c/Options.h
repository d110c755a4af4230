// A connection's options as C sees them.
#pragma once

#include "framework/TallyConnectionOptions.h"
#include "framework/c/tally.h"

struct tally_options {
  tallyd::TallyConnectionOptions options{};
};
