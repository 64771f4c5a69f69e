/* The least that a host must be to have a clip steadied: a caller in plain C, without a library of
 * its own.
 *
 *   minimal_host PLUGIN OUT.ppm
 *
 * loads the plug-in, finds its entry through the property record, declares its parameters, applies
 * it to a clip that is drawn here, ticks until the clip is analysed and solved, renders one frame,
 * and writes that frame beside the unsteady one. Everything is told at its place in
 * platform/hx; what a host that does more must mind stands in docs/embedding.md. */

#include <dlfcn.h>
#include <math.h>
#include <pthread.h>
#include <stdarg.h>
#include <stdatomic.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <time.h>

#include "platform/hx/hx.h"
#include "platform/tessel/shutdown.h"

enum {
  kWidth = 320,
  kHeight = 240,
  kFrames = 60,
  kRate = 30, /* frames a second; one tick of the layer's time is one frame */
  kMaxParams = 128,
  kStatusCounterId = 302, /* disk id of the parameter whose last two digits tell the status */
  kStatusNotAnalysed = 1, /* what an analysis that failed ends in; its message told why */
  kStatusReady = 8,
  kStatusSolveFailed = 10
};
static const int64_t kTicksPerFrame = HX_TICKS_PER_SECOND / kRate;

/* -- The clip: a textured wall, seen by an unsteady camera. -- */

static double Hash(int x, int y) {
  uint32_t h = (uint32_t)x * 374761393u + (uint32_t)y * 668265263u;
  h = (h ^ (h >> 13)) * 1274126177u;
  return (double)(h ^ (h >> 16)) / 4294967295.0;
}

static double Smooth(double x, double y) {
  const int ix = (int)floor(x), iy = (int)floor(y);
  const double fx = x - ix, fy = y - iy;
  return (Hash(ix, iy) * (1 - fx) + Hash(ix + 1, iy) * fx) * (1 - fy) +
         (Hash(ix, iy + 1) * (1 - fx) + Hash(ix + 1, iy + 1) * fx) * fy;
}

static void DrawFrame(int frame, HX_Pixel8* pixels) {
  const double sway_x = 3.0 * Hash(frame, 1) + 6.0 * sin(frame * 0.31);
  const double sway_y = 3.0 * Hash(frame, 2) + 4.0 * sin(frame * 0.47 + 1);
  for (int y = 0; y < kHeight; ++y) {
    for (int x = 0; x < kWidth; ++x) {
      const double u = 1000 + x + sway_x, v = 1000 + y + sway_y;
      const double tone = 0.5 * Smooth(u / 4, v / 4) + 0.5 * Smooth(u / 17, v / 17);
      HX_Pixel8* p = &pixels[y * kWidth + x];
      p->alpha = 255;
      p->red = (uint8_t)(40 + 180 * tone);
      p->green = (uint8_t)(30 + 200 * tone * tone);
      p->blue = (uint8_t)(60 + 120 * (1 - tone));
    }
  }
}

static HX_Pixel8* g_frames[kFrames]; /* guarded by g_lock until set, constant from then on */
static pthread_mutex_t g_lock = PTHREAD_MUTEX_INITIALIZER;

static HX_Pixel8* FramePixels(int frame) {
  pthread_mutex_lock(&g_lock);
  if (!g_frames[frame]) {
    g_frames[frame] = malloc(sizeof(HX_Pixel8) * kWidth * kHeight);
    if (g_frames[frame]) DrawFrame(frame, g_frames[frame]);
  }
  HX_Pixel8* pixels = g_frames[frame];
  pthread_mutex_unlock(&g_lock);
  return pixels;
}

/* -- Handles -- */

struct HX_HandleRecord {
  uint64_t size;
  void* bytes;
};

static atomic_int g_handles;

static HX_Handle NewHandle(uint64_t size) {
  HX_Handle handle = malloc(sizeof *handle);
  if (!handle) return NULL;
  handle->size = size;
  handle->bytes = calloc(1, size ? (size_t)size : 1);
  if (!handle->bytes) {
    free(handle);
    return NULL;
  }
  ++g_handles;
  return handle;
}

static void* LockHandle(HX_Handle handle) {
  return handle->bytes;
}
static void UnlockHandle(HX_Handle handle) {
  (void)handle;
}
static uint64_t HandleSize(HX_Handle handle) {
  return handle->size;
}

static void DisposeHandle(HX_Handle handle) {
  free(handle->bytes);
  free(handle);
  --g_handles;
}

static HX_Err ResizeHandle(HX_Handle* handle, uint64_t size) {
  void* bytes = realloc((*handle)->bytes, size ? (size_t)size : 1);
  if (!bytes) return HX_ERR_MEMORY;
  if (size > (*handle)->size) {
    memset((char*)bytes + (*handle)->size, 0, (size_t)(size - (*handle)->size));
  }
  (*handle)->bytes = bytes;
  (*handle)->size = size;
  return HX_ERR_NONE;
}

