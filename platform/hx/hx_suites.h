#ifndef PLATFORM_HX_HX_SUITES_H_
#define PLATFORM_HX_HX_SUITES_H_

#include "platform/hx/hx_effect.h"

/* The host's named tables of operations. Names and versions as asked of HX_BasicSuite.acquire;
   positions marked "op N" (from 1) are part of the interface, and nothing may move them. Tables are
   the host's and stay valid between acquire and release. Unless a line says otherwise an operation
   may be called on any thread, texts come as HX_String handles or in the caller's buffer of `max`
   UTF-16 units with the terminating zero, and results are written only on success. */

#define HX_PARAM_UTILS_SUITE "HX Param Utils Suite"
#define HX_PARAM_UTILS_SUITE_VERSION 3
/* UI thread. Neither operation calls the effect back. */
typedef struct HX_ParamUtilsSuite3 {
  /* Takes over name, flags and ui_flags. */
  HX_Err (*UpdateParamUI)(HX_EffectRef effect, int32_t index, const HX_ParamDef* param);
  /* Takes over the value and the change flag; cached output of the effect goes stale. The handle of
     an arbitrary value is the host's from then on, which disposes of the one before later. */
  HX_Err (*SetParamValue)(HX_EffectRef effect, int32_t index, const HX_ParamDef* param);
} HX_ParamUtilsSuite3;

#define HX_UTILITY_SUITE "HX Utility Suite"
#define HX_UTILITY_SUITE_VERSION_3 3
#define HX_UTILITY_SUITE_VERSION_4 4
#define HX_UTILITY_SUITE_VERSION_5 5
/* One table for all three versions. */
typedef struct HX_UtilitySuite {
  /* Identity of the effect on the timeline, equal for all its instance handles. */
  HX_Err (*GetEffectReference)(HX_EffectRef effect, uint64_t* reference);
  /* Never 0; stands in the node graph too, see HX_PROPERTY_RUNTIME_INSTANCE_ID. */
  HX_Err (*GetRuntimeInstanceID)(HX_EffectRef effect, uint32_t* id);
  HX_Err (*GetTicksPerFrame)(HX_EffectRef effect, int64_t* ticks);
  HX_Err (*GetStartFrame)(HX_EffectRef effect,
                          int32_t* frame); /* layer's in-point in source frames; may be negative */
  HX_Err (*GetFrameCount)(HX_EffectRef effect, int32_t* count); /* layer's length in frames */
  HX_Err (*GetFieldType)(HX_EffectRef effect, int32_t* field);  /* HX_FIELD_* */
  HX_Err (*GetLayerName)(HX_EffectRef effect, uint16_t* text, uint32_t max);
  HX_Err (*GetLayerFileName)(HX_EffectRef effect, uint16_t* text, uint32_t max);
  HX_Err (*GetProjectPath)(HX_EffectRef effect, uint16_t* text, uint32_t max); /* may be empty */
  HX_Err (*GetSourceID)(HX_EffectRef effect, HX_Guid* id);                     /* may be nil */
} HX_UtilitySuite;

#define HX_PRIVATE_EFFECT_SUITE "HX OV Private Effect Suite"
#define HX_PRIVATE_EFFECT_SUITE_VERSION 3
typedef struct HX_PrivateEffectSuite3 {
  /* UTF-16, zero-terminated, to the host's text (UTF-8); at most max bytes with the terminating
     zero, cut between characters. */
  HX_Err (*ConvertText)(const uint16_t* from, char* to, uint32_t max);
  HX_Err (*GetLayerData)(HX_EffectRef effect, int32_t what, void* data);
  HX_Err (*reserved3)(HX_EffectRef effect);
  HX_Err (*reserved4)(HX_EffectRef effect);
  /* op 5. Asks for a re-render, later, and for the next idle tick; calls nothing. Cheap, coalesced;
     an effect that is no more is ignored. */
  HX_Err (*ForceRerender)(HX_EffectRef effect);
} HX_PrivateEffectSuite3;

#define HX_APP_SUITE "HX OV App Suite"
#define HX_APP_SUITE_VERSION 6
typedef struct HX_AppSuite6 {
  HX_Err (*InvalidateRect)(void* context, const HX_Rect* rect);
} HX_AppSuite6;

