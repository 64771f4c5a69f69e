#include "host/stabilize/choice.h"

#include <algorithm>
#include <cmath>
#include <iterator>
#include <nlohmann/json.hpp>
#include <utility>

#include "platform/tessel/threads.h"

namespace calmframe::host {
namespace {

using namespace std::string_literals;

// What a width is worth to the windows, beside what WindowWeights has: of nine filmed clips each of
// these was the best for some, and none was better off with more or less.
constexpr double kWidthWeights[] = {0.1, 0.05, 0.03};

constexpr const char* kStills[] = {"auto", "all", "background", "subject"};  // as Still counts

double Decibels(double value) {
  return 20 * std::log10(value);
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
  if (!best().follows) return "passed through as it was filmed: nothing calmer was found";
  std::string text = best().name;
  if (still != Still::all) text += ", "s + kStills[static_cast<std::size_t>(still)] + " held still";
  if (candidates.size() > 1) text += ", best of " + std::to_string(candidates.size());
  return text;
}

nlohmann::ordered_json Choice::Json() const {
  nlohmann::ordered_json object;
  object["still"] = kStills[static_cast<std::size_t>(still)];
  object["most_zoom"] = most_zoom;
  object["given"] = ToJson(given);
  object["candidates"] = nlohmann::ordered_json::array();
  for (std::size_t i = 0; i < candidates.size(); ++i) {
    nlohmann::ordered_json row;
    row["name"] = candidates[i].name;
    row["changes"] = ToJson(candidates[i].changes);
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
      if (row.at("taken").get<bool>()) choice.taken = choice.candidates.size();
      choice.candidates.push_back(std::move(candidate));
    }
    if (choice.candidates.empty()) return {};
    return choice;
  } catch (const std::exception&) {  // of the parser, and of numbers that are none
    return {};
  }
}

Chooser::Chooser(const SolvedClip& clip, const FollowSettings& settings, double frames_per_second,
                 const ChoiceWeights& weights)
    : settings_(settings),
      frames_per_second_(frames_per_second),
      weights_(weights),
      source_(FindMotion(clip, Warps::none)),
      as_filmed_(MotionOfSource(clip, source_)) {
  choice_.most_zoom = settings.most_zoom;
}

PictureMotion Chooser::MotionOf(const Candidate& candidate, const SolvedClip& solved) const {
  return candidate.warps == Warps::none ? source_ : FindMotion(solved, candidate.warps);
}

std::vector<Similarity> Chooser::WindowsOf(const Candidate& candidate, const SolvedClip& solved,
                                           const PictureMotion& motion) const {
  if (!candidate.follows) return std::vector<Similarity>(motion.background.size());
  FollowSettings settings = settings_;
  settings.weights.width = candidate.width_weight;
  return FollowWindows(solved, candidate.warps, motion, settings);
}

bool Chooser::Consider(Candidate candidate, const SolvedClip& solved, bool by_best_width) {
  const PictureMotion motion = MotionOf(candidate, solved);
  std::vector<Candidate> tries;
  if (by_best_width) {
    candidate.width_weight = choice_.best().width_weight;
    tries.push_back(candidate);
  }
  for (const double width : kWidthWeights) {
    if (by_best_width || (!candidate.follows && !tries.empty())) break;
    candidate.width_weight = width;
    tries.push_back(candidate);
  }
  std::vector<std::vector<Similarity>> windows(tries.size());
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t i) {
        Candidate& at = tries[i];
        windows[i] = WindowsOf(at, solved, motion);
        at.outcome = MeasureOutcome(
            as_filmed_, MotionShown(solved, at.warps, motion, windows[i], settings_.filling),
            frames_per_second_);
        at.outcome.window = at.follows ? Outcome::Window::follow : Outcome::Window::none;
        at.outcome.bends = at.warps == Warps::solved;
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

void Chooser::Take(const Choice& choice, const SolvedClip& solved) {
  choice_ = choice;
  windows_ = WindowsOf(choice_.best(), solved, MotionOf(choice_.best(), solved));
}

bool Chooser::leaves_shake() const {
  const Outcome& outcome = choice_.best().outcome;
  const double seen = std::hypot(std::max(outcome.after.mean, outcome.tracks_after), weights_.seen);
  return Decibels(seen / weights_.seen) > weights_.change;
}

double Chooser::CostOf(const Candidate& candidate) const {
  const Outcome& outcome = candidate.outcome;
  const auto shake = [this](double mean) { return Decibels(std::hypot(mean, weights_.seen)); };
  const double background = shake(outcome.after.mean);
  const double tracks = outcome.tracks_before > 0 ? shake(outcome.tracks_after) : background;
  const double flicker = Decibels(std::hypot(outcome.wobble_after, weights_.wobble) /
                                  std::hypot(outcome.wobble_before, weights_.wobble));
  double cost = (background + tracks) / 2 + weights_.width * 100 * (1 - outcome.width_kept) +
                std::max(0.0, flicker);
  if (candidate.follows && candidate.warps == Warps::none) cost += weights_.bends;
  if (!candidate.changes.empty()) cost += weights_.change;
  return cost;
}

std::pair<bool, double> Chooser::RankOf(const Candidate& candidate) const {
  return {candidate.outcome.most_black > weights_.black, candidate.cost};
}

}  // namespace calmframe::host
