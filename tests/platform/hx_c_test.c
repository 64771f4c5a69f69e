#include "tests/platform/hx_layout.h"

/* The headers as a C host or plug-in sees them. */

#if !defined(__STDC_VERSION__) || __STDC_VERSION__ < 201112L || defined(__cplusplus)
#error "to be compiled as C11"
#endif

const HX_LayoutEntry* hx_layout_in_c(size_t* count) {
  static const HX_LayoutEntry entries[] = {HX_LAYOUT(HX_LAYOUT_SIZE, HX_LAYOUT_OFFSET)};
  *count = sizeof entries / sizeof entries[0];
  return entries;
}
