#ifndef PLATFORM_HX_HX_PIXEL_H_
#define PLATFORM_HX_HX_PIXEL_H_

#include <stdint.h>

/* The host's pixels: alpha first in memory, not premultiplied. */

typedef struct HX_Pixel8 {
  uint8_t alpha, red, green, blue; /* 0 to 255 */
} HX_Pixel8;

typedef struct HX_Pixel16 {
  uint16_t alpha, red, green, blue; /* 0 to 32768 */
} HX_Pixel16;

typedef struct HX_PixelFloat {
  float alpha, red, green, blue; /* 0 to 1 nominal */
} HX_PixelFloat;

#endif
