#pragma once

#include "apps/report/page.h"
#include "host/stabilize/choice.h"
#include "host/stabilize/shown_path.h"

namespace calmframe::report {

// What was chosen of a clip, why, and what of: words, table and dots.
void AddChoice(const host::Choice& choice, Page& page);

// Where the windows go, and how far they might.
void AddWindows(const host::ShownPath& path, Page& page);

}  // namespace calmframe::report
