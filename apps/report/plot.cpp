#include "apps/report/plot.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <limits>

namespace calmframe::report {
namespace {

constexpr double kWidth = 720, kHeight = 200;
constexpr double kLeft = 56, kRight = 12, kTop = 10, kBottom = 26;
constexpr std::size_t kMostStretches = 720;

struct Range {
  double low = std::numeric_limits<double>::infinity();
  double high = -std::numeric_limits<double>::infinity();
  void Add(double value) {
    low = std::min(low, value);
    high = std::max(high, value);
  }
};

Range RangeOf(const Plot& plot) {
  Range range;
  for (const Curve& curve : plot.curves) {
    for (const double value : curve.values) {
      if (std::isfinite(value)) range.Add(value);
    }
  }
  if (plot.from_zero) range.Add(0);
  if (!(range.low <= range.high)) range = {0, 1};
  const double lacking = plot.least_span - (range.high - range.low);
  if (lacking > 0) {
    range.high += plot.from_zero ? lacking : lacking / 2;
    range.low -= plot.from_zero ? 0 : lacking / 2;
  }
  if (range.high == range.low) range.high = range.low + 1;
  return range;
}

// Between two ticks: 1, 2 or 5 times a power of ten, for about `ticks` of them.
double StepOf(double span, double ticks) {
  const double rough = span / ticks;
  const double power = std::pow(10, std::floor(std::log10(rough)));
  for (const double step : {1.0, 2.0, 5.0}) {
    if (step * power >= rough) return step * power;
  }
  return 10 * power;
}

int DigitsOf(double step) {
  return std::max(0, static_cast<int>(std::ceil(-std::log10(step) - 1e-9)));
}

std::string Coordinate(double value) {
  return Short(value, 1);
}

std::string PathOf(const std::vector<double>& values, const Range& range, double x_step) {
  const double y_scale = (kHeight - kTop - kBottom) / (range.high - range.low);
  std::string path;
  bool pen_down = false;
  const auto add = [&](std::size_t i, double value) {
    path += pen_down ? 'L' : 'M';
    path += Coordinate(kLeft + x_step * static_cast<double>(i)) + " " +
            Coordinate(kHeight - kBottom - (value - range.low) * y_scale);
    pen_down = true;
  };
  const std::size_t stretch = (values.size() + kMostStretches - 1) / kMostStretches;
  for (std::size_t begin = 0; begin < values.size(); begin += std::max<std::size_t>(stretch, 1)) {
    const std::size_t end = std::min(begin + std::max<std::size_t>(stretch, 1), values.size());
    std::size_t least = end, largest = end;
    for (std::size_t i = begin; i < end; ++i) {
      if (!std::isfinite(values[i])) continue;
      if (least == end || values[i] < values[least]) least = i;
      if (largest == end || values[i] > values[largest]) largest = i;
    }
    if (least == end) {
      pen_down = false;
      continue;
    }
    const bool alone = !pen_down;
    add(std::min(least, largest), values[std::min(least, largest)]);
    if (least != largest) {
      add(std::max(least, largest), values[std::max(least, largest)]);
    } else if (alone) {
      path += "h0";  // a value between two gaps shows as a dot
    }
  }
  return path;
}

}  // namespace

std::string Escaped(const std::string& text) {
  std::string escaped;
  for (const char c : text) {
    switch (c) {
      case '&':
        escaped += "&amp;";
        break;
      case '<':
        escaped += "&lt;";
        break;
      case '>':
        escaped += "&gt;";
        break;
      case '"':
        escaped += "&quot;";
        break;
      case '\'':
        escaped += "&#39;";
        break;
      default:
        escaped += c;
    }
  }
  return escaped;
}

std::string Short(double value, int digits) {
  std::array<char, 64> text{};
  std::snprintf(text.data(), text.size(), "%.*f", digits, value);
  std::string number = text.data();
  if (number.find('.') != std::string::npos) {
    number.erase(number.find_last_not_of('0') + 1);
    if (number.back() == '.') number.pop_back();
  }
  if (number == "-0") number.erase(0, 1);
  return number;
}

std::string SvgOf(const Plot& plot, double seconds_a_value) {
  const Range range = RangeOf(plot);
  std::size_t count = 2;
  for (const Curve& curve : plot.curves) count = std::max(count, curve.values.size());
  const double x_step = (kWidth - kLeft - kRight) / static_cast<double>(count - 1);
  const double seconds = seconds_a_value * static_cast<double>(count - 1);
  const double bottom = kHeight - kBottom;

  std::string svg = "<svg class=\"plot\" id=\"" + plot.id + "\" viewBox=\"0 0 " +
                    Coordinate(kWidth) + " " + Coordinate(kHeight) +
                    "\" role=\"img\" data-count=\"" + std::to_string(count) + "\" aria-label=\"" +
                    Escaped(plot.title + ". " + plot.about) + "\">\n";
  const double y_step = StepOf(range.high - range.low, 5);
  for (double tick = std::ceil(range.low / y_step) * y_step; tick <= range.high + y_step * 1e-6;
       tick += y_step) {
    const std::string y =
        Coordinate(bottom - (tick - range.low) * (bottom - kTop) / (range.high - range.low));
    svg += "<line class=\"grid\" x1=\"" + Coordinate(kLeft) + "\" x2=\"" +
           Coordinate(kWidth - kRight) + "\" y1=\"" + y + "\" y2=\"" + y + "\"/><text x=\"" +
           Coordinate(kLeft - 6) + "\" y=\"" + y + "\" class=\"y\">" +
           Short(tick, DigitsOf(y_step)) + "</text>\n";
  }
  const double t_step = StepOf(seconds, 8);
  for (double tick = 0; tick <= seconds + t_step * 1e-6; tick += t_step) {
    const std::string x = Coordinate(kLeft + tick / seconds * (kWidth - kLeft - kRight));
    svg += "<line class=\"tick\" x1=\"" + x + "\" x2=\"" + x + "\" y1=\"" + Coordinate(bottom) +
           "\" y2=\"" + Coordinate(bottom + 4) + "\"/><text x=\"" + x + "\" y=\"" +
           Coordinate(kHeight - 8) + "\" class=\"x\">" + Short(tick, DigitsOf(t_step)) +
           " s</text>\n";
  }
  for (std::size_t c = 0; c < plot.curves.size(); ++c) {
    svg += "<path class=\"curve " +
           (plot.curves.size() == 1 ? "alone" : std::string("c").append(std::to_string(c))) +
           "\" d=\"" + PathOf(plot.curves[c].values, range, x_step) + "\"><title>" +
           Escaped(plot.curves[c].name) + "</title></path>\n";
  }
  return svg + "<line class=\"cursor\" y1=\"" + Coordinate(kTop) + "\" y2=\"" + Coordinate(bottom) +
         "\"/></svg>\n";
}

}  // namespace calmframe::report
