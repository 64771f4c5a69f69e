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

// Rows of which one stands out.
struct MarkedTable {
  std::vector<std::string> columns;
  std::vector<std::vector<std::string>> rows;  // a cell a column
  std::size_t marked = 0;                      // of the rows
  std::string mark;                            // what that one is, a word or two
};

// What was chosen of the clip to show.
struct Shown {
  std::vector<std::string> words;  // a paragraph each; none: the page doesn't tell of it
  MarkedTable ways;                // those that were tried; no rows: no table and no dots
  Scatter scatter;
};

// The shots of a film, of which the page shows the marked one; no rows: it is none.
struct Shots {
  std::vector<double> lengths;  // of each, in any unit
  MarkedTable table;            // a row each
};

struct Page {
  std::string title;               // the clip's name
  std::string lead;                // the result in one line
  std::vector<Fact> facts;         // of the clip and what became of it
  std::vector<Fact> controls;      // that it was made with
  std::vector<std::string> notes;  // what the reader should know, a sentence each
  Shots shots;
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
