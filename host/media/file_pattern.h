#pragma once

#include <string>
#include <vector>

namespace calmframe::media {

// The files whose names are of the pattern, sorted: *, ?, [ab] and {a,b} in any part of it. None
// where there are none, and of a pattern that would look at more than a million names or some
// thousand folders, or spells out more than a thousand others: projects and lists tell patterns
// too. Any thread.
std::vector<std::string> FilesNamedLike(const std::string& pattern);

}  // namespace calmframe::media