/* -- The effect on its layer, and its parameters -- */

struct HX_EffectRecord {
  HX_ParamDef params[kMaxParams];
  int param_count;
};

static struct HX_EffectRecord g_effect;
static const uint64_t kReference = 1; /* of the one effect on the timeline */
static const uint32_t kRuntimeId = 7;

static HX_Err AddParam(HX_EffectRef effect, int32_t index, const HX_ParamDef* param) {
  (void)index;
  if (effect->param_count == kMaxParams) return HX_ERR_MEMORY;
  HX_ParamDef* own = &effect->params[effect->param_count++];
  *own = *param;
  if (own->kind == HX_PARAM_FLOAT_SLIDER) own->u.fs.value = (double)own->u.fs.default_value;
  if (own->kind == HX_PARAM_POPUP) own->u.pd.value = own->u.pd.default_value;
  if (own->kind == HX_PARAM_CHECKBOX) own->u.bd.value = own->u.bd.default_value;
  return HX_ERR_NONE;
}

static void SetWorld(HX_World* world, void* pixels, int width, int height) {
  memset(world, 0, sizeof *world);
  world->data = pixels;
  world->row_bytes = width * (int32_t)sizeof(HX_Pixel8);
  world->width = width;
  world->height = height;
  world->format = HX_FORMAT_ARGB8;
  world->extent = (HX_Rect){0, 0, width, height};
}

static HX_Err CheckoutParam(HX_EffectRef effect, int32_t index, int32_t time, int32_t time_step,
                            uint32_t time_scale, HX_ParamDef* param) {
  (void)time_step;
  if (index < 0 || index >= effect->param_count) return HX_ERR_UNKNOWN;
  *param = effect->params[index];
  if (index > 0) return HX_ERR_NONE;
  const int64_t frame = (int64_t)time * kRate / (int64_t)time_scale;
  param->u.ld.data = NULL;
  if (frame < 0 || frame >= kFrames) return HX_ERR_NONE;
  HX_Pixel8* pixels = FramePixels((int)frame);
  if (!pixels) return HX_ERR_MEMORY;
  SetWorld(&param->u.ld, pixels, kWidth, kHeight);
  return HX_ERR_NONE;
}

static HX_Err CheckinParam(HX_EffectRef effect, HX_ParamDef* param) {
  (void)effect, (void)param;
  return HX_ERR_NONE;
}

static int Status(void) {
  for (int i = 1; i < g_effect.param_count; ++i) {
    const HX_ParamDef* param = &g_effect.params[i];
    if (param->disk_id == kStatusCounterId) return (int)((int64_t)param->u.fs.value % 100);
  }
  return 0;
}

/* -- Texts -- */

enum { kMaxStrings = 64 };
static char* g_strings[kMaxStrings];

/* "$$$/Key=Text{{*COMMENT*}}Note" to "Text"; #{cr} is a line break. */
static char* PlainText(const char* literal) {
  const char* begin = literal;
  if (strncmp(literal, "$$$/", 4) == 0 && strchr(literal, '=')) begin = strchr(literal, '=') + 1;
  const char* end = strstr(begin, "{{*COMMENT*}}");
  if (!end) end = begin + strlen(begin);
  char* text = malloc((size_t)(end - begin) + 1);
  if (!text) return NULL;
  char* to = text;
  for (const char* from = begin; from < end;) {
    if (strncmp(from, "#{cr}", 5) == 0) {
      *to++ = '\n';
      from += 5;
    } else {
      *to++ = *from++;
    }
  }
  *to = 0;
  return text;
}

static HX_Err OpenStrings(HX_EffectRef effect, uint32_t number, const HX_StringTable* table,
                          uint64_t* token) {
  (void)effect;
  for (uint32_t i = 0; i < table->count && i < kMaxStrings && table->literals[i]; ++i) {
    g_strings[i] = PlainText(table->literals[i]);
    if (!g_strings[i]) return HX_ERR_MEMORY;
  }
  *token = number;
  return HX_ERR_NONE;
}

static const char* GetString(uint64_t token, int32_t index, int32_t reserved1, int32_t reserved2) {
  (void)token, (void)reserved1, (void)reserved2;
  return index >= 0 && index < kMaxStrings ? g_strings[index] : NULL;
}

static void CloseStrings(uint64_t token) {
  (void)token;
  for (int i = 0; i < kMaxStrings; ++i) free(g_strings[i]), g_strings[i] = NULL;
}

static int32_t Format(char* buffer, const char* text, ...) {
  va_list arguments;
  va_start(arguments, text);
  const int length = vsnprintf(buffer, 512, text, arguments);
  va_end(arguments);
  return length < 512 ? length : 511;
}

/* Cut between characters: a byte 10xxxxxx goes on with the character before it. */
static void CopyText(char* to, uint32_t size, const char* from) {
  size_t length = strlen(from);
  if (length >= size) {
    length = size - 1;
    while (length > 0 && ((unsigned char)from[length] & 0xc0) == 0x80) --length;
  }
  memcpy(to, from, length);
  to[length] = 0;
}

