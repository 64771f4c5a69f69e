#pragma once

#include <string_view>

namespace calmframe {

// Whether a JSON text goes beyond what any of the program's own do: arrays and objects in each
// other more than a hundred deep, or an object of more than a thousand members. Of a text from
// outside it is asked before the text is parsed: what is parsed is copied and written by functions
// that call themselves for each level, and an ordered object looks through all its members for
// each that is added.
bool ExceedsBounds(std::string_view json);

}  // namespace calmframe
