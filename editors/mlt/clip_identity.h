#pragma once

#include <framework/mlt.h>

#include <string>

namespace calmframe::mlt {

// A text that tells the frames of a producer from those of others: its file's size, first and last
// bytes, also where an editor has put a smaller stand-in in its place, and what plays it at another
// speed. In- and out-points and names are no part of it. Without a file it is the resource itself.
std::string IdentityOf(mlt_producer producer);

}  // namespace calmframe::mlt
