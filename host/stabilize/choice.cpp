#include "host/stabilize/choice.h"

#include <algorithm>
#include <cmath>
#include <cstdio>
#include <iterator>
#include <nlohmann/json.hpp>
#include <utility>

#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

using namespace std::string_literals;

// What a width is worth to the windows, beside what WindowWeights has: of nine filmed clips each of
// these was the best for some, and none was better off with more or less.
constexpr double kWidthWeights[] = {0.1, 0.05, 0.03, 0.02};

constexpr const char* kStills[] = {"auto", "all", "background", "subject"};  // as Still counts

double Decibels(double value) {
  return 20 * std::log10(value);
}

// Less is better.
std::pair<bool, double> RankOf(const Candidate& candidate) {
  return {!candidate.holds, candidate.cost};
}

template <class... Values>
std::string Printed(const char* format, Values... values) {
  char text[128];
  std::snprintf(text, sizeof text, format, values...);
  return text;
}

nlohmann::ordered_json ToJson(const ParamValues& values) {
  auto object = nlohmann::ordered_json::object();
  for (const auto& [disk_id, value] : values) object[std::to_string(disk_id)] = value;
  return object;
}

ParamValues ToValues(const nlohmann::json& object) {
  ParamValues values;
  for (const auto& [disk_id, value] : object.items()) {
    values[std::stoi(disk_id)] = value.get<double>();
  }
  return values;
}

}  // namespace

std::string Choice::Text() const {
  if (!best().follows) {
    const bool holds =
        std::any_of(candidates.begin(), candidates.end(),
                    [](const Candidate& other) { return other.follows && other.holds; });
    return holds ? "passed through as it was filmed: nothing calmer was found"
                 : "passed through as it was filmed: nothing calmer stays below the zoom's limit "
                   "with nothing black";
  }
  std::string text = best().name;
  if (still != Still::all) text += ", "s + kStills[static_cast<std::size_t>(still)] + " held still";
  if (candidates.size() > 1) text += ", best of " + std::to_string(candidates.size());
  return text;
}

std::string Choice::Why() const {
  const Candidate* next = nullptr;
  for (const Candidate& candidate : candidates) {
    if (&candidate == &best() || !candidate.follows) continue;
    if (!next || RankOf(candidate) < RankOf(*next)) next = &candidate;
  }
  if (!next || !best().follows) return "";
  const Outcome &a = next->outcome, &b = best().outcome;
  std::string text = "next comes " + next->name;
  if (best().holds && !next->holds) {
    return text + (a.most_black > ChoiceWeights().black
                       ? Printed(", which leaves %.1f %% of a frame black", 100 * a.most_black)
                       : Printed(", which enlarges %.2f times", a.most_zoom));
  }
  text += Printed(", %.1f decibels behind", next->cost - best().cost);
  struct Figure {
    double next, best;  // less is better
    const char *worse, *better, *format;
  };
  const Figure figures[] = {
      {-100 * a.width_kept, -100 * b.width_kept, "it keeps less of the width",
       "it keeps more of the width", " (%.0f %% against %.0f %%)"},
      {a.after.mean, b.after.mean, "its background shakes more", "its background shakes less",
       " (%.2f against %.2f)"},
      {a.tracks_after, b.tracks_after, "its tracks shake more", "its tracks shake less",
       " (%.2f against %.2f)"},
      {std::max(a.wobble_after, a.wobble_before), std::max(b.wobble_after, b.wobble_before),
       "it wobbles more", "it wobbles less", " (%.2f against %.2f)"}};
  for (const bool worse : {true, false}) {
    const char* begin = worse ? ": " : "; but ";
    for (const Figure& figure : figures) {
      const std::string of_both =
          Printed(figure.format, std::abs(figure.next), std::abs(figure.best));
      // What the digits don't show is no difference.
      if (of_both == Printed(figure.format, std::abs(figure.best), std::abs(figure.next)) ||
          (figure.next > figure.best) != worse) {
        continue;
      }
      text += begin + std::string(worse ? figure.worse : figure.better) + of_both;
      begin = ", ";
    }
  }
  return text;
}

