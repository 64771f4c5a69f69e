#pragma once

#include <cstddef>
#include <string>
#include <vector>

namespace calmframe::batch {

struct FoundClip {
  std::string name = {};     // as it was named, or found below a folder so named
  std::string below = {};    // the folder beneath the named one that holds it; empty of others
  std::string trouble = {};  // why there is no such clip, in words; empty where there is
};

struct FoundClips {
  std::vector<FoundClip> clips;  // in the order they were named, those of a folder by their names
  std::size_t outputs = 0;       // of a batch, that were left out
};

// What words stand for: a file; a folder, for the clips in it, and if `recursive` in those beneath;
// a pattern of the shell for what fits it; @LIST for the words in a file, one a line, or up to a
// zero byte each where it has such. In folders clips are told by their names' extensions; what
// begins with a dot is passed by. A file is taken once. Outputs of a batch, by its records, are
// never taken.
FoundClips FindClips(const std::vector<std::string>& words, bool recursive);

}  // namespace calmframe::batch