#define HX_ADV_APP_SUITE "HX OV Adv App Suite"
#define HX_ADV_APP_SUITE_VERSION 1
/* UI thread. */
typedef struct HX_AdvAppSuite1 {
  HX_Err (*RefreshAllWindows)(void);
  /* UTF-8; two nulls clear the panel. */
  HX_Err (*InfoText)(const char* line1, const char* line2);
} HX_AdvAppSuite1;

#define HX_WORLD_SUITE "HX World Suite"
#define HX_WORLD_SUITE_VERSION 2
typedef struct HX_WorldSuite2 {
  /* The caller owns the world until DisposeWorld; fails with HX_ERR_MEMORY. */
  HX_Err (*NewWorld)(HX_EffectRef effect, int32_t width, int32_t height, uint8_t clear,
                     uint32_t format, HX_World* world);
  HX_Err (*DisposeWorld)(HX_EffectRef effect, HX_World* world);
} HX_WorldSuite2;

#define HX_STRING_SUITE "Rushbase StringSuite"
#define HX_STRING_SUITE_VERSION 1
/* Strings never change; whoever got one disposes of it. Pointers into one live as long as it. */
typedef struct HX_StringSuite1 {
  HX_Err (*MakeFromUTF8)(const char* text, HX_String* string);
  HX_Err (*MakeFromUTF16)(const uint16_t* text, HX_String* string);
  HX_Err (*GetUTF8)(HX_String string, const char** text);
  HX_Err (*GetUTF16)(HX_String string, const uint16_t** text);
  HX_Err (*Dispose)(HX_String string);
  HX_Err (*GetFileName)(HX_String path, HX_String* name); /* behind the path's last separator */
} HX_StringSuite1;

#define HX_ANALYSIS_HOST_SUITE "Analysis Host Suite"
#define HX_ANALYSIS_HOST_SUITE_VERSION 1
/* What saved results are wanted for, and how they came. A plug-in may deflate them all the same. */
enum {
  HX_PAYLOAD_DEFLATED = 0, /* for a project */
  HX_PAYLOAD_RAW = 1,
  HX_PAYLOAD_PACKED = 2 /* for this process alone, in little memory */
};
typedef struct HX_AnalysisHostSuite1 {
  HX_Err (*CancelJob)(HX_EffectRef effect);                       /* op 1 */
  HX_Err (*ReportJobEnd)(HX_EffectRef effect, uint8_t success);   /* op 2 */
  HX_Err (*IsScheduled)(HX_EffectRef effect, uint8_t* scheduled); /* op 3 */
  HX_Err (*MayStart)(HX_EffectRef effect, uint8_t* may);          /* op 4; UI */
  HX_Err (*GetCompressionPreference)(uint8_t* raw);               /* op 5; UI; HX_PAYLOAD_* */
  HX_Err (*ScheduleAnalysis)(HX_EffectRef effect);                /* op 6; UI */
  /* op 7. Why the layer can't be analysed; empty when it can. */
  HX_Err (*GetRefusal)(HX_EffectRef effect, uint16_t* text, uint32_t max);
} HX_AnalysisHostSuite1;

#define HX_ANALYSIS_SPAN_SUITE "Analysis Span Suite"
#define HX_ANALYSIS_SPAN_SUITE_VERSION 1
/* Offered by hosts that learn of a clip's shots while it is analysed. */
typedef struct HX_AnalysisSpanSuite1 {
  /* UI. Source frame before which an analysis that runs ends, as if the layer did; what it has of
     later frames is dropped. Never grows while it runs. A layer that is shown to its end: any frame
     behind that. */
  HX_Err (*GetEnd)(HX_EffectRef effect, int32_t* frame);
} HX_AnalysisSpanSuite1;

#define HX_ANALYSIS_KEEPING_SUITE "Analysis Keeping Suite"
#define HX_ANALYSIS_KEEPING_SUITE_VERSION 1
/* Offered by hosts that keep an analysis while it is under way, so that what a process leaves
   unfinished another one goes on with. Pieces are the effect's own, one behind the other; a host
   keeps whole ones. */
typedef struct HX_AnalysisKeepingSuite1 {
  /* UI; in every tick of an analysis that runs. 1: the host will have a piece; it comes some ticks
     later. */
  HX_Err (*IsWanted)(HX_EffectRef effect, uint8_t* wanted);
  /* UI. Piece `number`, from 0. Of those that are kept any from that number on go. */
  HX_Err (*Keep)(HX_EffectRef effect, uint32_t number, const void* bytes, uint64_t size);
  /* UI; as an analysis begins. Piece `number` of what was kept on the effect's layer, good until
     the effect's call ends; null behind the last. The effect passes over what is of something else,
     or damaged. */
  HX_Err (*Find)(HX_EffectRef effect, uint32_t number, const void** bytes, uint64_t* size);
} HX_AnalysisKeepingSuite1;

