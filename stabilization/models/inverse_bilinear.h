#pragma once

#include "stabilization/models/matrix3.h"

namespace marrow::stabilization {

// Where p lies in the quadrilateral a (0, 0), b (1, 0), c (0, 1), d (1, 1): the fractions (x, y)
// whose bilinear mix of the corners is p. Of the two solutions the one whose y is nearer to 0.5,
// unless the first is inside [0, 1] already. A fraction that a degenerate cell leaves open is 0.
point2 inverse_bilinear(point2 p, point2 a, point2 b, point2 c, point2 d);

}  // namespace marrow::stabilization
