#ifndef PLATFORM_HX_HX_EFFECT_H_
#define PLATFORM_HX_HX_EFFECT_H_

#include "platform/hx/hx_params.h"
#include "platform/hx/hx_world.h"

/* The entry: its commands, the records it is called with, and the callbacks behind them. All are
 * borrowed for the call. */

/* Commands; all others are ignored with result 0. "UI": the one thread of the host's user
   interface, one call at a time. "Render": any number of threads at once, each with an instance
   handle of its own. */
enum {
  HX_CMD_ABOUT = 0,                 /* UI; the text comes in return_msg */
  HX_CMD_START_PLUGIN = 1,          /* first call of all, once */
  HX_CMD_STOP_PLUGIN = 3,           /* last call of all, once; no instance is left */
  HX_CMD_DECLARE_PARAMS = 4,        /* UI, once */
  HX_CMD_CREATE_INSTANCE = 5,       /* UI */
  HX_CMD_RESTORE_INSTANCE = 6,      /* UI with a flattened handle; render with a null one */
  HX_CMD_FLATTEN_INSTANCE = 7,      /* UI; only 6 or 8 may follow on the new handle */
  HX_CMD_DESTROY_INSTANCE = 8,      /* the thread that owns the handle */
  HX_CMD_OPEN_OPTIONS = 9,          /* UI */
  HX_CMD_PREPARE_FRAME = 10,        /* render, before each 11 */
  HX_CMD_RENDER_FRAME = 11,         /* render; 8 or 16 bit */
  HX_CMD_PARAM_CHANGED = 13,        /* UI; extra HX_ParamChangedExtra */
  HX_CMD_REFRESH_PARAMS = 14,       /* UI */
  HX_CMD_DISPATCH_EVENT = 15,       /* UI; extra HX_EventExtra */
  HX_CMD_CUSTOM_DATA_OP = 22,       /* UI; extra HX_CustomDataExtra */
  HX_CMD_PLAN_FRAME = 23,           /* render, before each 24; extra HX_PlanExtra */
  HX_CMD_RENDER_PLANNED_FRAME = 24, /* render; 8, 16 or 32 bit; extra HX_RenderExtra */
  HX_CMD_IDLE_TICK = 27             /* UI, some 10 to 20 times a second */
};

enum { HX_RETURN_MSG_SIZE = 256 /* bytes, with the terminating zero */ };

/* HX_OutData.out_flags: show return_msg, whatever the result. All other bits are declarations to
 * the host. A render leaves what its frame's banner says in return_msg without this flag, whether
 * the banner is drawn or hidden. */
enum { HX_OUT_FLAG_SHOW_MESSAGE = 0x100 };

/* Named tables of operations; see hx_suites.h. Any thread. */
typedef struct HX_BasicSuite {
  HX_Err (*acquire)(const char* name, int32_t version, const void** table);
  HX_Err (*release)(const char* name, int32_t version);
} HX_BasicSuite;

/* HX_Callbacks.utility: begins a direct render, with HXp_G_fcd_table, and ends it, with null. */
enum { HX_UTILITY_BEGIN_RENDER = 3, HX_UTILITY_END_RENDER = 7 };

/* Keyed literals "$$$/Key=Text", UTF-8; empty ones keep a place. Static in the plug-in. */
typedef struct HX_StringTable {
  uint32_t count;  /* entries, with the end mark, which is null */
  uint32_t number; /* the table's resource number */
  const char* const* literals;
} HX_StringTable;

