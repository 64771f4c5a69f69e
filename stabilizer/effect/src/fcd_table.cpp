#include "stabilizer/effect/src/fcd_table.h"

const std::uint32_t HXp_G_fcd_table[1][3] = {};
