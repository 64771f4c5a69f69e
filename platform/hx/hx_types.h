#ifndef PLATFORM_HX_HX_TYPES_H_
#define PLATFORM_HX_HX_TYPES_H_

#include <stddef.h>
#include <stdint.h>

/* What all records of the interface are made of. Everything here is plain C11 and C++; no record
   owns what it points at unless its comment says so, and nothing ever throws across it. */

#ifdef __cplusplus
#define HX_STATIC_ASSERT(condition, text) static_assert(condition, text)
#else
#define HX_STATIC_ASSERT(condition, text) _Static_assert(condition, text)
#endif

/* Result of every operation; 0 is success. A caller that has no better answer hands a code on as it
 * came. */
typedef int32_t HX_Err;

enum {
  HX_ERR_NONE = 0,
  HX_ERR_UNKNOWN = 1,        /* failure without a code of its own */
  HX_ERR_HANDLE_LOCK = 3,    /* handle can't be locked */
  HX_ERR_MEMORY = 4,         /* out of memory */
  HX_ERR_MISSING_SUITE = 13, /* suite of that name and version isn't offered */
  HX_ERR_LAYER_REFUSED = 514,
  HX_ERR_NO_INSTANCE = -108 /* instance handle can't be had */
};

/* The effect of the present call, as the host knows it. Stays valid while the host has frames of it
   in work; the host bears a stale one in the calls that say so. */
typedef struct HX_EffectRecord* HX_EffectRef;

/* A block of the host's memory; see HX_Callbacks. */
typedef struct HX_HandleRecord* HX_Handle;

/* A text of the host; see HX_StringSuite1. */
typedef struct HX_StringRecord* HX_String;

/* Left, top, right, bottom in pixels, half-open; empty when right <= left or bottom <= top. */
typedef struct HX_Rect {
  int32_t left, top, right, bottom;
} HX_Rect;

/* 128 bits in the byte order of their text form; all zero is nil. */
typedef struct HX_Guid {
  uint8_t bytes[16];
} HX_Guid;

typedef struct HX_Ratio {
  int32_t num;
  uint32_t den;
} HX_Ratio;

/* Ticks of one second in every time that is told in ticks. */
#define HX_TICKS_PER_SECOND INT64_C(705600000)

/* Field orders. */
enum { HX_FIELD_PROGRESSIVE = 0, HX_FIELD_FIRST_ORDER = 1, HX_FIELD_SECOND_ORDER = 2 };

HX_STATIC_ASSERT(sizeof(HX_Rect) == 16, "HX_Rect");
HX_STATIC_ASSERT(sizeof(HX_Guid) == 16, "HX_Guid");

#endif