#define HX_STABILIZER_HOST_SUITE "Stabilizer Host Suite"
#define HX_STABILIZER_HOST_SUITE_VERSION 7
typedef struct HX_StabilizerHostSuite7 {
  /* Outline of a frame: `count` vertices, x and y each, in pixels of the render. */
  HX_Err (*SetFramePolygon)(HX_EffectRef effect, uint32_t count, const float* xy, int32_t frame);
} HX_StabilizerHostSuite7;

#define HX_OPAQUE_EFFECT_DATA_SUITE "Opaque Effect Data Suite"
#define HX_OPAQUE_EFFECT_DATA_SUITE_VERSION 1
/* One pointer for each reference that HX_UtilitySuite.GetEffectReference gives, with a count of its
   uses. Each operation is atomic for its reference. */
typedef struct HX_OpaqueEffectDataSuite1 {
  HX_Err (*Find)(uint64_t reference,
                 void** block); /* op 1; null when there is none, else counts a use */
  HX_Err (*Set)(uint64_t reference, void* block,
                void** winner); /* op 2; stored if none is; counts a use */
  HX_Err (*Release)(uint64_t reference,
                    uint8_t* last); /* op 3; drops a use; the last one forgets the pointer */
} HX_OpaqueEffectDataSuite1;

/* -- The node graph. Ids are never 0; each that an operation gives is a reference, which its
 * receiver releases. -- */

typedef int32_t HX_Segments;
typedef int32_t HX_Node; /* a media or effect node, or an effect operator on one */

#define HX_SEQUENCE_INFO_SUITE "Rushbase Sequence Info Suite"
#define HX_SEQUENCE_INFO_SUITE_VERSION_2 2
#define HX_SEQUENCE_INFO_SUITE_VERSION_3 3
/* One table for both versions. */
typedef struct HX_SequenceInfoSuite {
  HX_Err (*AcquireSegments)(HX_EffectRef effect, HX_Segments* segments);
  HX_Err (*ReleaseSegments)(HX_Segments segments);
  HX_Err (*GetTicksPerFrame)(HX_EffectRef effect, int64_t* ticks); /* the sequence's time base */
} HX_SequenceInfoSuite;

#define HX_PROPERTY_RUNTIME_INSTANCE_ID "EffectNode::RuntimeInstanceID"
#define HX_PROPERTY_STREAM_WIDTH "MediaNode::StreamFrameWidth"
#define HX_PROPERTY_STREAM_HEIGHT "MediaNode::StreamFrameHeight"
#define HX_PROPERTY_STREAM_PAR_NUM "MediaNode::StreamPixelAspectRatioNum"
#define HX_PROPERTY_STREAM_PAR_DEN "MediaNode::StreamPixelAspectRatioDen"

#define HX_VIDEO_SEGMENT_SUITE "Rushbase Video Segment Suite"
#define HX_VIDEO_SEGMENT_SUITE_VERSION 5
typedef struct HX_VideoSegmentSuite5 {
  /* The node of the segment that stands at the time; an error when none does. */
  HX_Err (*GetSegmentNodeAt)(HX_Segments segments, int64_t ticks, HX_Node* node);
  HX_Err (*GetOperatorCount)(HX_Node node, int32_t* count);
  HX_Err (*GetOperator)(HX_Node node, int32_t index, HX_Node* effect_operator); /* 0 acts first */
  HX_Err (*GetInputCount)(HX_Node node, int32_t* count);
  HX_Err (*GetInput)(HX_Node node, int32_t index, HX_Node* input);
  /* Decimal text of a node's or operator's property; an error when it has none of that key. */
  HX_Err (*GetProperty)(HX_Node node, const char* key, HX_String* text);
  /* Identity of what the node delivers; equal in every process. */
  HX_Err (*GetNodeGuid)(HX_Node node, HX_Guid* guid);
  /* Identity of what the operator does, as a text; equal in every process. */
  HX_Err (*GetOperatorText)(HX_Node effect_operator, HX_String* text);
  HX_Err (*ReleaseNode)(HX_Node node);
} HX_VideoSegmentSuite5;

