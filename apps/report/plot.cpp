#include "apps/report/plot.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdio>
#include <iterator>
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
  // About its middle.
  void Widen(double span) {
    const double lacking = std::max(span - (high - low), 0.0);
    low -= lacking / 2;
    high += lacking / 2;
  }
};

bool HasBand(const Band& band, std::size_t i) {
  return std::isfinite(band.least[i]) && std::isfinite(band.most[i]) &&
         band.least[i] <= band.most[i];
}

Range RangeOf(const Plot& plot) {
  Range range;
  for (const Curve& curve : plot.curves) {
    for (const double value : curve.values) {
      if (std::isfinite(value)) range.Add(value);
    }
  }
  for (std::size_t i = 0; i < plot.band.least.size(); ++i) {
    if (!HasBand(plot.band, i)) continue;
    range.Add(plot.band.least[i]);
    range.Add(plot.band.most[i]);
  }
  if (plot.from_zero) range.Add(0);
  if (!(range.low <= range.high)) range = {0, 1};
  if (plot.from_zero) {
    range.high = std::max(range.high, range.low + plot.least_span);
  } else {
    range.Widen(plot.least_span);
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

// The outline of each stretch that has a band; of a long one the narrowest of each few frames.
std::string PathOf(const Band& band, const Range& range, double x_step) {
  const double y_scale = (kHeight - kTop - kBottom) / (range.high - range.low);
  const std::size_t count = band.least.size();
  const std::size_t few = std::max<std::size_t>((count + kMostStretches - 1) / kMostStretches, 1);
  std::string path, back;
  const auto point = [&](std::size_t i, double value) {
    return Coordinate(kLeft + x_step * static_cast<double>(i)) + " " +
           Coordinate(kHeight - kBottom - (value - range.low) * y_scale);
  };
  const auto close = [&] {
    if (!back.empty()) path += back + "Z";
    back.clear();
  };
  for (std::size_t begin = 0; begin < count; begin += few) {
    const std::size_t end = std::min(begin + few, count);
    double least = -std::numeric_limits<double>::infinity(), most = -least;
    for (std::size_t i = begin; i < end; ++i) {
      if (!HasBand(band, i)) continue;
      least = std::max(least, band.least[i]);
      most = std::min(most, band.most[i]);
    }
    if (!std::isfinite(least)) {
      close();
      continue;
    }
    path += (back.empty() ? "M" : "L") + point(begin, least);
    back = "L" + point(begin, most) + back;
  }
  close();
  return path;
}

struct Box {
  double left, top, right, bottom;
  bool Meets(const Box& other) const {
    return left < other.right && other.left < right && top < other.bottom && other.top < bottom;
  }
};

// A place for a dot's name.
struct Label {
  const char* anchor;  // what of the text x is
  double x, y;         // y: of its middle
  Box BoxOf(double width, double height) const {
    const double left = anchor[0] == 's' ? x : anchor[0] == 'e' ? x - width : x - width / 2;
    return {left, y - height / 2, left + width, y + height / 2};
  }
};

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

std::string SvgOf(const Scatter& scatter) {
  constexpr double kTall = 300, kUnder = 44, kDot = 5, kMarked = 7;
  constexpr double kLine = 14, kLetter = 6.6;  // of the labels, at their most
  Range across, down;
  for (const Scatter::Dot& dot : scatter.dots) {
    across.Add(dot.across);
    down.Add(std::log10(dot.down));
  }
  across.Widen(10);
  down.Widen(std::log10(4.0));
  // So that no dot lies on the rim.
  across.Widen(1.15 * (across.high - across.low));
  down.Widen(1.2 * (down.high - down.low));
  const double bottom = kTall - kUnder, right = kWidth - kRight;
  const auto x_of = [&](double value) {
    return kLeft + (value - across.low) / (across.high - across.low) * (right - kLeft);
  };
  const auto y_of = [&](double value) {
    return bottom - (std::log10(value) - down.low) / (down.high - down.low) * (bottom - kTop);
  };

  std::string svg = "<svg class=\"scatter\" id=\"" + scatter.id + "\" viewBox=\"0 0 " +
                    Coordinate(kWidth) + " " + Coordinate(kTall) + "\" role=\"img\" aria-label=\"" +
                    Escaped(scatter.title + ". " + scatter.about) + "\">\n";
  const auto first_power = static_cast<int>(std::floor(down.low));
  for (int power = first_power; power <= down.high; ++power) {
    for (const int digit : {1, 2, 5}) {
      const double tick = digit * std::pow(10, power);
      if (std::log10(tick) < down.low || std::log10(tick) > down.high) continue;
      const std::string y = Coordinate(y_of(tick));
      svg += "<line class=\"grid\" x1=\"" + Coordinate(kLeft) + "\" x2=\"" + Coordinate(right) +
             "\" y1=\"" + y + "\" y2=\"" + y + "\"/><text x=\"" + Coordinate(kLeft - 6) +
             "\" y=\"" + y + "\" class=\"y\">" + Short(tick, std::max(0, -power)) + "</text>\n";
    }
  }
  const double x_step = StepOf(across.high - across.low, 8);
  for (double tick = std::ceil(across.low / x_step) * x_step; tick <= across.high; tick += x_step) {
    const std::string x = Coordinate(x_of(tick));
    svg += "<line class=\"grid\" x1=\"" + x + "\" x2=\"" + x + "\" y1=\"" + Coordinate(kTop) +
           "\" y2=\"" + Coordinate(bottom + 4) + "\"/><text x=\"" + x + "\" y=\"" +
           Coordinate(bottom + 18) + "\" class=\"x\">" + Short(tick, DigitsOf(x_step)) +
           "</text>\n";
  }
  svg += "<text x=\"" + Coordinate((kLeft + right) / 2) + "\" y=\"" + Coordinate(kTall - 8) +
         "\" class=\"axis\">" + Escaped(scatter.across) +
         "</text>\n<text transform=\"translate(12 " + Coordinate((kTop + bottom) / 2) +
         ") rotate(-90)\" class=\"axis\">" + Escaped(scatter.down) + "</text>\n";

  std::vector<Box> taken;
  std::string dots, names;
  for (const Scatter::Dot& dot : scatter.dots) {
    const double x = x_of(dot.across), y = y_of(dot.down);
    taken.push_back({x - kMarked, y - kMarked, x + kMarked, y + kMarked});
    const std::string circle = "<circle class=\"" + std::string(dot.marked ? "marked" : "dot") +
                               "\" cx=\"" + Coordinate(x) + "\" cy=\"" + Coordinate(y) + "\" r=\"" +
                               Coordinate(dot.marked ? kMarked : kDot) + "\"/>\n";
    dots = dot.marked ? dots + circle : circle + dots;
  }
  for (const Scatter::Dot& dot : scatter.dots) {
    const double x = x_of(dot.across), y = y_of(dot.down);
    const double wide = kLetter * static_cast<double>(dot.name.size());
    const double beside = kMarked + 4, over = kMarked + kLine / 2 + 1;
    const Label places[] = {{"start", x + beside, y},        {"end", x - beside, y},
                            {"middle", x, y - over},         {"middle", x, y + over},
                            {"start", x + beside, y - over}, {"start", x + beside, y + over},
                            {"end", x - beside, y - over},   {"end", x - beside, y + over}};
    const Label* place = std::find_if(std::begin(places), std::end(places), [&](const Label& at) {
      const Box box = at.BoxOf(wide, kLine);
      return box.left >= kLeft && box.right <= right && box.top >= 0 && box.bottom <= bottom &&
             std::none_of(taken.begin(), taken.end(),
                          [&](const Box& other) { return box.Meets(other); });
    });
    if (place == std::end(places)) place = std::begin(places);
    taken.push_back(place->BoxOf(wide, kLine));
    names += "<text x=\"" + Coordinate(place->x) + "\" y=\"" + Coordinate(place->y) +
             "\" text-anchor=\"" + place->anchor + "\" class=\"" +
             (dot.marked ? "name marked" : "name") + "\">" + Escaped(dot.name) + "</text>\n";
  }
  return svg + dots + names + "</svg>\n";
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
  if (!plot.band.name.empty()) {
    svg += "<path class=\"band\" d=\"" + PathOf(plot.band, range, x_step) + "\"><title>" +
           Escaped(plot.band.name) + "</title></path>\n";
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
