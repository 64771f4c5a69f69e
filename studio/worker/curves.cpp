#include "studio/worker/curves.h"

#include <cmath>
#include <nlohmann/json.hpp>
#include <vector>

#include "host/stabilize/camera_place.h"

namespace calmframe::studio {
namespace {

// Pages need no more than five digits, and have no word for what is no number.
nlohmann::json Rounded(double value) {
  if (!std::isfinite(value)) return nullptr;
  return std::round(value * 1e4) / 1e4;
}

nlohmann::json CameraOf(const host::ShownMotion& shown) {
  nlohmann::json json = {{"x", nlohmann::json::array()},
                         {"y", nlohmann::json::array()},
                         {"angle", nlohmann::json::array()},
                         {"zoom", nlohmann::json::array()}};
  for (const host::CameraPlace& place : host::PathOf(host::MotionsOf(shown))) {
    json["x"].push_back(Rounded(place.x));
    json["y"].push_back(Rounded(place.y));
    json["angle"].push_back(Rounded(place.angle));
    json["zoom"].push_back(Rounded(place.zoom));
  }
  return json;
}

nlohmann::json ListOf(const std::vector<double>& values) {
  nlohmann::json list = nlohmann::json::array();
  for (const double value : values) list.push_back(Rounded(value));
  return list;
}

}  // namespace

nlohmann::json CurvesOf(const host::ShownPath& path) {
  return {{"before", CameraOf(path.source)},
          {"after", CameraOf(path.output)},
          {"zooms", ListOf(path.output.zooms)},
          {"black", ListOf(path.output.uncovered)}};
}

}  // namespace calmframe::studio
