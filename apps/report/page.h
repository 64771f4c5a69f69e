#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "apps/report/plot.h"

namespace calmframe::report {

struct Fact {
  std::string name, value;
};

// One moment of the clip: its picture before and after, as data URLs.
struct FilmFrame {
  std::size_t frame = 0;
  double seconds = 0;
  std::string before, after;
};

// What was chosen of the clip to show.
struct Shown {
  std::vector<std::string> words;  // a paragraph each; none: the page doesn't tell of it
  struct Ways {                    // those that were tried, a row each
    std::vector<std::string> columns;
    std::vector<std::vector<std::string>> rows;  // a cell a column; none: no table and no dots
    std::size_t taken = 0;                       // of the rows
  } ways;
  Scatter scatter;
};

struct Page {
  std::string title;               // the clip's name
  std::string lead;                // the result in one line
  std::vector<Fact> facts;         // of the clip and what became of it
  std::vector<Fact> controls;      // that it was made with
  std::vector<std::string> notes;  // what the reader should know, a sentence each
  Shown shown;
  std::string plots_about;  // what holds for several of the plots
  std::vector<Plot> plots;
  double seconds_a_value = 1;  // of all curves
  std::vector<FilmFrame> film;
};

// One HTML file that needs nothing else: no network, fonts of the system, light and dark, readable
// without its script, which shows the values under the pointer. The curves are in it as JSON too,
// in the element `data`. Texts may be any UTF-8.
std::string HtmlOf(const Page& page);

}  // namespace calmframe::report
