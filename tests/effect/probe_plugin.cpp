#include "effect/entry.h"

namespace {

class ProbeEffect final : public kelp::effect::GenericEffect {
 public:
  explicit ProbeEffect(const kelp::effect::HostContext& context) noexcept
      : GenericEffect(context) {}
  void ShowAbout() override { context().out->version = 1234; }
  void ReportOutOfMemory() override {}
  void ReportUnknownException() override {}
  HX_Err AddParam(std::int32_t) override { return HX_ERR_NONE; }
};

}  // namespace

extern "C" __attribute__((visibility("default"))) HX_Err EffectMainExtra(
    std::uint32_t command, HX_InData* in, HX_OutData* out, HX_ParamDef* params[], HX_World* output,
    void* extra) {
  return kelp::effect::EffectMain<ProbeEffect>(command, in, out, params, output, extra);
}
