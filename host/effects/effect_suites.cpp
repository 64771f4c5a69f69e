#include <algorithm>
#include <cstring>
#include <vector>

#include "host/effects/interface_guard.h"
#include "host/effects/interface_tables.h"
#include "host/pixels/world_operations.h"
#include "platform/hx/hx_suites.h"
#include "platform/tessel/utility.h"

namespace calmframe::host {
namespace {

// Cut between characters, with the terminating zero.
void CopyUTF16(const std::string& text, std::uint16_t* to, std::uint32_t max) {
  if (max == 0) return;
  const std::u16string units = tessel::utility::ToUTF16(text);
  std::size_t size = std::min<std::size_t>(units.size(), max - 1);
  if (size > 0 && size < units.size() && (units[size - 1] & 0xfc00) == 0xd800) --size;
  std::copy_n(units.begin(), size, to);
  to[size] = 0;
}

// -- Param Utils --

HX_Err UpdateParamUI(HX_EffectRef effect, std::int32_t index, const HX_ParamDef* param) {
  return WithInstance("Param Utils.UpdateParamUI", effect, [&](Instance& instance) -> HX_Err {
    return instance.effect()->params().UpdateUI(index, *param) ? HX_ERR_NONE : HX_ERR_UNKNOWN;
  });
}

HX_Err SetParamValue(HX_EffectRef effect, std::int32_t index, const HX_ParamDef* param) {
  return WithInstance("Param Utils.SetParamValue", effect, [&](Instance& instance) -> HX_Err {
    if (!instance.effect()->params().SetByPlugin(index, *param)) {
      return HX_ERR_UNKNOWN;
    }
    instance.effect()->InvalidateRenders();
    return HX_ERR_NONE;
  });
}

constexpr HX_ParamUtilsSuite3 kParamUtils = {UpdateParamUI, SetParamValue};

// -- Utility --

template <typename Value, typename Get>
HX_Err Tell(const char* operation, HX_EffectRef effect, Value* value, Get get) {
  return WithInstance(operation, effect, [&](Instance& instance) -> HX_Err {
    *value = get(*instance.effect(), *instance.layer());
    return HX_ERR_NONE;
  });
}

template <typename Get>
HX_Err TellText(const char* operation, HX_EffectRef effect, std::uint16_t* text, std::uint32_t max,
                Get get) {
  return WithInstance(operation, effect, [&](Instance& instance) -> HX_Err {
    CopyUTF16(get(instance.host(), *instance.layer()), text, max);
    return HX_ERR_NONE;
  });
}

HX_Err GetEffectReference(HX_EffectRef effect, std::uint64_t* reference) {
  return Tell("Utility.GetEffectReference", effect, reference,
              [](TimelineEffect& own, const LayerState&) { return own.reference(); });
}
HX_Err GetRuntimeInstanceID(HX_EffectRef effect, std::uint32_t* id) {
  return Tell("Utility.GetRuntimeInstanceID", effect, id,
              [](TimelineEffect& own, const LayerState&) { return own.runtime_id(); });
}
HX_Err GetTicksPerFrame(HX_EffectRef effect, std::int64_t* ticks) {
  return Tell("Utility.GetTicksPerFrame", effect, ticks,
              [](TimelineEffect&, const LayerState& layer) { return layer.ticks_per_frame; });
}
HX_Err GetStartFrame(HX_EffectRef effect, std::int32_t* frame) {
  return Tell("Utility.GetStartFrame", effect, frame,
              [](TimelineEffect&, const LayerState& layer) { return layer.start_frame; });
}
HX_Err GetFrameCount(HX_EffectRef effect, std::int32_t* count) {
  return Tell("Utility.GetFrameCount", effect, count,
              [](TimelineEffect&, const LayerState& layer) { return layer.length; });
}
HX_Err GetFieldType(HX_EffectRef effect, std::int32_t* field) {
  return Tell("Utility.GetFieldType", effect, field,
              [](TimelineEffect&, const LayerState& layer) { return layer.field_type; });
}
HX_Err GetLayerName(HX_EffectRef effect, std::uint16_t* text, std::uint32_t max) {
  return TellText("Utility.GetLayerName", effect, text, max,
                  [](Host&, const LayerState& layer) { return layer.name; });
}
HX_Err GetLayerFileName(HX_EffectRef effect, std::uint16_t* text, std::uint32_t max) {
  return TellText("Utility.GetLayerFileName", effect, text, max,
                  [](Host&, const LayerState& layer) { return layer.file_name; });
}
HX_Err GetProjectPath(HX_EffectRef effect, std::uint16_t* text, std::uint32_t max) {
  return TellText("Utility.GetProjectPath", effect, text, max,
                  [](Host& host, const LayerState&) { return host.settings().project_path; });
}
HX_Err GetSourceID(HX_EffectRef effect, HX_Guid* id) {
  return Tell("Utility.GetSourceID", effect, id,
              [](TimelineEffect&, const LayerState&) { return HX_Guid{}; });
}

constexpr HX_UtilitySuite kUtility = {
    GetEffectReference, GetRuntimeInstanceID, GetTicksPerFrame, GetStartFrame,  GetFrameCount,
    GetFieldType,       GetLayerName,         GetLayerFileName, GetProjectPath, GetSourceID};

// -- Private Effect --

HX_Err ConvertText(const std::uint16_t* from, char* to, std::uint32_t max) {
  return Guarded("Private Effect.ConvertText", [&]() -> HX_Err {
    std::u16string text;
    for (; *from; ++from) text += static_cast<char16_t>(*from);
    Callbacks().copy_text(to, max, tessel::utility::ToUTF8(text).c_str());
    return HX_ERR_NONE;
  });
}

HX_Err GetLayerData(HX_EffectRef effect, std::int32_t, void*) {
  return WithInstance("Private Effect.GetLayerData", effect,
                      [](Instance&) -> HX_Err { return HX_ERR_UNKNOWN; });
}

HX_Err ReservedOfEffect(HX_EffectRef) {
  return HX_ERR_UNKNOWN;
}

HX_Err ForceRerender(HX_EffectRef effect) {
  return Guarded("Private Effect.ForceRerender", [&]() -> HX_Err {
    if (const std::shared_ptr<Instance> instance = FindInstance(effect)) {
      instance->effect()->InvalidateRenders();
      instance->wake().Wake();
    }
    return HX_ERR_NONE;
  });
}

constexpr HX_PrivateEffectSuite3 kPrivateEffect = {ConvertText, GetLayerData, ReservedOfEffect,
                                                   ReservedOfEffect, ForceRerender};

// -- App, Adv App --

HX_Err InvalidateRect(void*, const HX_Rect* rect) {
  return WithHost("App.InvalidateRect", [&](Host& host) -> HX_Err {
    host.user_interface().Invalidate(rect ? *rect : HX_Rect{});
    return HX_ERR_NONE;
  });
}

HX_Err RefreshAllWindows() {
  return WithHost("Adv App.RefreshAllWindows", [](Host& host) -> HX_Err {
    host.user_interface().Refresh();
    return HX_ERR_NONE;
  });
}

HX_Err InfoText(const char* line1, const char* line2) {
  return WithHost("Adv App.InfoText", [&](Host& host) -> HX_Err {
    if (line1 || line2) {
      host.user_interface().SetInfo(line1 ? line1 : "", line2 ? line2 : "");
    } else {
      host.user_interface().ClearInfo();
    }
    return HX_ERR_NONE;
  });
}

constexpr HX_AppSuite6 kApp = {InvalidateRect};
constexpr HX_AdvAppSuite1 kAdvApp = {RefreshAllWindows, InfoText};

// -- World, Blur --

HX_Err NewWorld(HX_EffectRef, std::int32_t width, std::int32_t height, std::uint8_t clear,
                std::uint32_t format, HX_World* world) {
  return WithLent("World.NewWorld", [&](Lent& lent) {
    return lent.worlds.New(width, height, clear != 0, format, world);
  });
}

// Not to be failed: who gives back a world can't do more about it.
HX_Err DisposeWorld(HX_EffectRef, HX_World* world) {
  Lent* lent = Lent::active();
  return lent ? lent->worlds.Dispose(world) : HX_ERR_UNKNOWN;
}

HX_Err BlurOperation(HX_EffectRef, const HX_World* from, HX_World* to, float radius, std::int32_t,
                     std::int32_t, std::int32_t, std::int32_t) {
  return Guarded("Blur.Blur", [&] { return Blur(*from, *to, radius); });
}

constexpr HX_WorldSuite2 kWorld = {NewWorld, DisposeWorld};
constexpr HX_BlurSuite1 kBlur = {BlurOperation};

// -- Analysis Host, Stabilizer Host --

HX_Err CancelJob(HX_EffectRef) {
  return Guarded("Analysis Host.CancelJob", [] { return HX_ERR_NONE; });
}
HX_Err ReportJobEnd(HX_EffectRef, std::uint8_t) {
  return Guarded("Analysis Host.ReportJobEnd", [] { return HX_ERR_NONE; });
}
HX_Err IsScheduled(HX_EffectRef, std::uint8_t* scheduled) {
  return Guarded("Analysis Host.IsScheduled", [&]() -> HX_Err {
    *scheduled = 0;
    return HX_ERR_NONE;
  });
}
HX_Err MayStart(HX_EffectRef, std::uint8_t* may) {
  return Guarded("Analysis Host.MayStart", [&]() -> HX_Err {
    *may = 1;
    return HX_ERR_NONE;
  });
}
HX_Err GetCompressionPreference(std::uint8_t* raw) {
  return WithHost("Analysis Host.GetCompressionPreference", [&](Host& host) -> HX_Err {
    *raw = static_cast<std::uint8_t>(host.saves_as());
    return HX_ERR_NONE;
  });
}
HX_Err ScheduleAnalysis(HX_EffectRef) {
  return Guarded("Analysis Host.ScheduleAnalysis", [] { return HX_ERR_NONE; });
}
HX_Err GetRefusal(HX_EffectRef effect, std::uint16_t* text, std::uint32_t max) {
  return TellText("Analysis Host.GetRefusal", effect, text, max,
                  [](Host&, const LayerState& layer) { return layer.refusal; });
}

HX_Err SetFramePolygon(HX_EffectRef effect, std::uint32_t count, const float* xy,
                       std::int32_t frame) {
  return WithInstance("Stabilizer Host.SetFramePolygon", effect, [&](Instance& instance) -> HX_Err {
    const std::size_t size = std::size_t{count} * 2;
    instance.effect()->SetPolygon(frame, std::vector<float>(xy, xy + size));
    return HX_ERR_NONE;
  });
}

constexpr HX_AnalysisHostSuite1 kAnalysisHost = {
    CancelJob,        ReportJobEnd, IsScheduled, MayStart, GetCompressionPreference,
    ScheduleAnalysis, GetRefusal};
constexpr HX_StabilizerHostSuite7 kStabilizerHost = {SetFramePolygon};

// -- Analysis Span --

HX_Err GetEnd(HX_EffectRef effect, std::int32_t* frame) {
  return Tell("Analysis Span.GetEnd", effect, frame, [](TimelineEffect&, const LayerState& layer) {
    constexpr std::int64_t kMost = std::numeric_limits<std::int32_t>::max();
    return static_cast<std::int32_t>(std::min(layer.source->EndOfShot(layer.start_frame), kMost));
  });
}

constexpr HX_AnalysisSpanSuite1 kAnalysisSpan = {GetEnd};

// -- Analysis Keeping --

HX_Err IsWanted(HX_EffectRef effect, std::uint8_t* wanted) {
  return Tell("Analysis Keeping.IsWanted", effect, wanted,
              [](TimelineEffect& of, const LayerState&) {
                return static_cast<std::uint8_t>(of.keeper() && of.keeper()->Wants());
              });
}

HX_Err Keep(HX_EffectRef effect, std::uint32_t number, const void* bytes, std::uint64_t size) {
  return WithInstance("Analysis Keeping.Keep", effect, [&](Instance& instance) -> HX_Err {
    const auto& keeper = instance.effect()->keeper();
    if (keeper) keeper->Keep(number, static_cast<const std::uint8_t*>(bytes), size);
    return HX_ERR_NONE;
  });
}

HX_Err FindPiece(HX_EffectRef effect, std::uint32_t number, const void** bytes,
                 std::uint64_t* size) {
  return WithInstance("Analysis Keeping.Find", effect, [&](Instance& instance) -> HX_Err {
    const auto& keeper = instance.effect()->keeper();
    const std::vector<std::uint8_t>* piece = keeper ? keeper->Find(number) : nullptr;
    *bytes = piece ? piece->data() : nullptr;
    *size = piece ? piece->size() : 0;
    return HX_ERR_NONE;
  });
}

constexpr HX_AnalysisKeepingSuite1 kAnalysisKeeping = {IsWanted, Keep, FindPiece};

// -- Opaque Effect Data --

HX_Err FindOpaque(std::uint64_t reference, void** block) {
  return WithLent("Opaque Effect Data.Find", [&](Lent& lent) -> HX_Err {
    *block = lent.opaque_data.Find(reference);
    return HX_ERR_NONE;
  });
}
HX_Err SetOpaque(std::uint64_t reference, void* block, void** winner) {
  return WithLent("Opaque Effect Data.Set", [&](Lent& lent) -> HX_Err {
    *winner = lent.opaque_data.Set(reference, block);
    return HX_ERR_NONE;
  });
}
// Not to be failed: a use that stays would keep the block for ever.
HX_Err ReleaseOpaque(std::uint64_t reference, std::uint8_t* last) {
  Lent* lent = Lent::active();
  if (!lent) return HX_ERR_UNKNOWN;
  *last = lent->opaque_data.Release(reference) ? 1 : 0;
  return HX_ERR_NONE;
}

constexpr HX_OpaqueEffectDataSuite1 kOpaqueEffectData = {FindOpaque, SetOpaque, ReleaseOpaque};

}  // namespace

const void* FindEffectSuite(std::string_view name, std::int32_t version) {
  // A plain table: a map would be gone under an effect that is at work when the process ends.
  static constexpr struct {
    const char* name;
    std::int32_t version;
    const void* table;
  } kSuites[] = {
      {HX_PARAM_UTILS_SUITE, HX_PARAM_UTILS_SUITE_VERSION, &kParamUtils},
      {HX_UTILITY_SUITE, HX_UTILITY_SUITE_VERSION_3, &kUtility},
      {HX_UTILITY_SUITE, HX_UTILITY_SUITE_VERSION_4, &kUtility},
      {HX_UTILITY_SUITE, HX_UTILITY_SUITE_VERSION_5, &kUtility},
      {HX_PRIVATE_EFFECT_SUITE, HX_PRIVATE_EFFECT_SUITE_VERSION, &kPrivateEffect},
      {HX_APP_SUITE, HX_APP_SUITE_VERSION, &kApp},
      {HX_ADV_APP_SUITE, HX_ADV_APP_SUITE_VERSION, &kAdvApp},
      {HX_WORLD_SUITE, HX_WORLD_SUITE_VERSION, &kWorld},
      {HX_BLUR_SUITE, HX_BLUR_SUITE_VERSION, &kBlur},
      {HX_ANALYSIS_HOST_SUITE, HX_ANALYSIS_HOST_SUITE_VERSION, &kAnalysisHost},
      {HX_ANALYSIS_SPAN_SUITE, HX_ANALYSIS_SPAN_SUITE_VERSION, &kAnalysisSpan},
      {HX_ANALYSIS_KEEPING_SUITE, HX_ANALYSIS_KEEPING_SUITE_VERSION, &kAnalysisKeeping},
      {HX_STABILIZER_HOST_SUITE, HX_STABILIZER_HOST_SUITE_VERSION, &kStabilizerHost},
      {HX_OPAQUE_EFFECT_DATA_SUITE, HX_OPAQUE_EFFECT_DATA_SUITE_VERSION, &kOpaqueEffectData}};
  for (const auto& suite : kSuites) {
    if (name == suite.name && version == suite.version) return suite.table;
  }
  return nullptr;
}

}  // namespace calmframe::host