struct HX_StringRecord {
  char utf8[512];
  uint16_t utf16[512]; /* this host's texts are ASCII */
};

static HX_Err MakeFromUTF8(const char* text, HX_String* string) {
  HX_String made = calloc(1, sizeof *made);
  if (!made) return HX_ERR_MEMORY;
  CopyText(made->utf8, sizeof made->utf8, text);
  for (size_t i = 0; made->utf8[i]; ++i) made->utf16[i] = (unsigned char)made->utf8[i];
  *string = made;
  return HX_ERR_NONE;
}

static HX_Err ConvertText(const uint16_t* from, char* to, uint32_t max) {
  char text[4 * 256 + 1];
  size_t length = 0;
  for (; *from && length < sizeof text - 4; ++from) {
    const uint32_t c = *from;
    if (c < 0x80) {
      text[length++] = (char)c;
    } else if (c < 0x800) {
      text[length++] = (char)(0xc0 | (c >> 6));
      text[length++] = (char)(0x80 | (c & 0x3f));
    } else { /* the effect's texts have no character beyond the first plane */
      text[length++] = (char)(0xe0 | (c >> 12));
      text[length++] = (char)(0x80 | ((c >> 6) & 0x3f));
      text[length++] = (char)(0x80 | (c & 0x3f));
    }
  }
  text[length] = 0;
  CopyText(to, max, text);
  return HX_ERR_NONE;
}

static HX_Err MakeFromUTF16(const uint16_t* text, HX_String* string) {
  char utf8[512];
  ConvertText(text, utf8, sizeof utf8);
  return MakeFromUTF8(utf8, string);
}
static HX_Err GetUTF8(HX_String string, const char** text) {
  *text = string->utf8;
  return HX_ERR_NONE;
}
static HX_Err GetUTF16(HX_String string, const uint16_t** text) {
  *text = string->utf16;
  return HX_ERR_NONE;
}
static HX_Err DisposeString(HX_String string) {
  free(string);
  return HX_ERR_NONE;
}
static HX_Err GetFileName(HX_String path, HX_String* name) {
  const char* slash = strrchr(path->utf8, '/');
  return MakeFromUTF8(slash ? slash + 1 : path->utf8, name);
}

/* -- Pixels: frames are drawn at full resolution in 8 bits, so a plain copy serves. -- */

static HX_Err CopyWorld(HX_EffectRef effect, const HX_World* from, HX_World* to,
                        const HX_Rect* from_rect, const HX_Rect* to_rect) {
  (void)effect;
  const HX_Rect a = from_rect ? *from_rect : (HX_Rect){0, 0, from->width, from->height};
  const HX_Rect b = to_rect ? *to_rect : (HX_Rect){0, 0, to->width, to->height};
  if (from->format != to->format || a.right - a.left != b.right - b.left ||
      a.bottom - a.top != b.bottom - b.top) {
    return HX_ERR_UNKNOWN; /* a host with other depths and resolutions converts and scales */
  }
  for (int y = 0; y < b.bottom - b.top; ++y) {
    memcpy((char*)to->data + (b.top + y) * to->row_bytes + b.left * 4,
           (const char*)from->data + (a.top + y) * from->row_bytes + a.left * 4,
           (size_t)(b.right - b.left) * 4);
  }
  return HX_ERR_NONE;
}

/* The banner, blue first, over the picture, alpha first. */
static HX_Err Transfer(HX_EffectRef effect, const HX_World* from, const HX_TransferMode* mode,
                       const void* mask, int32_t x, int32_t y, HX_World* to) {
  (void)effect, (void)mask;
  if (mode->mode != HX_TRANSFER_IN_FRONT || from->format != HX_FORMAT_BGRA8 ||
      to->format != HX_FORMAT_ARGB8) {
    return HX_ERR_UNKNOWN;
  }
  for (int j = y < 0 ? -y : 0; j < from->height && y + j < to->height; ++j) {
    for (int i = x < 0 ? -x : 0; i < from->width && x + i < to->width; ++i) {
      const uint8_t* s = (const uint8_t*)from->data + j * from->row_bytes + i * 4;
      HX_Pixel8* d = (HX_Pixel8*)((char*)to->data + (y + j) * to->row_bytes) + x + i;
      const int back = d->alpha * (255 - s[3]) / 255, alpha = s[3] + back;
      if (alpha == 0) continue;
      d->blue = (uint8_t)((s[0] * s[3] + d->blue * back) / alpha);
      d->green = (uint8_t)((s[1] * s[3] + d->green * back) / alpha);
      d->red = (uint8_t)((s[2] * s[3] + d->red * back) / alpha);
      d->alpha = (uint8_t)alpha;
    }
  }
  return HX_ERR_NONE;
}

