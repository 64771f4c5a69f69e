#include "effect/entry.h"
#include "stabilizer/effect/src/stabilizer_effect.h"

// The plug-in's one entry; an HX_EffectMain.
extern "C" HX_Err EffectMainExtra(std::uint32_t command, HX_InData* in, HX_OutData* out,
                                  HX_ParamDef* params[], HX_World* output, void* extra) {
  return kelp::effect::EffectMain<kelp::effect::StabilizerEffect>(command, in, out, params, output,
                                                                  extra);
}
