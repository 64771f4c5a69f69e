#include "studio/wire/settings.h"

#include <array>
#include <charconv>
#include <cmath>
#include <limits>
#include <nlohmann/json.hpp>
#include <stdexcept>
#include <string>
#include <utility>

namespace calmframe::studio {
namespace {

using host::Still;
using Kind = host::WindowSettings::Kind;

constexpr std::array<std::pair<const char*, Kind>, 3> kKinds = {
    {{"auto", Kind::by_controls}, {"follow", Kind::follow}, {"steady", Kind::steady}}};
constexpr std::array<std::pair<const char*, Still>, 4> kStills = {
    {{"auto", Still::automatic},
     {"all", Still::all},
     {"background", Still::background},
     {"subject", Still::subject}}};

template <class Names, class Value>
std::string NameOf(const Names& names, Value value) {
  for (const auto& [name, named] : names) {
    if (named == value) return name;
  }
  return "";
}

template <class Names>
auto Named(const Names& names, const nlohmann::json& json, const std::string& what) {
  for (const auto& [name, named] : names) {
    if (json == name) return named;
  }
  throw std::invalid_argument(what + ": there is no such choice");
}

constexpr std::size_t kMostControls = 500;

double NumberOf(const nlohmann::json& json, const std::string& what, double least, double most) {
  const double number = json.is_number() ? json.get<double>() : std::nan("");
  if (!(number >= least && number <= most)) throw std::invalid_argument(what + ": out of range");
  return number;
}

}  // namespace

nlohmann::json JsonOf(const Settings& settings) {
  nlohmann::json json = {{"controls", nlohmann::json::object()},
                         {"window", nlohmann::json::object()}};
  for (const auto& [id, value] : settings.controls) json["controls"][std::to_string(id)] = value;
  const host::WindowSettings& window = settings.window;
  nlohmann::json& shown = json["window"];
  if (window.kind != Kind::by_controls) shown["kind"] = NameOf(kKinds, window.kind);
  if (window.most_zoom > 0) shown["most_zoom"] = window.most_zoom;
  if (window.zoom_speed) shown["zoom_speed"] = *window.zoom_speed;
  if (window.still != Still::automatic) shown["still"] = NameOf(kStills, window.still);
  if (window.as_set) shown["as_set"] = true;
  for (const host::TrackPoint& point : settings.deleted) {
    json["deleted"].push_back({point.frame, point.slot});
  }
  return json;
}

Settings SettingsOf(const nlohmann::json& json) {
  Settings settings;
  if (!json.is_object()) throw std::invalid_argument("settings are an object");
  const nlohmann::json controls = json.value("controls", nlohmann::json::object());
  const nlohmann::json window = json.value("window", nlohmann::json::object());
  if (!controls.is_object() || !window.is_object()) {
    throw std::invalid_argument("controls and window are objects");
  }
  if (controls.size() > kMostControls) throw std::invalid_argument("no effect has such controls");
  for (const auto& [key, value] : controls.items()) {
    std::int32_t id = 0;
    const auto [end, error] = std::from_chars(key.data(), key.data() + key.size(), id);
    if (error != std::errc() || end != key.data() + key.size()) {
      throw std::invalid_argument("controls go by number");
    }
    settings.controls[id] = NumberOf(value, "control " + key, -1e9, 1e9);
  }
  for (const auto& [key, value] : window.items()) {
    if (key == "kind") settings.window.kind = Named(kKinds, value, "window");
    if (key == "still") settings.window.still = Named(kStills, value, "steady");
    if (key == "most_zoom") settings.window.most_zoom = NumberOf(value, "zoom at most", 1, 100);
    if (key == "zoom_speed") settings.window.zoom_speed = NumberOf(value, "zoom speed", 0, 1000);
    if (key == "as_set") settings.window.as_set = value == true;
  }
  const nlohmann::json deleted = json.value("deleted", nlohmann::json::array());
  if (!deleted.is_array()) throw std::invalid_argument("deleted tracks are a list");
  if (deleted.size() > kMostDeletedTracks) {
    throw std::invalid_argument("more tracks than can be deleted one by one");
  }
  for (const nlohmann::json& point : deleted) {
    if (!point.is_array() || point.size() != 2) {
      throw std::invalid_argument("a track is a frame and a slot");
    }
    constexpr double kMost = std::numeric_limits<std::int32_t>::max();
    settings.deleted.insert(
        {static_cast<std::int32_t>(NumberOf(point[0], "a track's frame", 0, kMost)),
         static_cast<std::int32_t>(NumberOf(point[1], "a track's slot", 0, kMost))});
  }
  return settings;
}

}  // namespace calmframe::studio
