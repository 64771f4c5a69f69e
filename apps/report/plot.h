#pragma once

#include <string>
#include <vector>

namespace calmframe::report {

// A curve of one value a frame; what is no number leaves a gap.
struct Curve {
  std::string name;
  std::vector<double> values;
};

// What the values may be, from a least to a most a frame, shaded; where either is no number or they
// are the wrong way round there is none.
struct Band {
  std::string name;  // empty: no band
  std::vector<double> least, most;
};

struct Plot {
  std::string id;  // unique on the page
  std::string title;
  std::string unit;           // of the values, "px"
  std::string about;          // one sentence for those who don't know it, also what is read out
  std::vector<Curve> curves;  // at most 3
  double least_span = 0;      // of the values shown, so that nothing is magnified to noise
  bool from_zero = false;     // the scale begins at 0
  Band band = {};
};

// A dot a thing, one of them marked.
struct Scatter {
  struct Dot {
    std::string name;
    double across = 0, down = 0;  // down above 0: its scale is logarithmic
    bool marked = false;
  };
  std::string id;  // unique on the page
  std::string title;
  std::string across, down;  // what is shown along each axis, with its unit
  std::string about;         // as of a plot
  std::vector<Dot> dots;     // at least one
};

// "&", "<", ">" and quotes as HTML writes them.
std::string Escaped(const std::string& text);

// A number as people read it, `digits` behind the point at most.
std::string Short(double value, int digits);

// The dots as inline SVG, each with its name beside it.
std::string SvgOf(const Scatter& scatter);

// The plot as inline SVG with axes, over seconds_a_value seconds a value. Long curves are drawn by
// the least and the largest value of each stretch.
std::string SvgOf(const Plot& plot, double seconds_a_value);

}  // namespace calmframe::report
