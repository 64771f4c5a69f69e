#pragma once

#include <cstdint>

#include "effect/parameter_reader.h"
#include "stabilizer/render/render_settings.h"

// How parameters become the settings of a render.
namespace kelp::effect {

using marrow::render::DeblurDebug;
using marrow::render::Framing;
using marrow::render::RenderSettings;

// How the parameters ask for frames to be drawn; the synthesis range is MarginInFrames's to tell.
RenderSettings GetRenderSettings(const ParameterReader& params);

// Synthesis Input Range in frames, halves away from zero; 0 unless the edges are synthesized.
std::uint32_t MarginInFrames(const ParameterReader& params, double frame_rate);

}  // namespace kelp::effect
