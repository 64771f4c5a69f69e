#include "stabilization/crop/crop_path.h"

#include <algorithm>
#include <cmath>

namespace marrow::stabilization {

namespace {

constexpr float min_bilateral_weight = 1e-8f;  // keeps the sum of weights above 0

void set_windows(std::vector<crop_rect>& rects, std::size_t f, float left, float top,
                 crop_size size) {
  rects[f] = {left, static_cast<float>(size.width) + left - 1, top,
              static_cast<float>(size.height) + top - 1};
}

crop_size intersect_all(std::vector<crop_rect>& rects) {
  crop_rect common = rects[0];
  for (const crop_rect& rect : rects) {
    common.left = std::max(common.left, rect.left);
    common.right = std::min(common.right, rect.right);
    common.top = std::max(common.top, rect.top);
    common.bottom = std::min(common.bottom, rect.bottom);
  }
  const crop_size size{std::max(0, static_cast<std::int32_t>(common.right - common.left + 1.0f)),
                       std::max(0, static_cast<std::int32_t>(common.bottom - common.top + 1.0f))};
  for (std::size_t f = 0; f < rects.size(); ++f) {
    set_windows(rects, f, common.left, common.top, size);
  }
  return size;
}

// gaussian[d] for a distance of d frames.
std::vector<float> smoothed(const std::vector<float>& path, const std::vector<float>& gaussian,
                            bool bilateral, float bilateral_sigma) {
  const auto n = static_cast<std::int64_t>(path.size());
  const auto radius = static_cast<std::int64_t>(gaussian.size()) - 1;
  const float b2 = bilateral_sigma * bilateral_sigma;
  std::vector<float> result(path.size());
  for (std::int64_t i = 0; i < n; ++i) {
    float sum = 0;
    float weights = 0;
    for (std::int64_t j = std::max<std::int64_t>(i - radius, 0);
         j <= std::min<std::int64_t>(i + radius, n - 1); ++j) {
      float w = gaussian[static_cast<std::size_t>(std::abs(i - j))];
      if (bilateral) {
        const float e = path[static_cast<std::size_t>(j)] - path[static_cast<std::size_t>(i)];
        w = std::max(w * std::exp(-(e * e) / b2), min_bilateral_weight);
      }
      sum += w * path[static_cast<std::size_t>(j)];
      weights += w;
    }
    result[static_cast<std::size_t>(i)] = sum / weights;
  }
  return result;
}

std::vector<float> gaussian_table(float sigma, std::size_t frames) {
  std::vector<float> table = {1.0f};
  if (!(sigma > 0)) return table;
  const float reach = std::min(4.0f * sigma, static_cast<float>(frames - 1));
  for (std::int64_t d = 1; d <= static_cast<std::int64_t>(reach); ++d) {
    const auto distance = static_cast<float>(d);
    table.push_back(std::exp(-(distance * distance) / (sigma * sigma)));
  }
  return table;
}

}  // namespace

crop_size smooth_crop_path(std::vector<crop_rect>& rects, bool bilateral, float sigma,
                           float bilateral_sigma, bool constant) {
  if (rects.empty()) return {};
  if (constant) return intersect_all(rects);

  std::vector<float> cx;
  std::vector<float> cy;
  for (const crop_rect& rect : rects) {
    cx.push_back((rect.left + rect.right) * 0.5f);
    cy.push_back((rect.top + rect.bottom) * 0.5f);
  }
  const std::vector<float> gaussian = gaussian_table(sigma, rects.size());
  cx = smoothed(cx, gaussian, bilateral, bilateral_sigma);
  cy = smoothed(cy, gaussian, bilateral, bilateral_sigma);

  // The extents to both sides of the centre that every frame has. The height's start from the width
  // too, which limits only clips much taller than wide.
  float to_left = rects[0].right - rects[0].left + 1.0f;
  float to_right = to_left;
  float to_top = to_left;
  float to_bottom = to_left;
  for (std::size_t f = 0; f < rects.size(); ++f) {
    to_left = cx[f] - std::max(rects[f].left, cx[f] - to_left);
    to_right = std::min(rects[f].right, cx[f] + to_right) - cx[f];
    to_top = cy[f] - std::max(rects[f].top, cy[f] - to_top);
    to_bottom = std::min(rects[f].bottom, cy[f] + to_bottom) - cy[f];
  }
  const crop_size size{static_cast<std::int32_t>(to_left + to_right + 1.5f),
                       static_cast<std::int32_t>(to_top + to_bottom + 1.5f)};
  for (std::size_t f = 0; f < rects.size(); ++f) {
    set_windows(rects, f, cx[f] - to_left, cy[f] - to_top, size);
  }
  return size;
}

}  // namespace marrow::stabilization
