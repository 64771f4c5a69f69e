#pragma once

#include <cstdint>
#include <string_view>

#include "platform/hx/hx_effect.h"

namespace calmframe::host {

// The interface's C functions. What they work on is found by the effect, or by what was lent, or is
// the host's whose command runs (Host::calling). Every one that can fail passes through
// Operations::Begin, and no exception leaves them.
const HX_Callbacks& Callbacks();
const HX_BasicSuite& BasicSuite();

// The functions of the render commands' extra records.
void SetPlanFunctions(HX_PlanExtra& plan);
void SetRenderFunctions(HX_RenderExtra& render);

// Tables of the suites that are not the media services'; null for an unknown name or version.
const void* FindEffectSuite(std::string_view name, std::int32_t version);

}  // namespace calmframe::host
