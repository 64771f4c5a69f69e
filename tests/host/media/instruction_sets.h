#pragma once

#define HWY_BROKEN_EMU128 0  // as the kernels have it: the target of last resort is theirs

#include "tests/support/each_instruction_set.h"
