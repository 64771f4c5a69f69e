#include "stabilizer/render/deblur.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdlib>
#include <cstring>
#include <optional>
#include <vector>

#include "platform/tessel/threads.h"
#include "stabilizer/render/frame_pass.h"

namespace marrow::render {

using stabilization::point2;

namespace {

constexpr std::int32_t aligned_range = 2;

bool showsAligned(const DeblurSettings& settings) {
  return settings.debug == DeblurDebug::aligned_frame;
}

std::int64_t alignedOffset(const DeblurSettings& settings) {
  return static_cast<std::int64_t>(settings.aligned_frame);
}

// A stabilized frame's warp undoes the shake, so that its neighbours' warps tell how far the camera
// moved while the frame was taken.
double speed(const ClipWarps& warps, std::int64_t frame) {
  const auto last = static_cast<std::int64_t>(warps.frameCount()) - 1;
  const auto centre = [&](std::int64_t f) {
    const auto warp =
        warps.frameWarp(static_cast<std::size_t>(std::clamp<std::int64_t>(f, 0, last)));
    return warp->vertex(warp->cols / 2, warp->rows / 2);
  };
  const point2 before = centre(frame - 1), after = centre(frame + 1);
  return std::hypot(after.x - before.x, after.y - before.y);
}

// The frame whose pixels may be taken, which may lie outside the clip for the aligned view alone.
std::optional<std::int64_t> sharperFrame(const ClipWarps& warps, std::int64_t frame,
                                         const DeblurSettings& settings) {
  const bool aligned = showsAligned(settings);
  const std::int64_t range = aligned ? aligned_range : settings.range;
  const double own = speed(warps, frame);
  if (!(own > (aligned ? -1.0 : settings.frame_threshold))) return std::nullopt;
  std::optional<std::int64_t> slowest;
  double least = 0.0;
  // Steps of two: fields of opposite parity show different lines.
  for (std::int64_t j = frame - range + range % 2; j <= frame + range; j += 2) {
    if (j < 0 || j >= static_cast<std::int64_t>(warps.frameCount()) || j == frame) continue;
    const double candidate = speed(warps, j);
    if (!aligned && !(candidate < own)) continue;
    if (slowest && !(candidate < least)) continue;
    slowest = j;
    least = candidate;
  }
  if (slowest && aligned) return frame + alignedOffset(settings);
  return slowest;
}

// Calls visit(first, end) for bands of rows, on all processors.
template <class Visit>
void forRows(int height, const Visit& visit) {
  constexpr int band = 32;
  tessel::threads::ExecuteCPUBoundTaskOnAllProcessors(
      [&](std::size_t i) {
        const int first = static_cast<int>(i) * band;
        visit(first, std::min(first + band, height));
      },
      static_cast<std::size_t>((height + band - 1) / band));
}

template <class Pixel>
void copy(const WorldX<Pixel>& from, WorldX<Pixel>& to) {
  for (int y = 0; y < to.height(); ++y) {
    std::memcpy(static_cast<void*>(to.row(y)), from.row(y),
                sizeof(Pixel) * static_cast<std::size_t>(to.width()));
  }
}

// A depth's arithmetic. `full` is full scale; a weight is out of `full` too.
template <class Pixel>
struct depth;

template <class Channel, std::int32_t full_scale, int shift>
struct integer_depth {
  static constexpr float full = static_cast<float>(full_scale);
  static float difference(Channel a, Channel b) {
    return static_cast<float>(std::abs(std::int32_t{a} - std::int32_t{b}));
  }
  static Channel weight(float w) { return static_cast<Channel>(w * full + 0.5f); }
  static Channel mixed(Channel out, Channel sharper, Channel w) {
    const std::int32_t step = (std::int32_t{sharper} - std::int32_t{out}) * std::int32_t{w};
    return static_cast<Channel>(std::int32_t{out} + (step >> shift));
  }
};
template <>
struct depth<HX_Pixel8> : integer_depth<std::uint8_t, 255, 8> {};
template <>
struct depth<HX_Pixel16> : integer_depth<std::uint16_t, 32768, 15> {};
template <>
struct depth<HX_PixelFloat> {
  static constexpr float full = 1.0f;
  static float difference(float a, float b) { return std::fabs(a - b); }
  static float weight(float w) { return w; }
  static float mixed(float out, float sharper, float w) { return out + (sharper - out) * w; }
};

// How much of a row's sharper pixels may be taken, 0 to 1 each; b and c are the blurred ones.
template <class Pixel>
void weighRow(const Pixel* sharper, const Pixel* b, const Pixel* c, int width, float t1, float t2,
              float* weights) {
  using D = depth<Pixel>;
  for (int x = 0; x < width; ++x) {
    const float d = D::difference(b[x].red, c[x].red) + D::difference(b[x].green, c[x].green) +
                    D::difference(b[x].blue, c[x].blue);
    const float between = (t2 - d) / (t2 - t1);
    const float w = d <= t1 ? 1.0f : d < t2 ? between : 0.0f;
    weights[x] = sharper[x].alpha > 0 ? w : 0.0f;
  }
}

template <class Pixel>
void mixRow(const Pixel* sharper, const float* weights, int width, Pixel* out) {
  using D = depth<Pixel>;
  for (int x = 0; x < width; ++x) {
    if (!(weights[x] > 0.0f)) continue;
    if (weights[x] == 1.0f) {
      out[x] = sharper[x];
      continue;
    }
    const auto w = D::weight(weights[x]);
    out[x] = {D::mixed(out[x].alpha, sharper[x].alpha, w), D::mixed(out[x].red, sharper[x].red, w),
              D::mixed(out[x].green, sharper[x].green, w),
              D::mixed(out[x].blue, sharper[x].blue, w)};
  }
}

template <class Pixel>
void mapRow(const float* weights, int width, Pixel* out) {
  using D = depth<Pixel>;
  for (int x = 0; x < width; ++x) {
    const auto w = D::weight(weights[x]);
    out[x] = {D::weight(1.0f), w, w, w};
  }
}

}  // namespace

std::int32_t deblurReach(const DeblurSettings& settings) {
  if (settings.range <= 0 || !showsAligned(settings)) return std::max(settings.range, 0);
  return static_cast<std::int32_t>(std::abs(alignedOffset(settings)));
}

template <class Pixel>
void deblurFrame(const FramePass<Pixel>& pass, WorldX<Pixel>& output) {
  const DeblurSettings& settings = pass.settings.deblur;
  if (settings.range <= 0 || output.width() < 1 || output.height() < 1) return;
  const std::optional<std::int64_t> j =
      sharperFrame(pass.warps, static_cast<std::int64_t>(pass.frame), settings);
  if (!j) return;

  const int width = output.width(), height = output.height();
  WorldX<Pixel> sharper(width, height);
  const auto count = static_cast<std::int64_t>(pass.warps.frameCount());
  const bool found =
      *j >= 0 && *j < count && drawFrame(pass, static_cast<std::size_t>(*j), sharper);
  switch (settings.debug) {
    case DeblurDebug::blurred_sharper_frame:
      return pass.operations.Blur(sharper, output, settings.comparison_blur);
    case DeblurDebug::blurred_this_frame: {
      const WorldX<Pixel>& this_blurred = sharper;
      pass.operations.Blur(output, sharper, settings.comparison_blur);
      return copy(this_blurred, output);
    }
    case DeblurDebug::sharper_frame:
    case DeblurDebug::aligned_frame:
      return copy(sharper, output);
    case DeblurDebug::this_frame:
      return;
    default:
      break;
  }
  if (!found && !settings.show_map) return;

  WorldX<Pixel> sharper_blurred(width, height), this_blurred(width, height);
  pass.operations.Blur(sharper, sharper_blurred, settings.comparison_blur);
  pass.operations.Blur(output, this_blurred, settings.comparison_blur);
  const float t1 = settings.pixel_threshold * depth<Pixel>::full;
  const float t2 = settings.pixel_limit * depth<Pixel>::full;
  forRows(height, [&](int first, int end) {
    std::vector<float> weights(static_cast<std::size_t>(width));
    for (int y = first; y < end; ++y) {
      weighRow(sharper.row(y), sharper_blurred.row(y), this_blurred.row(y), width, t1, t2,
               weights.data());
      if (settings.show_map) {
        mapRow(weights.data(), width, output.row(y));
      } else {
        mixRow(sharper.row(y), weights.data(), width, output.row(y));
      }
    }
  });
}

template void deblurFrame(const FramePass<HX_Pixel8>&, WorldX<HX_Pixel8>&);
template void deblurFrame(const FramePass<HX_Pixel16>&, WorldX<HX_Pixel16>&);
template void deblurFrame(const FramePass<HX_PixelFloat>&, WorldX<HX_PixelFloat>&);

}  // namespace marrow::render
