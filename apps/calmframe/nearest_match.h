#pragma once

#include <string>
#include <vector>

namespace calmframe {

// The candidate with the smallest edit distance (Levenshtein, 1966) to `name`, or an empty text
// where none is nearer than half of the name's length.
std::string NearestMatch(const std::string& name, const std::vector<std::string>& candidates);

}  // namespace calmframe