static HX_Err Utility(HX_EffectRef effect, int32_t operation, const void* table) {
  (void)effect, (void)operation, (void)table;
  return HX_ERR_NONE;
}
static HX_Err HlsToRgb(HX_EffectRef effect, const int32_t hls[3], HX_Pixel8* rgb) {
  (void)effect, (void)hls, (void)rgb;
  return HX_ERR_UNKNOWN;
}

static HX_Err NewWorld(HX_EffectRef effect, int32_t width, int32_t height, uint8_t clear,
                       uint32_t format, HX_World* world) {
  (void)effect, (void)clear;
  void* pixels = calloc((size_t)width * (size_t)height, 4);
  if (!pixels) return HX_ERR_MEMORY;
  SetWorld(world, pixels, width, height);
  world->format = format;
  return HX_ERR_NONE;
}
static HX_Err DisposeWorld(HX_EffectRef effect, HX_World* world) {
  (void)effect;
  free(world->data);
  return HX_ERR_NONE;
}

static const HX_Callbacks kCallbacks = {
    .checkout_param = CheckoutParam,
    .checkin_param = CheckinParam,
    .add_param = AddParam,
    .open_strings = OpenStrings,
    .get_string = GetString,
    .close_strings = CloseStrings,
    .new_handle = NewHandle,
    .lock_handle = LockHandle,
    .unlock_handle = UnlockHandle,
    .dispose_handle = DisposeHandle,
    .resize_handle = ResizeHandle,
    .handle_size = HandleSize,
    .format = Format,
    .copy_text = CopyText,
    .copy_world = CopyWorld,
    .transfer = Transfer,
    .utility = Utility,
    .hls_to_rgb = HlsToRgb,
};

/* -- Suites about the effect -- */

static HX_Err UpdateParamUI(HX_EffectRef effect, int32_t index, const HX_ParamDef* param) {
  if (index < 0 || index >= effect->param_count) return HX_ERR_UNKNOWN;
  memcpy(effect->params[index].name, param->name, HX_PARAM_NAME_SIZE);
  effect->params[index].flags = param->flags;
  effect->params[index].ui_flags = param->ui_flags;
  return HX_ERR_NONE;
}
static HX_Err SetParamValue(HX_EffectRef effect, int32_t index, const HX_ParamDef* param) {
  if (index < 0 || index >= effect->param_count) return HX_ERR_UNKNOWN;
  effect->params[index].u = param->u;
  return HX_ERR_NONE;
}
static const HX_ParamUtilsSuite3 kParamUtils = {UpdateParamUI, SetParamValue};

static HX_Err GetEffectReference(HX_EffectRef effect, uint64_t* reference) {
  (void)effect;
  *reference = kReference;
  return HX_ERR_NONE;
}
static HX_Err GetRuntimeInstanceID(HX_EffectRef effect, uint32_t* id) {
  (void)effect;
  *id = kRuntimeId;
  return HX_ERR_NONE;
}
static HX_Err GetTicksPerFrame(HX_EffectRef effect, int64_t* ticks) {
  (void)effect;
  *ticks = kTicksPerFrame;
  return HX_ERR_NONE;
}
static HX_Err GetStartFrame(HX_EffectRef effect, int32_t* frame) {
  (void)effect;
  *frame = 0;
  return HX_ERR_NONE;
}
static HX_Err GetFrameCount(HX_EffectRef effect, int32_t* count) {
  (void)effect;
  *count = kFrames;
  return HX_ERR_NONE;
}
static HX_Err GetFieldType(HX_EffectRef effect, int32_t* field) {
  (void)effect;
  *field = HX_FIELD_PROGRESSIVE;
  return HX_ERR_NONE;
}
static HX_Err NoText(HX_EffectRef effect, uint16_t* text, uint32_t max) {
  (void)effect;
  if (max > 0) text[0] = 0;
  return HX_ERR_NONE;
}
static HX_Err GetSourceID(HX_EffectRef effect, HX_Guid* id) {
  (void)effect;
  memset(id, 0, sizeof *id);
  return HX_ERR_NONE;
}
static const HX_UtilitySuite kUtility = {GetEffectReference,
                                         GetRuntimeInstanceID,
                                         GetTicksPerFrame,
                                         GetStartFrame,
                                         GetFrameCount,
                                         GetFieldType,
                                         NoText,
                                         NoText,
                                         NoText,
                                         GetSourceID};

static HX_Err GetLayerData(HX_EffectRef effect, int32_t what, void* data) {
  (void)effect, (void)what, (void)data;
  return HX_ERR_UNKNOWN;
}
static HX_Err NothingOf(HX_EffectRef effect) {
  (void)effect;
  return HX_ERR_NONE;
}
/* From any thread, also for an effect that is no more. A host with windows draws them anew; here
 * the next tick is always near. */
