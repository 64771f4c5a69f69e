#include "effect/generic_effect.h"

namespace kelp::effect {

void GenericEffect::DispatchEvent() {
  const auto* event = static_cast<const HX_EventExtra*>(context_.extra);
  if (!event) return;
  switch (event->event_type) {
    case 0:
      return Event0();
    case 1:
      return Event1();
    case 2:
      return Event2();
    case 3:
      return Event3();
    case 4:
      return Event4();
    case 5:
      return Event5();
    case 6:
      return Event6();
    case 7:
      return Event7();
    case 9:
      return Event9();
    case 10:
      return Event10();
    case 11:
      return Event11();
    default:
      return;
  }
}

void GenericEffect::DeclareParamCount(std::int32_t count) {
  for (std::int32_t index = 0; index < count; ++index) ThrowIfFailed(AddParam(index));
  context_.out->num_params = count;
}

void Dispatch(GenericEffect& effect) {
  switch (effect.context().command) {
    case HX_CMD_ABOUT:
      return effect.ShowAbout();
    case HX_CMD_START_PLUGIN:
      return effect.StartPlugin();
    case HX_CMD_STOP_PLUGIN:
      return effect.StopPlugin();
    case HX_CMD_DECLARE_PARAMS:
      return effect.DeclareParams();
    case HX_CMD_CREATE_INSTANCE:
      return effect.CreateInstance();
    case HX_CMD_RESTORE_INSTANCE:
      return effect.RestoreInstance();
    case HX_CMD_FLATTEN_INSTANCE:
      return effect.FlattenInstance();
    case HX_CMD_DESTROY_INSTANCE:
      return effect.DestroyInstance();
    case HX_CMD_OPEN_OPTIONS:
      return effect.OpenOptions();
    case HX_CMD_PREPARE_FRAME:
      return effect.PrepareFrame();
    case HX_CMD_RENDER_FRAME:
      return effect.RenderFrame();
    case HX_CMD_PARAM_CHANGED:
      return effect.ParamChanged();
    case HX_CMD_REFRESH_PARAMS:
      return effect.RefreshParams();
    case HX_CMD_DISPATCH_EVENT:
      return effect.DispatchEvent();
    case HX_CMD_CUSTOM_DATA_OP:
      return effect.CustomDataOp();
    case HX_CMD_PLAN_FRAME:
      return effect.PlanFrame();
    case HX_CMD_RENDER_PLANNED_FRAME:
      return effect.RenderPlannedFrame();
    case HX_CMD_IDLE_TICK:
      return effect.IdleTick();
    default:
      return;
  }
}

}  // namespace kelp::effect
