#pragma once

#include "stabilizer/render/frame_pass.h"

namespace marrow::render {

// Fills what the pass's frame, drawn before, leaves open of `output` with its neighbours, each as
// it lies in that frame: those next to it first, the one behind before the one in front, as far as
// the settings' synthesis_range. A neighbour outside the clip, or without a known motion, is
// skipped. Then alpha below full is multiplied by alpha_boost, rounded, up to full.
//
// Each neighbour is composed behind all before, so that only open tiles, those with a pixel that is
// not fully opaque, can show it. The picture is, bit for bit, that of whole frames drawn and
// composed; but only what reaches into an open tile is drawn, and a neighbour that reaches into
// none is not fetched.
template <class Pixel>
void synthesizeEdges(const FramePass<Pixel>& pass, WorldX<Pixel>& output);

extern template void synthesizeEdges(const FramePass<HX_Pixel8>&, WorldX<HX_Pixel8>&);
extern template void synthesizeEdges(const FramePass<HX_Pixel16>&, WorldX<HX_Pixel16>&);
extern template void synthesizeEdges(const FramePass<HX_PixelFloat>&, WorldX<HX_PixelFloat>&);

}  // namespace marrow::render
