#include "apps/report/shown_section.h"

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <string>
#include <utility>

namespace calmframe::report {
namespace {

std::string Sentence(std::string text) {
  if (text.empty()) return text;
  text[0] = static_cast<char>(std::toupper(static_cast<unsigned char>(text[0])));
  return text + ".";
}

// As many digits in each row, so that they stand below each other.
std::string Fixed(double value, int digits) {
  char text[64];
  std::snprintf(text, sizeof text, "%.*f", digits, value);
  return text;
}

// How the choice is made, as far as it was one.
std::string RuleText() {
  const host::ChoiceWeights weights;
  return "Of the ways that leave nothing black the one of the least cost is shown. Cost counts, in "
         "decibels, the shake of the background and of all tracks, half each; " +
         Short(weights.width, 2) +
         " for each hundredth of the width that is not shown; what the picture wobbles more than "
         "the clip does; " +
         Short(weights.bends, 2) + " for frames that are not bent and " + Short(weights.change, 2) +
         " for other controls than those given. The clip as it was filmed is shown where none of "
         "the "
         "others is calmer, or all leave black.";
}

std::string MeaningText(const host::Choice& choice) {
  const host::Outcome& any = choice.candidates.front().outcome;
  return "Shake is motion faster than about 0.9 Hz, wobble how the picture's own shape flickers, "
         "both in thousandths of the width; the clip as it was shot has a shake of " +
         Short(any.before.mean, 2) + ", of its tracks " + Short(any.tracks_before, 2) +
         ", and a wobble of " + Short(any.wobble_before, 2) +
         ". Frames that are not bent are moved, turned and sized alone.";
}

}  // namespace

void AddShots(const std::vector<host::SavedShot>& shots, std::size_t shown,
              const std::function<std::string(std::int32_t frame)>& time, Page& page) {
  page.shots.table.columns = {"Shot",         "From",        "To",
                              "Frames",       "Width kept",  "Greatest zoom",
                              "Shake before", "Shake after", "Chosen"};
  page.shots.table.marked = shown;
  page.shots.table.mark = "this page";
  for (std::size_t s = 0; s < shots.size(); ++s) {
    const host::SavedShot& shot = shots[s];
    page.shots.lengths.push_back(shot.length);
    std::vector<std::string> row = {"shot " + std::to_string(s + 1), time(shot.start_frame),
                                    time(shot.start_frame + shot.length),
                                    std::to_string(shot.length)};
    if (const auto choice = host::Choice::Parse(shot.choice)) {
      const host::Outcome& outcome = choice->best().outcome;
      row.insert(row.end(), {Fixed(100 * outcome.width_kept, 1) + " %", Fixed(outcome.most_zoom, 2),
                             Fixed(outcome.before.mean, 2), Fixed(outcome.after.mean, 2),
                             choice->best().name});
    } else {
      row.resize(page.shots.table.columns.size());
    }
    page.shots.table.rows.push_back(std::move(row));
  }
}

void AddChoice(const host::Choice& choice, Page& page) {
  const host::Outcome& outcome = choice.best().outcome;
  const bool follows = choice.best().follows;
  page.lead = follows ? "Steadied: " + outcome.Text() : Sentence(choice.Text());
  page.facts.push_back({"Chosen", choice.Text()});
  page.facts.push_back({"Width kept", Short(100 * outcome.width_kept, 1) + " %"});
  page.facts.push_back({"Greatest zoom", Short(outcome.most_zoom, 2) + " of " +
                                             Short(choice.most_zoom, 2) + " that it may have"});
  page.facts.push_back({"Shake", Short(outcome.before.mean, 2) + " per mille as shot, " +
                                     Short(outcome.after.mean, 2) + " steadied"});
  if (follows && !outcome.bends) page.facts.push_back({"Warps", "none: frames are not bent"});

  page.shown.words = {Sentence("chosen: " + choice.Text())};
  if (const std::string why = choice.Why(); !why.empty()) {
    page.shown.words.back() += " " + Sentence(why);
  }
  if (choice.candidates.size() < 2) return;
  page.shown.words.push_back(RuleText());
  page.shown.words.push_back(MeaningText(choice));
  MarkedTable& ways = page.shown.ways;
  ways.columns = {"Way",           "Width kept",  "Greatest zoom",
                  "Black at most", "Shake",       "Shake of tracks",
                  "Wobble",        "Off the aim", "Cost, dB"};
  ways.marked = choice.taken;
  ways.mark = "chosen";
  page.shown.scatter = {"ways",
                        "Shake against width",
                        "width kept, %",
                        "shake, per mille",
                        "Each way that was tried: calmer is further down, more of the picture "
                        "further to the right.",
                        {}};
  for (const host::Candidate& candidate : choice.candidates) {
    const host::Outcome& of = candidate.outcome;
    ways.rows.push_back({candidate.name, Fixed(100 * of.width_kept, 1) + " %",
                         Fixed(of.most_zoom, 2), Fixed(100 * of.most_black, 1) + " %",
                         Fixed(of.after.mean, 2), Fixed(of.tracks_after, 2),
                         Fixed(of.wobble_after, 2), Fixed(of.straying.mean, 1),
                         candidate.follows ? Fixed(candidate.cost, 2) : "–"});
    constexpr double kUnseen = 0.05;  // per mille; what has less lies there too
    page.shown.scatter.dots.push_back({candidate.name, 100 * of.width_kept,
                                       std::max(of.after.mean, kUnseen),
                                       &candidate == &choice.best()});
  }
}

void AddWindows(const host::ShownPath& path, Page& page) {
  using host::Point;
  const auto add = [&](const char* id, const char* title, const char* about, double Point::*axis) {
    Curve curve{"centre", {}};
    Band band{"within the frame", {}, {}};
    for (const host::WindowPlace& place : path.windows) {
      curve.values.push_back(place.centre.*axis);
      band.least.push_back(place.least.*axis);
      band.most.push_back(place.most.*axis);
    }
    page.plots.push_back({id, title, "px", about, {curve}, 4, false, std::move(band)});
  };
  add("window-x", "Window, across",
      "Where the centre of what is shown lies, to the right of the frame's; shaded as far as it "
      "may go, at its size, within the frame.",
      &Point::x);
  add("window-y", "Window, down", "The same downwards.", &Point::y);
  const std::vector<double>& zooms = path.output.zooms;
  page.plots.push_back({"window-zoom",
                        "Window, zoom",
                        "times",
                        "How far each frame is enlarged; shaded up to the greatest zoom that it "
                        "may have.",
                        {{"zoom", zooms}},
                        0.1,
                        false,
                        {"allowed", std::vector<double>(zooms.size(), 1.0),
                         std::vector<double>(zooms.size(), path.most_zoom)}});
}

}  // namespace calmframe::report
