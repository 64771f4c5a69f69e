#pragma once

#include "platform/hx/hx_world.h"

namespace calmframe::host {

// What the host does for a plug-in on frame buffers. All formats mix; the result is in the
// target's. Colours are straight. Answer HX_ERR_UNKNOWN, with the target untouched, for a world
// without pixels or of an unknown format. Any thread, one for a target.

// Copies from_rect onto to_rect (null: the whole world), in pixels of the buffers. Rectangles of
// one size copy pixel by pixel; others scale, each axis by area when it shrinks and linearly when
// it grows, colours weighted by alpha. What lies outside either buffer is left out.
HX_Err CopyWorld(const HX_World& from, HX_World& to, const HX_Rect* from_rect,
                 const HX_Rect* to_rect);

// Composes `from`, its top left at pixel (x, y) of `to`, clipped to it. With s in front of d:
// a = as + ad (1 - as), c = (cs as + cd ad (1 - as)) / a, all zero where a is 0; the mode tells
// which of both `from` is. Its alpha is scaled by the mode's opacity. What needs no arithmetic is
// exact: a pixel of `to` stays where `from` alone is clear, or is behind what is opaque; in one
// format and at full opacity a pixel of `from` is taken as it is where it covers, or where `to` is
// clear. Another mode is an error.
HX_Err Transfer(const HX_World& from, const HX_TransferMode& mode, int x, int y, HX_World& to);

// Gaussian of sigma radius / 2 on each of the four channels for itself, edges repeated; radius 0
// (or less) copies. The worlds are of one size.
HX_Err Blur(const HX_World& from, HX_World& to, float radius);

// Hue, lightness and saturation in 16.16 fixed point, from 0 to 1 each. Lightness is the brightest
// component, so that a saturated colour of lightness 1 is not white. Hues repeat; alpha is full.
HX_Pixel8 ColourOfHls(const int32_t hls[3]);

}  // namespace calmframe::host