/* A reference to a frame in the cache; 0 is none. */
typedef int64_t HX_Frame;

typedef struct HX_RenderParams {
  const uint32_t* formats; /* HX_FORMAT_*, in order of preference */
  int32_t format_count;
  int32_t width, height;
  int32_t par_num, par_den;
  int32_t quality;
  int32_t field_type;      /* HX_FIELD_* */
  int32_t field_selection; /* 1: the one field of the time, at the frame's full height */
  int32_t final_value;     /* 3 */
} HX_RenderParams;

/* Called exactly once for every accepted request, cancelled or not, on a render thread of the host
   that holds no lock, and maybe before RenderAsync returns. The frame, or 0, is the callee's to
   dispose of; it is in the cache already. */
typedef void (*HX_RenderCallback)(HX_Frame frame, void* record);

typedef HX_Err (*HX_Reserved)(void); /* a place that is kept and never called */

#define HX_VIDEO_SEGMENT_RENDER_SUITE "Rushbase Video Segment Render Suite"
#define HX_VIDEO_SEGMENT_RENDER_SUITE_VERSION 3
typedef struct HX_VideoSegmentRenderSuite3 {
  /* op 1. Ids start at 1 and are never used again. */
  HX_Err (*RenderAsync)(HX_Node node, int64_t time_ticks, int64_t rate_ticks,
                        const HX_RenderParams* params, HX_RenderCallback callback, void* record,
                        int32_t* request_id);
  /* op 2. The text names the frame: equal inputs give equal texts, and nothing is rendered. */
  HX_Err (*MakeIdentifier)(HX_Node node, int64_t time_ticks, int64_t ticks_per_frame, int32_t width,
                           int32_t height, int32_t par_num, int32_t par_den,
                           const HX_RenderParams* params, HX_String* text);
  HX_Reserved reserved3, reserved4, reserved5, reserved6, reserved7, reserved8, reserved9;
  /* op 10. Unknown ids are ignored. */
  HX_Err (*Cancel)(int32_t request_id);
} HX_VideoSegmentRenderSuite3;

#define HX_CUTPIX_SUITE "Cutline CutPix Suite"
#define HX_CUTPIX_SUITE_VERSION 1
typedef struct HX_CutPixSuite1 {
  /* First row in memory; valid while the frame's identifier is referenced in the cache. */
  HX_Err (*GetPixels)(HX_Frame frame, uint8_t** pixels);
  HX_Err (*GetRowBytes)(HX_Frame frame, int32_t* row_bytes);
  HX_Err (*GetPixelFormat)(HX_Frame frame,
                           uint32_t* format); /* HX_FORMAT_*, maybe HX_FORMAT_TOP_DOWN */
  HX_Err (*GetSize)(HX_Frame frame, int32_t* width, int32_t* height);
  HX_Err (*Dispose)(HX_Frame frame);
} HX_CutPixSuite1;

#define HX_CUTPIX_CACHE_SUITE "Cutline CutPix Cache Suite"
#define HX_CUTPIX_CACHE_SUITE_VERSION 5
/* A frame whose identifier is referenced is neither moved nor dropped; any other may go at any
 * time. */
typedef struct HX_CutPixCacheSuite5 {
  HX_Reserved reserved1, reserved2, reserved3, reserved4, reserved5;
  HX_Err (*Lookup)(const HX_Guid* identifier,
                   HX_Frame* frame); /* op 6; 0 when absent; the caller disposes of it */
  HX_Err (*Reference)(const HX_Guid* identifier);   /* op 7; also before the frame exists */
  HX_Err (*Dereference)(const HX_Guid* identifier); /* op 8; not below 0 */
} HX_CutPixCacheSuite5;

#define HX_BLUR_SUITE "FLT Blur Suite"
#define HX_BLUR_SUITE_VERSION 1
typedef struct HX_BlurSuite1 {
  /* Gaussian of sigma radius / 2 on all channels, edges repeated; both worlds at origin 0, of one
     size and format. passes 1, mode 110, reserved 0, flag 1. */
  HX_Err (*Blur)(HX_EffectRef effect, const HX_World* from, HX_World* to, float radius,
                 int32_t passes, int32_t mode, int32_t reserved, int32_t flag);
} HX_BlurSuite1;

#endif
