#pragma once

#include <string>
#include <vector>

#include "apps/report/page.h"

namespace calmframe::report {

// A clip of a batch. Texts may be any UTF-8; links are relative, as an address has them.
struct BatchRow {
  std::string clip, state;
  bool failed = false;
  std::vector<std::string> cells = {};   // seconds, zoom, shake; empty: not known
  std::string says = {};                 // warnings, or why it failed
  std::string output = {}, report = {};  // links; empty: none
  std::string before = {}, after = {};   // pictures, as data URLs; empty: none
};

struct BatchPage {
  std::string title;
  std::vector<Fact> facts, settings;
  std::vector<BatchRow> rows;
};

// One HTML file; its links lead to the files beside it.
std::string HtmlOf(const BatchPage& page);

}  // namespace calmframe::report
