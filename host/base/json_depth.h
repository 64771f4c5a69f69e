#pragma once

#include <string_view>

namespace calmframe {

// Whether arrays and objects of a JSON text stand in each other more than a hundred deep, which
// none of the program's own do. Of a text from outside it is asked before the text is parsed: what
// is parsed is copied and written by functions that call themselves for each level.
bool NestsTooDeep(std::string_view json);

}  // namespace calmframe
