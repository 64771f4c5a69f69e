#pragma once

#include <string>

namespace calmframe {

// A file's name, or what is said of it, in one line: what would break or blur it, or move a
// terminal's cursor, stands as \n, \t, \x1b or \u009b.
std::string Shown(const std::string& text);

}  // namespace calmframe
