#include "effect/host_requests.h"

#include <cstring>
#include <string>

#include "effect/param_checkout.h"
#include "effect/suite.h"
#include "platform/tessel/utility.h"

namespace kelp::effect {

void ForceRerender(const HostContext& context) {
  const ScopedSuite<HX_PrivateEffectSuite3> suite(context);
  ThrowIfFailed(suite->ForceRerender(context.in->effect_ref));
}

void RefreshAllWindows(const HostContext& context) {
  const ScopedSuite<HX_AdvAppSuite1> suite(context);
  ThrowIfFailed(suite->RefreshAllWindows());
}

void ShowInfoText(const HostContext& context, const char* line1, const char* line2) {
  const ScopedSuite<HX_AdvAppSuite1> suite(context);
  ThrowIfFailed(suite->InfoText(line1, line2));
}

void UpdateParamUI(const HostContext& context, std::int32_t index,
                   const ParamAppearance& appearance) {
  // The call's own record may be older than an update within the call.
  const ParamCheckout present(context, index);
  HX_ParamDef param = *present;
  if (appearance.enabled) {
    param.ui_flags &= ~std::uint32_t{HX_PARAM_UI_DISABLED};
    if (!*appearance.enabled) param.ui_flags |= HX_PARAM_UI_DISABLED;
  }
  if (appearance.name != nullptr) {
    const std::string name = tessel::utility::CutToBytes(appearance.name, HX_PARAM_NAME_SIZE - 1);
    std::memset(param.name, 0, sizeof param.name);
    std::memcpy(param.name, name.data(), name.size());
  }
  if (param.ui_flags == present->ui_flags && std::strcmp(param.name, present->name) == 0) return;
  const ScopedSuite<HX_ParamUtilsSuite3> suite(context);
  ThrowIfFailed(suite->UpdateParamUI(context.in->effect_ref, index, &param));
}

void SetSliderValue(const HostContext& context, std::int32_t index, double value) {
  const ParamCheckout present(context, index);
  HX_ParamDef param = *present;
  param.u.fs.value = value;
  param.change_flag = 1;
  const ScopedSuite<HX_ParamUtilsSuite3> suite(context);
  ThrowIfFailed(suite->SetParamValue(context.in->effect_ref, index, &param));
}

}  // namespace kelp::effect
