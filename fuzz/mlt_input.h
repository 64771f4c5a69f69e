#pragma once

#include <cstdint>

// How mlt_fuzz's input begins; then come properties, a name and a value each to its zero, up to an
// empty name, and saved work.
namespace calmframe::fuzz {

struct MltInput {
  std::int32_t rate_num = 25, rate_den = 1;
  std::int32_t display_num = 4, display_den = 3;
  std::int16_t frame = 0;  // of the results, that is drawn
  std::uint8_t is_packed = 0, is_full = 0;
  std::uint8_t unused[4] = {};
};
static_assert(sizeof(MltInput) == 24);

}  // namespace calmframe::fuzz
