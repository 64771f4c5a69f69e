#pragma once

#include <cstdint>
#include <string>

#include "editors/mlt/analysis.h"

namespace calmframe::mlt {

// Where results lie, and the source frame that they begin with. Editors carry no more than the one
// property `results` from the pass that analyses to the one that draws, so both are one text: the
// path, and where they don't begin with frame 0 "@" and the frame behind it.
struct ResultsPlace {
  std::string path;
  std::int64_t first = 0;
};

std::string TextOf(const ResultsPlace& place);
ResultsPlace ResultsPlaceFrom(const std::string& text);

// The folder of results that nobody named, below the user's data folder. Throws std::runtime_error
// where the environment tells none.
std::string ResultsFolder();

// A name there for results of a clip: another for each file, stretch and kind of analysis, and the
// same when that is done anew.
std::string ResultsName(const std::string& clip, const ClipFrames& frames, const Controls& controls,
                        std::int64_t first, std::int64_t count);

// The file that a path without a root means: editors write what lies below their project's folder
// relative to that, and no filter learns it. Looked for in the current folder, the clip's and
// ResultsFolder(); the path itself where it is in none.
std::string FindResults(const std::string& path, const std::string& clip);

}  // namespace calmframe::mlt
