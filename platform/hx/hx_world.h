#ifndef PLATFORM_HX_HX_WORLD_H_
#define PLATFORM_HX_HX_WORLD_H_

#include "platform/hx/hx_pixel.h"
#include "platform/hx/hx_types.h"

/* Frame buffers. */

/* Pixel format codes: the four characters in memory order, read as a little-endian word. */
#define HX_FORMAT_ARGB8 \
  UINT32_C(0x62677261) /* "argb", HX_Pixel8; in memory alpha, red, green, blue */
#define HX_FORMAT_ARGB16 UINT32_C(0x36677261) /* "arg6", HX_Pixel16 */
#define HX_FORMAT_ARGBF UINT32_C(0x66677261)  /* "argf", HX_PixelFloat */
#define HX_FORMAT_BGRA8                                                    \
  UINT32_C(0x61726762) /* "bgra", 8 bit; in memory blue, green, red, alpha \
                        */
/* Set in the format of a delivered frame whose first row in memory is the top one; else it is the
 * bottom one. */
#define HX_FORMAT_TOP_DOWN UINT32_C(0x80000000)

/* HX_World.flags */
enum { HX_WORLD_DEEP = 1 /* 16 bits a channel */ };

/* A frame buffer, top row first. Borrowed, except from HX_WorldSuite2.NewWorld. Written by one
 * thread at a time. */
typedef struct HX_World {
  void* data;
  int32_t row_bytes; /* >= width pixels; the bytes behind them belong to nobody */
  int32_t width, height;
  uint32_t flags;
  int32_t origin_x, origin_y; /* the buffer's top left in layer coordinates at render scale */
  uint32_t format;            /* HX_FORMAT_* */
  HX_Rect extent;             /* part of the buffer that holds pixels; the rest is clear */
} HX_World;

/* How HX_Callbacks.transfer composes. */
enum { HX_TRANSFER_BEHIND = 1, HX_TRANSFER_IN_FRONT = 2 };

typedef struct HX_TransferMode {
  int32_t mode;         /* HX_TRANSFER_* */
  int32_t random_seed;  /* 0 */
  uint8_t opacity;      /* 255 is full; used on 8-bit worlds */
  uint8_t rgb_only;     /* 0 */
  uint16_t opacity_u16; /* 32768 is full; used on deeper worlds */
} HX_TransferMode;

HX_STATIC_ASSERT(sizeof(HX_Pixel8) == 4, "HX_Pixel8");
HX_STATIC_ASSERT(sizeof(HX_Pixel16) == 8, "HX_Pixel16");
HX_STATIC_ASSERT(sizeof(HX_PixelFloat) == 16, "HX_PixelFloat");
HX_STATIC_ASSERT(sizeof(HX_TransferMode) == 12, "HX_TransferMode");
HX_STATIC_ASSERT(sizeof(void*) != 8 || sizeof(HX_World) == 56, "HX_World");

#endif