static HX_Err ForceRerender(HX_EffectRef effect) {
  (void)effect;
  return HX_ERR_NONE;
}
static const HX_PrivateEffectSuite3 kPrivateEffect = {ConvertText, GetLayerData, NothingOf,
                                                      NothingOf, ForceRerender};

static HX_Err RefreshAllWindows(void) {
  return HX_ERR_NONE;
}
static HX_Err InfoText(const char* line1, const char* line2) {
  if (line1) printf("%s %s\n", line1, line2 ? line2 : "");
  return HX_ERR_NONE;
}
static const HX_AdvAppSuite1 kAdvApp = {RefreshAllWindows, InfoText};

static const HX_WorldSuite2 kWorlds = {NewWorld, DisposeWorld};
static const HX_StringSuite1 kStrings = {MakeFromUTF8, MakeFromUTF16, GetUTF8,
                                         GetUTF16,     DisposeString, GetFileName};

static HX_Err ReportJobEnd(HX_EffectRef effect, uint8_t success) {
  (void)effect, (void)success;
  return HX_ERR_NONE;
}
static HX_Err Yes(HX_EffectRef effect, uint8_t* answer) {
  (void)effect;
  *answer = 1;
  return HX_ERR_NONE;
}
static HX_Err GetCompressionPreference(uint8_t* raw) {
  *raw = 0;
  return HX_ERR_NONE;
}
static const HX_AnalysisHostSuite1 kAnalysisHost = {
    NothingOf, ReportJobEnd, Yes, Yes, GetCompressionPreference, NothingOf, NoText};

static HX_Err SetFramePolygon(HX_EffectRef effect, uint32_t count, const float* xy, int32_t frame) {
  (void)effect, (void)count, (void)xy, (void)frame;
  return HX_ERR_NONE;
}
static const HX_StabilizerHostSuite7 kStabilizerHost = {SetFramePolygon};

static void* g_block; /* the effect's opaque data, with its uses; both guarded by g_lock */
static int g_block_uses;

static HX_Err FindBlock(uint64_t reference, void** block) {
  (void)reference;
  pthread_mutex_lock(&g_lock);
  *block = g_block;
  if (g_block) ++g_block_uses;
  pthread_mutex_unlock(&g_lock);
  return HX_ERR_NONE;
}
static HX_Err SetBlock(uint64_t reference, void* block, void** winner) {
  (void)reference;
  pthread_mutex_lock(&g_lock);
  if (!g_block) g_block = block;
  ++g_block_uses;
  *winner = g_block;
  pthread_mutex_unlock(&g_lock);
  return HX_ERR_NONE;
}
static HX_Err ReleaseBlock(uint64_t reference, uint8_t* last) {
  (void)reference;
  pthread_mutex_lock(&g_lock);
  if (g_block_uses > 0) --g_block_uses;
  *last = g_block_uses == 0;
  if (*last) g_block = NULL;
  pthread_mutex_unlock(&g_lock);
  return HX_ERR_NONE;
}
static const HX_OpaqueEffectDataSuite1 kOpaqueData = {FindBlock, SetBlock, ReleaseBlock};

/* -- The node graph: the effect's node, over the media's. -- */

enum { kMediaNode = 1, kEffectNode = 2, kEffectOperator = 3, kSegments = 1 };

static HX_Err AcquireSegments(HX_EffectRef effect, HX_Segments* segments) {
  (void)effect;
  *segments = kSegments;
  return HX_ERR_NONE;
}
static HX_Err ReleaseSegments(HX_Segments segments) {
  (void)segments;
  return HX_ERR_NONE;
}
static const HX_SequenceInfoSuite kSequenceInfo = {AcquireSegments, ReleaseSegments,
                                                   GetTicksPerFrame};

