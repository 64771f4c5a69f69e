#pragma once

#include <string>
#include <vector>

namespace calmframe {

// The candidate with the smallest edit distance (Levenshtein, 1966) to `name`, which may be the
// beginning of a longer one, or an empty text where none is nearer than half of the name's length.
std::string NearestMatch(const std::string& name, const std::vector<std::string>& candidates);

// What a user is told who gave a name that is not there: "; did you mean perspective?", or an empty
// text where nothing is near.
std::string NearestHint(const std::string& name, const std::vector<std::string>& candidates);

// "'perspectiv' is none of position, perspective; did you mean perspective?"
std::string NoneOf(const std::string& text, const std::vector<std::string>& names);

}  // namespace calmframe
