#include "studio/wire/told.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <functional>
#include <limits>
#include <nlohmann/json.hpp>
#include <optional>
#include <string_view>
#include <utility>
#include <vector>

#include "host/media/clip.h"
#include "studio/wire/settings.h"

namespace calmframe::studio {
namespace {

using nlohmann::json;
// Gives what of a value is heard; throws as ToldOf.
using Shape = std::function<json(const json& value)>;

void Expect(bool holds, const char* what) {
  if (!holds) throw BadMessage(what);
}

Shape Flag() {
  return [](const json& value) {
    Expect(value.is_boolean(), "what is on or off is neither");
    return value;
  };
}

Shape Number(double least, double most) {
  return [least, most](const json& value) {
    const double number = value.is_number() ? value.get<double>() : std::nan("");
    Expect(number >= least && number <= most, "a number is none, or out of range");
    return value;
  };
}

Shape Whole(double least, double most) {
  return [in_range = Number(least, most)](const json& value) {
    Expect(value.is_number_integer(), "a whole number is none");
    return in_range(value);
  };
}

// Measured, so that it may be anything.
Shape Figure(double most) {
  return [most](const json& value) -> json {
    if (value.is_null()) return nullptr;
    Expect(value.is_number(), "a figure is none");
    return std::abs(value.get<double>()) <= most ? value : json();
  };
}

Shape Text(std::size_t most) {
  return [most](const json& value) -> json {
    Expect(value.is_string(), "a text is none");
    return value.get_ref<const std::string&>().substr(0, most);
  };
}

Shape OneOf(std::vector<std::string> words) {
  return [words = std::move(words)](const json& value) {
    Expect(std::find(words.begin(), words.end(), value) != words.end(), "there is no such word");
    return value;
  };
}

Shape OrNull(Shape shape) {
  return [shape = std::move(shape)](const json& value) {
    return value.is_null() ? value : shape(value);
  };
}

Shape List(Shape shape, std::size_t most) {
  return [shape = std::move(shape), most](const json& value) {
    Expect(value.is_array(), "a list is none");
    json list = json::array();
    for (std::size_t i = 0; i < std::min(value.size(), most); ++i) list.push_back(shape(value[i]));
    return list;
  };
}

Shape Pair(Shape shape) {
  return [list = List(std::move(shape), 2)](const json& value) {
    Expect(value.size() == 2, "a pair is none");
    return list(value);
  };
}

struct Part {
  const char* name;
  Shape shape;
  bool may_lack = false;
};
Shape Object(std::vector<Part> parts) {
  return [parts = std::move(parts)](const json& value) {
    Expect(value.is_object(), "an object is none");
    json object = json::object();
    for (const Part& part : parts) {
      const auto found = value.find(part.name);
      if (found != value.end()) {
        object[part.name] = part.shape(*found);
      } else {
        Expect(part.may_lack, "an object lacks a part");
      }
    }
    return object;
  };
}

constexpr double kMostPixels = 1 << 27;
constexpr auto kMostFrames = static_cast<double>(media::kMaximumFrames);
constexpr double kMostWhole = 1e15;  // that a page has as such
// Of what is summed up, in pixels or so: a chart that goes further has steps that it can't count.
constexpr double kMostDrawn = 1e7;
constexpr std::size_t kLongestLine = 4000, kLongestName = 200;
constexpr std::size_t kMostShots = 10000, kMostWarnings = 100, kMostRows = 1000;
constexpr std::size_t kMostWays = 100;
// What a worker counts starts anew with the next one; see Clip.
constexpr double kMostCount = std::numeric_limits<std::uint32_t>::max();

json ControlsOf(const json& changes) {
  return JsonOf(SettingsOf({{"controls", changes}}))["controls"];
}

const Shape& Figures() {
  static const Shape shape = Object({{"shake_before", Figure(1e9)},
                                     {"shake_after", Figure(1e9)},
                                     {"width_kept", Figure(1e9)},
                                     {"most_zoom", Figure(1e9)},
                                     {"most_black", Figure(1e9)},
                                     {"worst_shake", Figure(1e9)},
                                     {"worst_at", Figure(1e9)}});
  return shape;
}

Shape Choice() {
  return Object({{"text", Text(kLongestLine)},
                 {"why", Text(kLongestLine)},
                 {"candidates", List(Object({{"name", Text(kLongestName)},
                                             {"window", OneOf({"steady", "follow", "none"})},
                                             {"taken", Flag()},
                                             {"bends", Flag()},
                                             {"changes", ControlsOf},
                                             {"shake_before", Figure(1e9)},
                                             {"shake_after", Figure(1e9)},
                                             {"width_kept", Figure(1e9)}}),
                                     kMostWays)}});
}

// Of the shots the first one's choice is shown.
Shape Shots() {
  return [shots = List(Object({{"first", Whole(0, kMostFrames)}, {"end", Whole(0, kMostFrames)}}),
                       kMostShots),
          choice = OrNull(Choice())](const json& value) {
    json told = shots(value);
    if (!told.empty() && value[0].contains("choice")) {
      told[0]["choice"] = choice(value[0]["choice"]);
    }
    return told;
  };
}

const std::vector<Part>& Told() {
  static const std::vector<Part> parts = {
      {"state", OneOf({"opening", "open", "working", "ready", "failed"})},
      {"error", Text(kLongestLine)},
      {"path", Text(kLongestLine)},
      {"info", Object({{"width", Whole(1, kMostPixels)},
                       {"height", Whole(1, kMostPixels)},
                       {"shown_width", Number(0, 1e18)},
                       {"frames", Whole(0, kMostFrames)},
                       {"rate", Number(1e-9, 1e9)},
                       {"interlaced", Flag()}})},
      {"progress", OrNull(Object({{"stage", Text(kLongestName)},
                                  {"says", Text(kLongestLine)},
                                  {"share", Number(0, 1), true},
                                  {"left", Figure(1e9), true}}))},
      {"panel", Whole(0, kMostCount)},
      {"curves", Whole(0, kMostCount)},
      {"picture", Whole(0, kMostCount)},
      {"shows", OrNull(Whole(0, kMostWhole))},
      {"warnings", List(Text(kLongestLine), kMostWarnings)},
      {"outcome", OrNull(Figures())},
      {"shots", Shots()},
      {"settings", [](const json& value) { return JsonOf(SettingsOf(value)); }}};
  return parts;
}

Shape Row() {
  const std::vector<Part> all = {{"id", Whole(-2147483648.0, 2147483647.0)},
                                 {"kind", Text(kLongestName)},
                                 {"name", Text(kLongestName)},
                                 {"enabled", Flag()},
                                 {"expert", Flag()}};
  const Shape value = Number(-1e39, 1e39);
  const auto with = [&all](std::vector<Part> more) {
    more.insert(more.end(), all.begin(), all.end());
    return Object(std::move(more));
  };
  const std::vector<std::pair<std::string, Shape>> kinds = {
      {"group", with({{"closed", Flag()}})},
      {"end", with({})},
      {"button", with({})},
      {"checkbox", with({{"default", value}, {"value", value}})},
      {"popup",
       with(
           {{"default", value}, {"value", value}, {"items", List(Text(kLongestName), kMostRows)}})},
      {"slider", with({{"default", value},
                       {"value", value},
                       {"min", value},
                       {"max", value},
                       {"from", value},
                       {"to", value},
                       {"digits", Whole(0, 20)},
                       {"percent", Flag()}})}};
  return [kinds](const json& row) {
    Expect(row.is_object() && row.contains("kind"), "a row has no kind");
    for (const auto& [kind, shape] : kinds) {
      if (row["kind"] == kind) return shape(row);
    }
    throw BadMessage("a row is of no kind");
  };
}

Shape Curves() {
  const Shape line = List(Figure(kMostDrawn), 2 * media::kMaximumFrames);
  const Shape path = Object({{"x", line}, {"y", line}, {"angle", line}, {"zoom", line}});
  return List(
      Object({{"first", Whole(0, kMostFrames)},
              {"end", Whole(0, kMostFrames)},
              {"curves",
               OrNull(Object(
                   {{"before", path}, {"after", path}, {"zooms", line}, {"black", line}}))}}),
      kMostShots);
}

const Shape& AnswerTo(const std::string& op) {
  static const Part error = {"error", Text(kLongestLine), true};
  static const std::vector<std::pair<std::string, Shape>> answers = {
      {"panel", Object({error, {"rows", List(Row(), kMostRows)}})},
      {"curves", Object({error, {"shots", Curves()}})},
      {"lasso", Object({error,
                        {"tracks", List(Pair(Whole(0, 2147483647.0)), MessageReader::kMostHead)},
                        {"places", List(Pair(Number(-1e9, 1e9)), MessageReader::kMostHead)}})},
      {"frame", Object({error, {"why", OneOf({"", "busy", "shot", "tracks", "gone"})}})}};
  static const Shape others = Object({error});
  for (const auto& [name, shape] : answers) {
    if (name == op) return shape;
  }
  return others;
}

struct Size {
  int width = 0, height = 0;
};

// Of a JPEG of one pass: others have passes without end, or are of another kind that browsers know
// too. None where something else stands before its frame than tables and notes.
std::optional<Size> SizeOf(std::string_view jpeg) {
  const auto at = [&jpeg](std::size_t place) { return static_cast<std::uint8_t>(jpeg[place]); };
  constexpr std::string_view kBegin = "\xff\xd8";
  constexpr int kBaseline = 0xc0;
  constexpr std::array kPassed = {0xc4, 0xdb, 0xdd, 0xfe};  // tables, restarts, notes
  constexpr int kFirstOfPrograms = 0xe0, kLastOfPrograms = 0xef;
  if (!jpeg.starts_with(kBegin)) return {};
  for (std::size_t place = kBegin.size(); place + 9 <= jpeg.size() && at(place) == 0xff;) {
    const int marker = at(place + 1);
    if (marker == kBaseline) {
      return Size{at(place + 7) << 8 | at(place + 8), at(place + 5) << 8 | at(place + 6)};
    }
    if ((marker < kFirstOfPrograms || marker > kLastOfPrograms) &&
        std::find(kPassed.begin(), kPassed.end(), marker) == kPassed.end()) {
      return {};
    }
    place += 2 + std::size_t{at(place + 2)} * 256 + at(place + 3);
  }
  return {};
}

}  // namespace

json ToldOf(const json& tells) {
  Expect(tells.is_object(), "what is told is no object");
  json told = json::object();
  for (const Part& part : Told()) {
    const auto found = tells.find(part.name);
    if (found != tells.end()) told[part.name] = part.shape(*found);
  }
  return told;
}

Message AnswerOf(const std::string& op, int width, const Message& answer) {
  Message heard;
  heard.head = AnswerTo(op)(answer.head);
  if (op != "frame" || answer.bytes.empty()) return heard;
  const std::optional<Size> size = SizeOf(answer.bytes);
  Expect(size && size->width <= width, "a picture is none, or too wide");
  // More than a page can draw.
  constexpr int kTallest = 16384;
  if (size->height > kTallest) {
    heard.head = {{"why", "gone"}, {"error", "the picture is too tall to be shown"}};
    return heard;
  }
  heard.bytes = answer.bytes;
  return heard;
}

}  // namespace calmframe::studio
