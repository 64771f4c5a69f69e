#pragma once

#include <framework/mlt.h>

namespace calmframe::mlt {

// The filter "calmframe"; null without memory.
mlt_filter MakeFilter();

}  // namespace calmframe::mlt