static HX_Err GetSegmentNodeAt(HX_Segments segments, int64_t ticks, HX_Node* node) {
  (void)segments;
  if (ticks < 0 || ticks >= kFrames * kTicksPerFrame) return HX_ERR_UNKNOWN;
  *node = kEffectNode;
  return HX_ERR_NONE;
}
static HX_Err GetOperatorCount(HX_Node node, int32_t* count) {
  *count = node == kEffectNode;
  return HX_ERR_NONE;
}
static HX_Err GetOperator(HX_Node node, int32_t index, HX_Node* effect_operator) {
  if (node != kEffectNode || index != 0) return HX_ERR_UNKNOWN;
  *effect_operator = kEffectOperator;
  return HX_ERR_NONE;
}
static HX_Err GetInputCount(HX_Node node, int32_t* count) {
  *count = node == kEffectNode;
  return HX_ERR_NONE;
}
static HX_Err GetInput(HX_Node node, int32_t index, HX_Node* input) {
  if (node != kEffectNode || index != 0) return HX_ERR_UNKNOWN;
  *input = kMediaNode;
  return HX_ERR_NONE;
}
static HX_Err GetProperty(HX_Node node, const char* key, HX_String* text) {
  const struct {
    const char* key;
    int of_operator;
    int value;
  } properties[] = {{HX_PROPERTY_RUNTIME_INSTANCE_ID, 1, (int)kRuntimeId},
                    {HX_PROPERTY_STREAM_WIDTH, 0, kWidth},
                    {HX_PROPERTY_STREAM_HEIGHT, 0, kHeight},
                    {HX_PROPERTY_STREAM_PAR_NUM, 0, 1},
                    {HX_PROPERTY_STREAM_PAR_DEN, 0, 1}};
  for (size_t i = 0; i < sizeof properties / sizeof *properties; ++i) {
    if (strcmp(key, properties[i].key) != 0) continue;
    if (properties[i].of_operator != (node == kEffectOperator)) break;
    char number[16];
    snprintf(number, sizeof number, "%d", properties[i].value);
    return MakeFromUTF8(number, text);
  }
  return HX_ERR_UNKNOWN;
}
static HX_Err GetNodeGuid(HX_Node node, HX_Guid* guid) {
  memset(guid, 0, sizeof *guid);
  guid->bytes[0] = 0xca;
  guid->bytes[15] = (uint8_t)node;
  return HX_ERR_NONE;
}
static HX_Err GetOperatorText(HX_Node effect_operator, HX_String* text) {
  (void)effect_operator;
  return MakeFromUTF8("operator", text);
}
static HX_Err ReleaseNode(HX_Node node) {
  (void)node;
  return HX_ERR_NONE;
}
static const HX_VideoSegmentSuite5 kVideoSegment = {
    GetSegmentNodeAt, GetOperatorCount, GetOperator,     GetInputCount, GetInput,
    GetProperty,      GetNodeGuid,      GetOperatorText, ReleaseNode};

/* -- Frames for the analysis. A request is answered before it returns; frames are kept for good, so
 * references need no count. A frame's number is its index + 1. -- */

static HX_Err Nothing(void) {
  return HX_ERR_NONE;
}

static HX_Err RenderAsync(HX_Node node, int64_t time_ticks, int64_t rate_ticks,
                          const HX_RenderParams* params, HX_RenderCallback callback, void* record,
                          int32_t* request_id) {
  (void)node, (void)rate_ticks, (void)params;
  static atomic_int last_id;
  *request_id = ++last_id;
  const int64_t frame = time_ticks / kTicksPerFrame;
  const int there = frame >= 0 && frame < kFrames && FramePixels((int)frame);
  callback(there ? frame + 1 : 0, record);
  return HX_ERR_NONE;
}

/* A text in the form of a Guid names itself: the frame's number stands in its last bytes. */
static HX_Err MakeIdentifier(HX_Node node, int64_t time_ticks, int64_t ticks_per_frame,
                             int32_t width, int32_t height, int32_t par_num, int32_t par_den,
                             const HX_RenderParams* params, HX_String* text) {
  (void)width, (void)height, (void)par_num, (void)par_den, (void)params;
  char name[40];
  snprintf(name, sizeof name, "00000000-0000-0000-%04x-%012llx", (unsigned)node,
           (unsigned long long)(time_ticks / ticks_per_frame + 1));
  return MakeFromUTF8(name, text);
}
static HX_Err CancelRequest(int32_t request_id) {
  (void)request_id;
  return HX_ERR_NONE;
}
static const HX_VideoSegmentRenderSuite3 kVideoSegmentRender = {
    RenderAsync, MakeIdentifier, Nothing, Nothing, Nothing,
    Nothing,     Nothing,        Nothing, Nothing, CancelRequest};

static HX_Err LookUpFrame(const HX_Guid* identifier, HX_Frame* frame) {
  int64_t number = 0;
  for (int i = 10; i < 16; ++i) number = number * 256 + identifier->bytes[i];
  pthread_mutex_lock(&g_lock);
  *frame = number >= 1 && number <= kFrames && g_frames[number - 1] ? number : 0;
  pthread_mutex_unlock(&g_lock);
  return HX_ERR_NONE;
}
static HX_Err ReferenceFrame(const HX_Guid* identifier) {
  (void)identifier;
  return HX_ERR_NONE;
}
static const HX_CutPixCacheSuite5 kFrameCache = {
    Nothing, Nothing, Nothing, Nothing, Nothing, LookUpFrame, ReferenceFrame, ReferenceFrame};

static HX_Err GetPixels(HX_Frame frame, uint8_t** pixels) {
  *pixels = (uint8_t*)FramePixels((int)frame - 1);
  return HX_ERR_NONE;
}
static HX_Err GetRowBytes(HX_Frame frame, int32_t* row_bytes) {
  (void)frame;
  *row_bytes = kWidth * (int32_t)sizeof(HX_Pixel8);
  return HX_ERR_NONE;
}
static HX_Err GetPixelFormat(HX_Frame frame, uint32_t* format) {
  (void)frame;
  *format = HX_FORMAT_ARGB8 | HX_FORMAT_TOP_DOWN;
  return HX_ERR_NONE;
}
static HX_Err GetSize(HX_Frame frame, int32_t* width, int32_t* height) {
  (void)frame;
  *width = kWidth;
  *height = kHeight;
  return HX_ERR_NONE;
}
static HX_Err DisposeFrame(HX_Frame frame) {
  (void)frame;
  return HX_ERR_NONE;
}
static const HX_CutPixSuite1 kFramePixels = {GetPixels, GetRowBytes, GetPixelFormat, GetSize,
                                             DisposeFrame};

