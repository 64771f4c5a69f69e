#ifndef PLATFORM_HX_HX_PROPERTIES_H_
#define PLATFORM_HX_HX_PROPERTIES_H_

#include "platform/hx/hx_types.h"

/* The property record by which a host knows a plug-in before it calls it: a flat block without
   alignment, all words little-endian. A header, then the properties, each a property header and its
   value, padded with zeros to a multiple of four. The length word may or may not count the padding,
   so a reader steps by the length rounded up. In an ELF library the record is the data symbol
   HX_PROPERTY_SYMBOL in section HX_PROPERTY_SECTION; the symbol's size bounds it. */

#define HX_PROPERTY_SYMBOL "HXPL_16000"
#define HX_PROPERTY_SECTION ".hxpl"

enum { HX_PROPERTY_VERSION = 1, HX_PROPERTY_SECOND_VERSION = 0 };

typedef struct HX_PropertyListHeader {
  uint8_t version[2];
  uint8_t second_version[4];
  uint8_t count[4];
} HX_PropertyListHeader;

typedef struct HX_PropertyHeader {
  char vendor[4]; /* HX_PROPERTY_VENDOR */
  char key[4];    /* HX_KEY_*; unknown ones are skipped */
  uint8_t index[4];
  uint8_t length[4];
} HX_PropertyHeader;

/* Codes of four bytes as they stand in the record: byte-reversed. */
#define HX_PROPERTY_VENDOR "XVN8"
#define HX_KEY_KIND "dnik"                /* HX_KIND_EFFECT */
#define HX_KEY_NAME "eman"                /* Pascal string, localised for display */
#define HX_KEY_CATEGORY "gtac"            /* Pascal string, localised for display */
#define HX_KEY_ENTRY_64 "4668"            /* zero-terminated name of the entry */
#define HX_KEY_HOST_PLUGIN_VERSION "RVPx" /* u32 */
#define HX_KEY_HOST_SPEC_VERSION "RVSx"   /* u32 */
#define HX_KEY_EFFECT_VERSION "REVx"      /* u32 */
#define HX_KEY_EFFECT_INFO "FNIx"         /* u16 */
#define HX_KEY_OUT_FLAGS "OLGx"           /* u32; need not equal what HX_CMD_START_PLUGIN sets */
#define HX_KEY_OUT_FLAGS_2 "2LGx"         /* u32; as above */
#define HX_KEY_MATCH_NAME "ANMx"          /* Pascal string; the effect's identity in projects */
#define HX_KEY_HOST_FLAGS "LFxq"          /* u32 */
#define HX_KIND_EFFECT "TKFx"

HX_STATIC_ASSERT(sizeof(HX_PropertyListHeader) == 10, "HX_PropertyListHeader");
HX_STATIC_ASSERT(offsetof(HX_PropertyListHeader, count) == 6, "HX_PropertyListHeader.count");
HX_STATIC_ASSERT(sizeof(HX_PropertyHeader) == 16, "HX_PropertyHeader");

#endif
