#pragma once

#include <cstdint>
#include <optional>

#include "analysis/effect/analysis_effect.h"
#include "analysis/effect/deleted_track_points.h"

// The parameter that holds the user's DeletedTrackPoints: arbitrary data of a host that keeps it.
// The effect declares none; AnalysisEffect::ParamIdToIndex of its id tells where such a host has
// it. A value is a handle with a pointer to the set, which it owns; a null handle is an empty set.
// User interface thread. Host codes are thrown, HX_ERR_HANDLE_LOCK for a handle that can't be
// locked.
namespace kelp::analysis::effect {

inline constexpr std::int32_t kDeletedTrackPointsParam = 305;  // its disk id, and its id here

// HX_CMD_CUSTOM_DATA_OP. Nothing for another parameter and for an operation that is none. A failed
// operation leaves nothing behind, and its handles as they were. Throws HX_ERR_MEMORY where there
// is no memory for a new handle, and HX_ERR_UNKNOWN for a flat form that is not one.
void RunCustomDataOp(const kelp::effect::HostContext& context, HX_CustomDataExtra& extra);

// The present set; none where the host has no such parameter.
std::optional<DeletedTrackPoints> ReadDeletedTrackPoints(AnalysisEffect& effect);

// Puts an empty set in the place of another one, as a value of its own with its change flag set.
void ClearDeletedTrackPoints(AnalysisEffect& effect);

}  // namespace kelp::analysis::effect
