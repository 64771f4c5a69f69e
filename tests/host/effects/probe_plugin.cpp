#include "tests/host/effects/probe.h"

namespace {

struct PropertyRecord {
  HX_PropertyListHeader header{{1, 0}, {}, {3, 0, 0, 0}};
  HX_PropertyHeader kind{{'X', 'V', 'N', '8'}, {'d', 'n', 'i', 'k'}, {}, {4}};
  char kind_value[4] = {'T', 'K', 'F', 'x'};
  HX_PropertyHeader entry{{'X', 'V', 'N', '8'}, {'4', '6', '6', '8'}, {}, {10}};
  char entry_value[12] = "ProbeMain";
  HX_PropertyHeader match{{'X', 'V', 'N', '8'}, {'A', 'N', 'M', 'x'}, {}, {6}};
  char match_value[8] = {5, 'P', 'r', 'o', 'b', 'e'};
};
static_assert(sizeof(PropertyRecord) == 10 + 3 * 16 + 4 + 12 + 8);

}  // namespace

std::function<HX_Err(const probe::Call&)>& probe::Behaviour() {
  static std::function<HX_Err(const Call&)> behaviour;
  return behaviour;
}

extern "C" {
__attribute__((used, visibility("default"),
               section(HX_PROPERTY_SECTION))) extern const PropertyRecord HXPL_16000 = {};

__attribute__((visibility("default"))) HX_Err ProbeMain(std::uint32_t command, HX_InData* in,
                                                        HX_OutData* out, HX_ParamDef* params[],
                                                        HX_World* output, void* extra) {
  const auto& behaviour = probe::Behaviour();
  return behaviour ? behaviour({command, in, out, params, output, extra}) : HX_ERR_NONE;
}
}
