#ifndef TESTS_PLATFORM_HX_LAYOUT_H_
#define TESTS_PLATFORM_HX_LAYOUT_H_

#include "platform/hx/hx.h"

/* One list of sizes and offsets, compiled by both languages. */
#define HX_LAYOUT(SIZE, OFFSET)                           \
  SIZE(HX_World)                                          \
  SIZE(HX_ParamDef)                                       \
  SIZE(HX_InData)                                         \
  SIZE(HX_OutData)                                        \
  SIZE(HX_Callbacks)                                      \
  SIZE(HX_PlanExtra)                                      \
  SIZE(HX_RenderExtra)                                    \
  SIZE(HX_CustomDataExtra)                                \
  SIZE(HX_RenderParams)                                   \
  SIZE(HX_UtilitySuite)                                   \
  SIZE(HX_VideoSegmentSuite5)                             \
  OFFSET(HX_ParamDef, u)                                  \
  OFFSET(HX_FloatSlider, display)                         \
  OFFSET(HX_OutData, instance_handle)                     \
  OFFSET(HX_PlanExtra, checkout_layer)                    \
  OFFSET(HX_CustomDataExtra, compare)                     \
  OFFSET(HX_PrivateEffectSuite3, ForceRerender)           \
  OFFSET(HX_AnalysisHostSuite1, MayStart)                 \
  OFFSET(HX_AnalysisHostSuite1, GetCompressionPreference) \
  OFFSET(HX_AnalysisHostSuite1, ScheduleAnalysis)         \
  OFFSET(HX_AnalysisHostSuite1, GetRefusal)               \
  OFFSET(HX_OpaqueEffectDataSuite1, Find)                 \
  OFFSET(HX_OpaqueEffectDataSuite1, Set)                  \
  OFFSET(HX_OpaqueEffectDataSuite1, Release)              \
  OFFSET(HX_VideoSegmentRenderSuite3, RenderAsync)        \
  OFFSET(HX_VideoSegmentRenderSuite3, MakeIdentifier)     \
  OFFSET(HX_VideoSegmentRenderSuite3, Cancel)             \
  OFFSET(HX_CutPixCacheSuite5, Lookup)                    \
  OFFSET(HX_CutPixCacheSuite5, Reference)                 \
  OFFSET(HX_CutPixCacheSuite5, Dereference)

#define HX_LAYOUT_SIZE(type) {"sizeof " #type, sizeof(type)},
#define HX_LAYOUT_OFFSET(type, field) {#type "." #field, offsetof(type, field)},

typedef struct HX_LayoutEntry {
  const char* name;
  size_t value;
} HX_LayoutEntry;

#ifdef __cplusplus
extern "C"
#endif
    const HX_LayoutEntry*
    hx_layout_in_c(size_t* count);

#endif
