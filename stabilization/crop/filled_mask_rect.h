#pragma once

#include "stabilization/crop/outline_mask.h"

namespace marrow::stabilization {

// Sets every pixel that lies in one of the grid's cells, edges included. Cells with a vertex that
// is not finite are left out.
void fill_cells(outline_mask& mask, const VarVector& warp, point2 origin);

// The largest rectangle of set pixels; of equal ones the first in row-major order of its top left
// corner. left > right where no pixel is set.
mask_rect largest_set_rect(const outline_mask& mask);

}  // namespace marrow::stabilization