static HX_Err Acquire(const char* name, int32_t version, const void** table) {
  static const struct {
    const char* name;
    int32_t first_version, last_version;
    const void* table;
  } suites[] = {
      {HX_PARAM_UTILS_SUITE, 3, 3, &kParamUtils},
      {HX_UTILITY_SUITE, 3, 5, &kUtility},
      {HX_PRIVATE_EFFECT_SUITE, 3, 3, &kPrivateEffect},
      {HX_ADV_APP_SUITE, 1, 1, &kAdvApp},
      {HX_WORLD_SUITE, 2, 2, &kWorlds},
      {HX_STRING_SUITE, 1, 1, &kStrings},
      {HX_ANALYSIS_HOST_SUITE, 1, 1, &kAnalysisHost},
      {HX_STABILIZER_HOST_SUITE, 7, 7, &kStabilizerHost},
      {HX_OPAQUE_EFFECT_DATA_SUITE, 1, 1, &kOpaqueData},
      {HX_SEQUENCE_INFO_SUITE, 2, 3, &kSequenceInfo},
      {HX_VIDEO_SEGMENT_SUITE, 5, 5, &kVideoSegment},
      {HX_VIDEO_SEGMENT_RENDER_SUITE, 3, 3, &kVideoSegmentRender},
      {HX_CUTPIX_SUITE, 1, 1, &kFramePixels},
      {HX_CUTPIX_CACHE_SUITE, 5, 5, &kFrameCache},
  };
  for (size_t i = 0; i < sizeof suites / sizeof *suites; ++i) {
    if (strcmp(name, suites[i].name) == 0 && version >= suites[i].first_version &&
        version <= suites[i].last_version) {
      *table = suites[i].table;
      return HX_ERR_NONE;
    }
  }
  return HX_ERR_MISSING_SUITE;
}
static HX_Err Release(const char* name, int32_t version) {
  (void)name, (void)version;
  return HX_ERR_NONE;
}
static const HX_BasicSuite kBasic = {Acquire, Release};

/* -- Calls of the plug-in -- */

static HX_EffectMain g_entry;
static HX_Handle g_global_data;

/* One command for the instance whose handle `instance` is, which the command may replace. */
static HX_Err Command(uint32_t command, HX_Handle* instance, int frame, HX_World* output,
                      HX_OutData* out) {
  HX_InData in;
  memset(&in, 0, sizeof in);
  in.basic = &kBasic;
  in.cb = &kCallbacks;
  in.effect_ref = &g_effect;
  in.instance_handle = *instance;
  in.global_data = g_global_data;
  in.width = kWidth;
  in.height = kHeight;
  in.pixel_aspect = (HX_Ratio){1, 1};
  in.current_time = frame;
  in.time_step = 1;
  in.total_time = kFrames;
  in.time_scale = kRate;
  in.downsample_x = in.downsample_y = (HX_Ratio){1, 1};
  memset(out, 0, sizeof *out);
  out->instance_handle = in.instance_handle;
  out->global_data = in.global_data;

  HX_ParamDef* params[kMaxParams];
  for (int i = 0; i < g_effect.param_count; ++i) params[i] = &g_effect.params[i];
  HX_ParamDef layer;
  if (output) { /* a render gets the layer's frame as parameter 0 */
    const HX_Err code = CheckoutParam(&g_effect, 0, frame, 1, kRate, &layer);
    if (code != HX_ERR_NONE) return code;
    params[0] = &layer;
  }
  const HX_Err code = g_entry(command, &in, out, params, output, NULL);
  *instance = out->instance_handle;
  g_global_data = out->global_data;
  if (out->out_flags & HX_OUT_FLAG_SHOW_MESSAGE) printf("plug-in: %s\n", out->return_msg);
  if (code != HX_ERR_NONE) printf("command %u: code %d\n", command, code);
  return code;
}

static uint32_t Word(const uint8_t bytes[4]) {
  return bytes[0] | (uint32_t)bytes[1] << 8 | (uint32_t)bytes[2] << 16 | (uint32_t)bytes[3] << 24;
}

