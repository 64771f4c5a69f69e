#pragma once

#include <iosfwd>
#include <span>

#include "stabilization/displacements.h"

namespace marrow::stabilization {

// A picture of one frame's displacements for whoever debugs a solve: a grey circle at each source,
// a coloured one of radius 2 at its target, a line between them. The colour runs from black, weight
// 0, to red, the list's largest weight; outliers are blue. width and height: the page, in pixels of
// the frame.
void write_displacement_svg(std::ostream& out, std::span<const Displacement> list, int width,
                            int height);

}  // namespace marrow::stabilization