nlohmann::ordered_json Choice::Json() const {
  nlohmann::ordered_json object;
  object["still"] = kStills[static_cast<std::size_t>(still)];
  object["most_zoom"] = most_zoom;
  object["zoom_speed"] = zoom_speed;
  object["given"] = ToJson(given);
  object["candidates"] = nlohmann::ordered_json::array();
  for (std::size_t i = 0; i < candidates.size(); ++i) {
    nlohmann::ordered_json row;
    row["name"] = candidates[i].name;
    row["changes"] = ToJson(candidates[i].changes);
    row["fills"] = candidates[i].fills;
    row["holds"] = candidates[i].holds;
    row["taken"] = i == taken;
    row["width_weight"] = candidates[i].width_weight;
    row["cost"] = std::round(candidates[i].cost * 100) / 100;
    row.update(candidates[i].outcome.Json());
    object["candidates"].push_back(std::move(row));
  }
  return object;
}

std::optional<Choice> Choice::Parse(const std::string& text) {
  try {
    const nlohmann::json object = nlohmann::json::parse(text);
    Choice choice;
    const auto named = std::find(std::begin(kStills), std::end(kStills), object.at("still"));
    if (named == std::end(kStills)) return {};
    choice.still = static_cast<Still>(named - std::begin(kStills));
    choice.most_zoom = object.at("most_zoom").get<double>();
    choice.zoom_speed = object.at("zoom_speed").get<double>();
    choice.given = ToValues(object.at("given"));
    for (const nlohmann::json& row : object.at("candidates")) {
      Candidate candidate;
      candidate.name = row.at("name").get<std::string>();
      candidate.changes = ToValues(row.at("changes"));
      candidate.width_weight = row.at("width_weight").get<double>();
      candidate.cost = row.at("cost").get<double>();
      candidate.outcome = Outcome::Parse(row);
      candidate.warps = candidate.outcome.bends ? Warps::solved : Warps::none;
      candidate.follows = candidate.outcome.window == Outcome::Window::follow;
      // Choices that were saved before the limit counted lack these.
      candidate.fills = row.value("fills", true);
      candidate.holds = row.value("holds", candidate.outcome.most_black <= ChoiceWeights().black);
      if (row.at("taken").get<bool>()) choice.taken = choice.candidates.size();
      choice.candidates.push_back(std::move(candidate));
    }
    if (choice.candidates.empty()) return {};
    return choice;
  } catch (const std::exception&) {  // of the parser, and of numbers that are none
    return {};
  }
}

std::string TextOf(const Choice* choice, const LeftOut& left_out) {
  const bool holds = left_out.still != Still::all;
  if (!choice && !holds) return "";
  nlohmann::ordered_json object;
  if (choice) object = choice->Json();
  if (holds) object["still"] = kStills[static_cast<std::size_t>(left_out.still)];
  if (holds && (!choice || !left_out.deleted.empty())) {
    object["deleted"] = nlohmann::ordered_json::array();
    for (const TrackPoint& point : left_out.deleted) {
      object["deleted"].push_back({point.frame, point.slot});
    }
  }
  return object.dump();
}

LeftOut LeftOutIn(const std::string& text) {
  LeftOut left_out;
  try {
    const nlohmann::json object = nlohmann::json::parse(text);
    for (const Still still : {Still::background, Still::subject}) {
      if (object.at("still") == kStills[static_cast<std::size_t>(still)]) left_out.still = still;
    }
    if (left_out.still == Still::all) return left_out;
    for (const nlohmann::json& point : object.value("deleted", nlohmann::json::array())) {
      const TrackPoint at{point.at(0).get<std::int32_t>(), point.at(1).get<std::int32_t>()};
      if (at.frame >= 0 && at.slot >= 0) left_out.deleted.insert(at);
    }
  } catch (const std::exception&) {  // what could be read stands
  }
  return left_out;
}

Chooser::Chooser(const MovingClip& clip, const FollowSettings& settings,
                 const ChoiceWeights& weights)
    : settings_(settings),
      weights_(weights),
      source_(MeasureSource(MotionOfSource(clip.clip(), *clip.motion(Warps::none)),
                            settings.frames_per_second)),
      whole_frames_(WholeFrames(clip.clip())) {
  choice_.most_zoom = settings.most_zoom;
  choice_.zoom_speed = settings.zoom_speed;
}