typedef struct HX_Callbacks {
  /* UI, render. A copy of a parameter at a time; index 0 gives the layer's frame, valid until the
     checkin that follows every checkout; its data is null, with success, where the media has no
     frame. An index that was not declared is an error. */
  HX_Err (*checkout_param)(HX_EffectRef effect, int32_t index, int32_t time, int32_t time_step,
                           uint32_t time_scale, HX_ParamDef* param);
  HX_Err (*checkin_param)(HX_EffectRef effect, HX_ParamDef* param);
  /* In HX_CMD_DECLARE_PARAMS; index -1 appends. */
  HX_Err (*add_param)(HX_EffectRef effect, int32_t index, const HX_ParamDef* param);

  /* Main thread. A token is never 0. */
  HX_Err (*open_strings)(HX_EffectRef effect, uint32_t number, const HX_StringTable* table,
                         uint64_t* token);
  /* Any thread. Localised UTF-8 text without its key, valid until the table is closed; "" for a
     kept place, null for a bad index or token. The last two arguments are 0. */
  const char* (*get_string)(uint64_t token, int32_t index, int32_t reserved1, int32_t reserved2);
  void (*close_strings)(uint64_t token);

  /* Any thread. New blocks are zeroed; null when there is no memory. A locked block stays where it
     is; locks nest; a lock may fail with null. Sizes in bytes. */
  HX_Handle (*new_handle)(uint64_t size);
  void* (*lock_handle)(HX_Handle handle);
  void (*unlock_handle)(HX_Handle handle);
  void (*dispose_handle)(HX_Handle handle);
  HX_Err (*resize_handle)(HX_Handle* handle,
                          uint64_t size); /* on an unlocked block; keeps the bytes */
  uint64_t (*handle_size)(HX_Handle handle);

  /* UI. printf's %d %s %f %%; the result is bounded to 512 bytes, the size of the callers' buffers.
   * Returns bytes. */
  int32_t (*format)(char* buffer, const char* text, ...);
  /* Any thread. At most size bytes with the terminating zero; cut between characters. */
  void (*copy_text)(char* to, uint32_t size, const char* from);

  /* Render. Null rectangles stand for whole worlds; scales when sizes differ, converts formats. */
  HX_Err (*copy_world)(HX_EffectRef effect, const HX_World* from, HX_World* to,
                       const HX_Rect* from_rect, const HX_Rect* to_rect);
  /* Render. Composes `from`, its top left at (x, y) of `to`, clipped to it; mask is null; result in
   * `to`'s format. */
  HX_Err (*transfer)(HX_EffectRef effect, const HX_World* from, const HX_TransferMode* mode,
                     const void* mask, int32_t x, int32_t y, HX_World* to);
  /* Render. */
  HX_Err (*utility)(HX_EffectRef effect, int32_t operation, const void* table);
  /* Render. Hue, lightness, saturation in 16.16 fixed point, each from 0 to 1. */
  HX_Err (*hls_to_rgb)(HX_EffectRef effect, const int32_t hls[3], HX_Pixel8* rgb);
} HX_Callbacks;

typedef struct HX_InData {
  const HX_BasicSuite* basic;
  const HX_Callbacks* cb;
  HX_EffectRef effect_ref;
  HX_Handle instance_handle; /* may be written by a command, as in HX_OutData */
  HX_Handle global_data;     /* may be written by a command, as in HX_OutData */
  int32_t width,
      height; /* source at full resolution, in every command; 1 by 1 when there is none */
  HX_Ratio pixel_aspect;
  int32_t current_time, time_step, total_time; /* in 1/time_scale s; 0 is the layer's first frame */
  uint32_t time_scale;
  HX_Ratio downsample_x, downsample_y;       /* of the render */
  int32_t output_origin_x, output_origin_y;  /* 0: read the output world's origin */
  int32_t field, quality, in_flags, version; /* 0 */
} HX_InData;

/* The host presets flags 0, an empty message and the handles of HX_InData, and takes the handles
 * back after every call. */