/* Name of the plug-in's entry; null when the record is none of a known form. */
static const char* EntryName(const uint8_t* record) {
  const HX_PropertyListHeader* header = (const HX_PropertyListHeader*)record;
  if (header->version[0] != HX_PROPERTY_VERSION) return NULL;
  const uint8_t* place = record + sizeof *header;
  for (uint32_t i = Word(header->count); i > 0; --i) {
    const HX_PropertyHeader* property = (const HX_PropertyHeader*)place;
    if (memcmp(property->vendor, HX_PROPERTY_VENDOR, 4) != 0) return NULL;
    const uint8_t* value = place + sizeof *property;
    if (memcmp(property->key, HX_KEY_ENTRY_64, 4) == 0) return (const char*)value;
    place = value + (Word(property->length) + 3) / 4 * 4;
  }
  return NULL;
}

static int WritePicture(const char* path, const HX_World* shaky, const HX_World* steady) {
  FILE* file = fopen(path, "wb");
  if (!file) return 0;
  fprintf(file, "P6 %d %d 255\n", 2 * kWidth, kHeight);
  for (int y = 0; y < kHeight; ++y) {
    for (int side = 0; side < 2; ++side) {
      const HX_World* world = side ? steady : shaky;
      const HX_Pixel8* row = (const HX_Pixel8*)((const char*)world->data + y * world->row_bytes);
      for (int x = 0; x < kWidth; ++x) fwrite(&row[x].red, 1, 3, file);
    }
  }
  return fclose(file) == 0;
}

static int Tour(const char* picture_path) {
  HX_OutData out;
  HX_Handle none = NULL, instance = NULL, render = NULL;
  if (Command(HX_CMD_START_PLUGIN, &none, 0, NULL, &out) != HX_ERR_NONE) return 1;
  g_effect.param_count = 1; /* index 0 is the layer */
  if (Command(HX_CMD_DECLARE_PARAMS, &none, 0, NULL, &out) != HX_ERR_NONE) return 1;
  printf("%d parameters\n", out.num_params);
  if (Command(HX_CMD_CREATE_INSTANCE, &instance, 0, NULL, &out) != HX_ERR_NONE) return 1;
  /* What a render works on: an instance of its own, which takes over what the first one solved. */
  if (Command(HX_CMD_RESTORE_INSTANCE, &render, 0, NULL, &out) != HX_ERR_NONE) return 1;

  const struct timespec pause = {0, 20 * 1000 * 1000};
  int status = 0;
  while (status != kStatusReady) {
    if (Command(HX_CMD_IDLE_TICK, &instance, 0, NULL, &out) != HX_ERR_NONE) return 1;
    if (status != Status()) printf("status %d\n", status = Status());
    if (status == kStatusNotAnalysed || status == kStatusSolveFailed) return 1;
    nanosleep(&pause, NULL);
  }

  const int frame = kFrames / 2;
  HX_World output;
  if (Command(HX_CMD_PREPARE_FRAME, &render, frame, NULL, &out) != HX_ERR_NONE) return 1;
  if (out.width != kWidth || out.height != kHeight) return 1;
  if (NewWorld(&g_effect, out.width, out.height, 1, HX_FORMAT_ARGB8, &output) != HX_ERR_NONE) {
    return 1;
  }
  const HX_Err code = Command(HX_CMD_RENDER_FRAME, &render, frame, &output, &out);
  HX_World source;
  SetWorld(&source, FramePixels(frame), kWidth, kHeight);
  const int written = code == HX_ERR_NONE && WritePicture(picture_path, &source, &output);
  DisposeWorld(&g_effect, &output);

  /* The first instance goes before the last render side, whose use keeps the shared data. */
  Command(HX_CMD_DESTROY_INSTANCE, &instance, 0, NULL, &out);
  Command(HX_CMD_DESTROY_INSTANCE, &render, 0, NULL, &out);
  Command(HX_CMD_STOP_PLUGIN, &none, 0, NULL, &out);
  return written ? 0 : 1;
}

int main(int argc, char** argv) {
  if (argc != 3) {
    fprintf(stderr, "usage: minimal_host PLUGIN OUT.ppm\n");
    return 2;
  }
  void* library = dlopen(argv[1], RTLD_NOW | RTLD_LOCAL);
  if (!library) {
    fprintf(stderr, "%s\n", dlerror());
    return 1;
  }
  const uint8_t* record = dlsym(library, HX_PROPERTY_SYMBOL);
  const char* name = record ? EntryName(record) : NULL;
  void* entry = name ? dlsym(library, name) : NULL;
  if (!entry) {
    fprintf(stderr, "%s is no plug-in of this interface\n", argv[1]);
    return 1;
  }
  memcpy(&g_entry, &entry, sizeof entry); /* C has no cast from data to code */

  int result = Tour(argv[2]);
  tessel_shutdown(); /* no thread may run the plug-in's code when it goes */
  dlclose(library);
  if (g_handles != 0 || g_block_uses != 0) {
    fprintf(stderr, "left behind: %d handles, %d uses of opaque data\n", g_handles, g_block_uses);
    result = 1;
  }
  for (int i = 0; i < kFrames; ++i) free(g_frames[i]);
  if (result != 0) fprintf(stderr, "failed\n");
  return result;
}
