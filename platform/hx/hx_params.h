#ifndef PLATFORM_HX_HX_PARAMS_H_
#define PLATFORM_HX_HX_PARAMS_H_

#include "platform/hx/hx_world.h"

/* Parameter records. The host copies a record that it is given; texts that one points at stay the
   effect's and live until the plug-in is stopped. */

/* HX_ParamDef.kind */
enum {
  HX_PARAM_LAYER = 0,
  HX_PARAM_CHECKBOX = 4,
  HX_PARAM_POPUP = 7,
  HX_PARAM_FLOAT_SLIDER = 10,
  HX_PARAM_ARBITRARY = 11,
  HX_PARAM_GROUP_START = 13,
  HX_PARAM_GROUP_END = 14,
  HX_PARAM_BUTTON = 15
};

/* HX_ParamDef.flags; all other bits are kept and mean nothing. */
enum {
  HX_PARAM_FLAG_CLOSED = 0x20,    /* group start: shown closed at first */
  HX_PARAM_FLAG_SUPERVISED = 0x40 /* a change sends HX_CMD_PARAM_CHANGED */
};

/* HX_ParamDef.ui_flags; all other bits are kept and mean nothing. */
enum { HX_PARAM_UI_DISABLED = 32, HX_PARAM_UI_HIDDEN = 512 };

enum { HX_PARAM_NAME_SIZE = 32 /* bytes, with the terminating zero */ };

typedef struct HX_FloatSlider {
  double value;
  float valid_min, valid_max;   /* the host clamps the user's input to these */
  float slider_min, slider_max; /* range of the control */
  float default_value;
  float tolerance;
  int16_t precision; /* decimals shown */
  int16_t display;   /* 1 percent; 0x100 */
} HX_FloatSlider;

typedef struct HX_Popup {
  int32_t value, default_value; /* from 1 */
  int32_t count;
  const char* items; /* UTF-8, "|" between items */
} HX_Popup;

typedef struct HX_Checkbox {
  int32_t value, default_value; /* 0 or 1 */
  const char* label;            /* UTF-8, may be null */
} HX_Checkbox;

typedef struct HX_Button {
  int32_t value;     /* 0 */
  const char* label; /* UTF-8 text on the button; name is the text beside it */
} HX_Button;

/* Values are handles that HX_CMD_CUSTOM_DATA_OP makes and frees. No effect declares such a
   parameter; a host that keeps the deleted track points of an effect (disk id 305) appends one to
   those that the effect declared. The bytes of these are 8 a point, little-endian: the slot in the
   lower 4, above it the frame of the source, in fields where that is interlaced. */
typedef struct HX_ArbitraryData {
  int16_t id; /* the disk id */
  HX_Handle default_value, value;
} HX_ArbitraryData;

typedef union HX_ParamValue {
  HX_World ld;            /* HX_PARAM_LAYER: index 0 and checkouts of it */
  HX_FloatSlider fs;      /* HX_PARAM_FLOAT_SLIDER */
  HX_Popup pd;            /* HX_PARAM_POPUP */
  HX_Checkbox bd;         /* HX_PARAM_CHECKBOX */
  HX_Button button;       /* HX_PARAM_BUTTON */
  HX_ArbitraryData arb_d; /* HX_PARAM_ARBITRARY */
} HX_ParamValue;

typedef struct HX_ParamDef {
  int32_t disk_id;               /* stored in projects instead of the index; never changes */
  int32_t kind;                  /* HX_PARAM_* */
  char name[HX_PARAM_NAME_SIZE]; /* UTF-8, ended by a zero */
  uint32_t flags;
  uint32_t ui_flags;
  uint8_t change_flag; /* set by the effect on a record whose value it replaced */
  HX_ParamValue u;
} HX_ParamDef;

HX_STATIC_ASSERT(sizeof(void*) != 8 || sizeof(HX_ParamDef) == 112, "HX_ParamDef");

#endif
