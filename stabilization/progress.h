#pragma once

#include <boost/function.hpp>

namespace marrow::stabilization {

// Called once for each unit of work of a solve. It may throw to cancel; nothing else is known of
// it. Called on the solve's thread only.
using progress_functor = boost::function<void()>;

}  // namespace marrow::stabilization
