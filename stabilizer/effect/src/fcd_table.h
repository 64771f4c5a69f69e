#pragma once

#include <cstdint>

// The table that a direct render hands to the host at its beginning, one of the plug-in's exports:
// rows of three words. This effect has nothing to tell in it.
extern "C" const std::uint32_t HXp_G_fcd_table[1][3];
