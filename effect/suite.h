#pragma once

#include <cstdint>

#include "effect/host_context.h"
#include "platform/hx/hx_suites.h"

namespace kelp::effect {

struct SuiteId {
  const char* name;
  std::int32_t version;  // 0 where the interface has several
};

// Which suite a table is of.
template <typename Table>
inline constexpr SuiteId kSuite = Table::must_be_a_suite;
template <>
inline constexpr SuiteId kSuite<HX_ParamUtilsSuite3>{HX_PARAM_UTILS_SUITE,
                                                     HX_PARAM_UTILS_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_UtilitySuite>{HX_UTILITY_SUITE, 0};
template <>
inline constexpr SuiteId kSuite<HX_PrivateEffectSuite3>{HX_PRIVATE_EFFECT_SUITE,
                                                        HX_PRIVATE_EFFECT_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_AppSuite6>{HX_APP_SUITE, HX_APP_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_AdvAppSuite1>{HX_ADV_APP_SUITE, HX_ADV_APP_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_WorldSuite2>{HX_WORLD_SUITE, HX_WORLD_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_StringSuite1>{HX_STRING_SUITE, HX_STRING_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_AnalysisHostSuite1>{HX_ANALYSIS_HOST_SUITE,
                                                       HX_ANALYSIS_HOST_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_AnalysisSpanSuite1>{HX_ANALYSIS_SPAN_SUITE,
                                                       HX_ANALYSIS_SPAN_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_AnalysisKeepingSuite1>{HX_ANALYSIS_KEEPING_SUITE,
                                                          HX_ANALYSIS_KEEPING_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_StabilizerHostSuite7>{HX_STABILIZER_HOST_SUITE,
                                                         HX_STABILIZER_HOST_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_OpaqueEffectDataSuite1>{HX_OPAQUE_EFFECT_DATA_SUITE,
                                                           HX_OPAQUE_EFFECT_DATA_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_SequenceInfoSuite>{HX_SEQUENCE_INFO_SUITE, 0};
template <>
inline constexpr SuiteId kSuite<HX_VideoSegmentSuite5>{HX_VIDEO_SEGMENT_SUITE,
                                                       HX_VIDEO_SEGMENT_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_VideoSegmentRenderSuite3>{HX_VIDEO_SEGMENT_RENDER_SUITE,
                                                             HX_VIDEO_SEGMENT_RENDER_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_CutPixSuite1>{HX_CUTPIX_SUITE, HX_CUTPIX_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_CutPixCacheSuite5>{HX_CUTPIX_CACHE_SUITE,
                                                      HX_CUTPIX_CACHE_SUITE_VERSION};
template <>
inline constexpr SuiteId kSuite<HX_BlurSuite1>{HX_BLUR_SUITE, HX_BLUR_SUITE_VERSION};

inline constexpr char kMissingSuiteMessage[] = "Not able to acquire OVK Suite.";

// Acquires a suite for its scope. Where the host refuses: the message goes to the user, and
// HX_ERR_MISSING_SUITE is thrown.
class SuiteReference {
 public:
  SuiteReference(const HostContext& context, SuiteId id, const char* message);
  ~SuiteReference() { basic_->release(id_.name, id_.version); }
  SuiteReference(const SuiteReference&) = delete;
  SuiteReference& operator=(const SuiteReference&) = delete;

 protected:
  const void* table_ = nullptr;

 private:
  const HX_BasicSuite* basic_;
  SuiteId id_;
};

// To be held for the few calls that need it, never across commands.
template <typename Table>
class ScopedSuite : private SuiteReference {
 public:
  explicit ScopedSuite(const HostContext& context,
                       const char* message = kMissingSuiteMessage) requires(kSuite<Table>.version !=
                                                                            0)
      : SuiteReference(context, kSuite<Table>, message) {}
  ScopedSuite(const HostContext& context, std::int32_t version,
              const char* message = kMissingSuiteMessage) requires(kSuite<Table>.version == 0)
      : SuiteReference(context, {kSuite<Table>.name, version}, message) {}

  const Table* operator->() const { return static_cast<const Table*>(table_); }
  const Table& operator*() const { return *static_cast<const Table*>(table_); }
};

}  // namespace kelp::effect
