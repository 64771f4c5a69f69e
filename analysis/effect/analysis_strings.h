#pragma once

#include <cstdint>

// Texts for the user of any effect that analyses its input first: keyed literals, for
// tessel::config::Localizer.
namespace kelp::analysis::effect {

// What a frame's status is called where an effect has no wording of its own; null for a status
// without a text.
const char* AnalysisStatusLiteral(std::int32_t status);

// On the Cancel button until the job has started.
inline constexpr char kCancelButtonInitializing[] =
    "$$$/kelp/analysis/parameter/name/CancelButtonInitializing=Initializing...";

// To the user who wants a layer analysed that has been cut to nothing.
inline constexpr char kEmptyLayer[] =
    "$$$/kelp/analysis/error/EmptyLayer=The layer shows no frames to analyze.";

}  // namespace kelp::analysis::effect