bool Chooser::Consider(Candidate candidate, const MovingClip& solved, bool by_best_width) {
  const WarpedPlane plane(solved.clip(), candidate.warps);
  const PictureMotion& motion = *solved.motion(candidate.warps);
  std::vector<Candidate> tries;
  if (by_best_width) {
    candidate.width_weight = choice_.best().width_weight;
    tries.push_back(candidate);
  }
  for (const double width : kWidthWeights) {
    if (by_best_width) break;
    candidate.width_weight = width;
    tries.push_back(candidate);
  }
  std::vector<std::vector<Similarity>> windows(tries.size());
  const WindowFinder finder(plane, motion, SettingsFor(candidate));
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t i) { windows[i] = finder.Find(tries[i].width_weight); }, tries.size());
  const std::vector<ShownMotion> shown = MotionsShown(plane, motion, windows, finder.filled());
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t i) {
        Candidate& at = tries[i];
        at.outcome = MeasureOutcome(source_, shown[i], settings_.frames_per_second);
        at.outcome.window = Outcome::Window::follow;
        at.outcome.bends = at.warps == Warps::solved;
        at.holds = Holds(at.outcome);
        at.cost = CostOf(at);
      },
      tries.size());
  std::size_t best = 0;
  for (std::size_t i = 1; i < tries.size(); ++i) {
    if (RankOf(tries[i]) < RankOf(tries[best])) best = i;
  }
  choice_.candidates.push_back(std::move(tries[best]));
  if (choice_.candidates.size() > 1 &&
      RankOf(choice_.candidates.back()) >= RankOf(choice_.best())) {
    return false;
  }
  choice_.taken = choice_.candidates.size() - 1;
  windows_ = std::move(windows[best]);
  return true;
}

void Chooser::ConsiderAsFilmed() {
  Candidate filmed{.name = "as filmed", .warps = Warps::none, .follows = false};
  filmed.outcome = source_;
  filmed.outcome.window = Outcome::Window::none;
  filmed.outcome.bends = false;
  filmed.cost = CostOf(filmed);
  const Candidate& best = choice_.best();
  const bool is_best = !best.holds || UnrestOf(best.outcome) >= UnrestOf(filmed.outcome);
  choice_.candidates.push_back(std::move(filmed));
  if (!is_best) return;
  choice_.taken = choice_.candidates.size() - 1;
  windows_ = whole_frames_;
}

void Chooser::Take(const Choice& choice, const MovingClip& solved) {
  choice_ = choice;
  const WarpedPlane plane(solved.clip(), choice_.best().warps);
  const Candidate& best = choice_.best();
  windows_ = best.follows ? WindowFinder(plane, *solved.motion(best.warps), SettingsFor(best))
                                .Find(best.width_weight)
                          : whole_frames_;
}

bool Chooser::leaves_shake() const {
  const Outcome& outcome = choice_.best().outcome;
  const double seen = std::hypot(std::max(outcome.after.mean, outcome.tracks_after), weights_.seen);
  return Decibels(seen / weights_.seen) > weights_.change;
}

bool Chooser::Holds(const Outcome& outcome) const {
  // Whoever makes the picture smaller has a rim.
  return (outcome.most_black <= weights_.black || settings_.enlarged < 1) &&
         outcome.most_zoom <= settings_.most_zoom * settings_.enlarged * (1 + weights_.over);
}

FollowSettings Chooser::SettingsFor(const Candidate& candidate) const {
  FollowSettings settings = settings_;
  if (!candidate.fills) settings.filling.reset();
  return settings;
}

double Chooser::UnrestOf(const Outcome& outcome) const {
  const auto shake = [this](double mean) { return Decibels(std::hypot(mean, weights_.seen)); };
  const double background = shake(outcome.after.mean);
  const double tracks = outcome.tracks_before > 0 ? shake(outcome.tracks_after) : background;
  const double flicker = Decibels(std::hypot(outcome.wobble_after, weights_.wobble) /
                                  std::hypot(outcome.wobble_before, weights_.wobble));
  return (background + tracks) / 2 + std::max(0.0, flicker);
}

double Chooser::CostOf(const Candidate& candidate) const {
  double cost =
      UnrestOf(candidate.outcome) + weights_.width * 100 * (1 - candidate.outcome.width_kept);
  if (candidate.follows && candidate.warps == Warps::none) cost += weights_.bends;
  if (!candidate.changes.empty()) cost += weights_.change;
  return cost;
}

}  // namespace calmframe::host
