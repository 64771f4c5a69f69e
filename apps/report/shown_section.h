#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <string>
#include <vector>

#include "apps/report/page.h"
#include "host/project/project_file.h"
#include "host/stabilize/choice.h"
#include "host/stabilize/shown_path.h"

namespace calmframe::report {

// The shots of a film, each with what was chosen for it; `shown` of them, counted from 0, is the
// page's. time: of a frame of the clip, as text.
void AddShots(const std::vector<host::SavedShot>& shots, std::size_t shown,
              const std::function<std::string(std::int32_t frame)>& time, Page& page);

// What was chosen of a clip, why, and what of: words, table and dots.
void AddChoice(const host::Choice& choice, Page& page);

// Where the windows go, and how far they might.
void AddWindows(const host::ShownPath& path, Page& page);

}  // namespace calmframe::report
