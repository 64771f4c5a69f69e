#include "analysis/src/rational_time.h"