typedef struct HX_OutData {
  uint32_t version;
  uint32_t out_flags, out_flags2;
  char return_msg[HX_RETURN_MSG_SIZE]; /* UTF-8, ended by a zero */
  HX_Handle instance_handle;
  HX_Handle global_data;
  int32_t num_params;    /* HX_CMD_DECLARE_PARAMS: with index 0, the layer */
  int32_t width, height; /* HX_CMD_PREPARE_FRAME: size of the output at render scale */
  int32_t origin_x,
      origin_y; /* HX_CMD_PREPARE_FRAME: where layer (0, 0) lies in it; positive when it is grown */
} HX_OutData;

/* -- Extra records -- */

typedef struct HX_ParamChangedExtra {
  int32_t param_index;
} HX_ParamChangedExtra;

typedef struct HX_EventExtra {
  int32_t event_type;
  void* context;
  uint32_t in_flags, out_flags;
} HX_EventExtra;

/* HX_CustomDataExtra.op */
enum {
  HX_DATA_NEW = 0,         /* out: an empty value */
  HX_DATA_DISPOSE = 1,     /* a is freed */
  HX_DATA_COPY = 2,        /* out: a copy of a */
  HX_DATA_FLAT_SIZE = 3,   /* size: bytes of a */
  HX_DATA_FLATTEN = 4,     /* buffer: the bytes of a */
  HX_DATA_UNFLATTEN = 5,   /* out: from size bytes of buffer */
  HX_DATA_INTERPOLATE = 6, /* out: between a and b at t */
  HX_DATA_COMPARE = 7      /* compare: 0, -1 or 1 as a is equal to, before or behind b */
};

typedef struct HX_CustomDataExtra {
  int32_t op;
  int16_t param_id; /* the disk id */
  HX_Handle a, b, out;
  uint32_t size;
  void* buffer;
  double t;
  int32_t compare;
} HX_CustomDataExtra;

typedef struct HX_RenderRequest {
  HX_Rect rect;      /* layer coordinates at render scale */
  int32_t bit_depth; /* 8, 16 or 32 */
} HX_RenderRequest;

/* Both empty, with success, past the media's end. */
typedef struct HX_CheckoutResult {
  HX_Rect result_rect; /* what of the request there will be */
  HX_Rect full_rect;   /* all there is */
} HX_CheckoutResult;

typedef struct HX_PlanExtra {
  HX_RenderRequest request;
  HX_Rect result_rect; /* set by the effect */
  HX_Rect full_rect;   /* set by the effect */
  uint8_t solid;       /* set by the effect: 0 */
  uint8_t may_exceed;  /* set by the effect: 1 when result_rect may exceed the request */
  /* Orders a frame for the render under an id of the effect's choice; each pair of layer and id
   * once. */
  HX_Err (*checkout_layer)(HX_EffectRef effect, int32_t index, int32_t id,
                           const HX_RenderRequest* request, int32_t time, int32_t time_step,
                           uint32_t time_scale, HX_CheckoutResult* result);
} HX_PlanExtra;

typedef struct HX_RenderExtra {
  HX_RenderRequest request; /* that of the plan */
  /* The pixels of an ordered frame, until its checkin; an error where there are none. */
  HX_Err (*checkout_layer_pixels)(HX_EffectRef effect, int32_t id, HX_World** world);
  HX_Err (*checkin_layer_pixels)(HX_EffectRef effect, int32_t id);
  /* The output, until the call ends; covers result_rect, or its part inside the request unless it
   * may exceed it. */
  HX_Err (*checkout_output)(HX_EffectRef effect, HX_World** world);
} HX_RenderExtra;

/* The plug-in's one entry, found by its name in the property record. Re-entrant. `params` and
   `output` may be null where a command has none. */
typedef HX_Err (*HX_EffectMain)(uint32_t command, HX_InData* in, HX_OutData* out,
                                HX_ParamDef* params[], HX_World* output, void* extra);

HX_STATIC_ASSERT(sizeof(void*) != 8 || sizeof(HX_InData) == 112, "HX_InData");
HX_STATIC_ASSERT(sizeof(void*) != 8 || sizeof(HX_OutData) == 312, "HX_OutData");

#endif
