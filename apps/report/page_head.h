#pragma once

#include <string>
#include <vector>

#include "apps/report/page.h"

namespace calmframe::report {

// What all pages begin with, up to the first of their contents: one look, and nothing from
// anywhere else.
std::string BeginOfPage(const std::string& title);

// A table of names and values.
std::string TableOf(const std::string& caption, const std::vector<Fact>& facts);

}  // namespace calmframe::report
