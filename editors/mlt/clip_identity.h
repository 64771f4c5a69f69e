#pragma once

#include <framework/mlt.h>

#include <string>

namespace calmframe::mlt {

// The file of a producer, also where an editor has put a smaller stand-in in its place; without one
// the resource itself.
std::string PathOf(mlt_producer producer);

// A text that tells the frames of a producer from those of others: the size, first and last bytes
// of the file that PathOf tells, or that text itself, and what plays it at another speed. In- and
// out-points and names are no part of it.
std::string IdentityOf(mlt_producer producer);

}  // namespace calmframe::mlt
