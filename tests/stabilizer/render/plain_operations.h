#pragma once

#include <algorithm>
#include <cmath>
#include <type_traits>
#include <vector>

#include "stabilizer/render/frame_renderer.h"

// A render's operations in doubles, a pixel at a time.
template <class Pixel>
class PlainOperations final : public WorldOperations<Pixel> {
 public:
  void TransferBehind(const WorldX<Pixel>& from, int x, int y, WorldX<Pixel>& to) override {
    for (int v = 0; v < from.height(); ++v) {
      for (int u = 0; u < from.width(); ++u) {
        if (u + x < 0 || v + y < 0 || u + x >= to.width() || v + y >= to.height()) continue;
        const Pixel& back = from.row(v)[u];
        Pixel& front = to.row(v + y)[u + x];
        if (back.alpha == 0 && front.alpha != 0) continue;
        const double front_alpha = front.alpha / kFull;
        const double behind = back.alpha / kFull * (1 - front_alpha);
        const double alpha = front_alpha + behind;
        const auto mix = [&](double f, double b) {
          return alpha > 0 ? (f * front_alpha + b * behind) / alpha : 0;
        };
        front = {Stored(alpha * kFull), Stored(mix(front.red, back.red)),
                 Stored(mix(front.green, back.green)), Stored(mix(front.blue, back.blue))};
      }
    }
  }

  void Blur(const WorldX<Pixel>& from, WorldX<Pixel>& to, float radius) override {
    const double sigma = radius / 2.0;
    const int reach = static_cast<int>(std::ceil(3 * sigma));
    const auto weight = [&](int i) {
      return sigma > 0 ? std::exp(-0.5 * i * i / (sigma * sigma)) : 1;
    };
    for (int y = 0; y < from.height(); ++y) {
      for (int x = 0; x < from.width(); ++x) {
        double sum[4] = {}, weights = 0;
        for (int v = -reach; v <= reach; ++v) {
          for (int u = -reach; u <= reach; ++u) {
            const Pixel& p = from.row(
                std::clamp(y + v, 0, from.height() - 1))[std::clamp(x + u, 0, from.width() - 1)];
            const double w = weight(u) * weight(v);
            const double channels[4] = {double(p.alpha), double(p.red), double(p.green),
                                        double(p.blue)};
            for (int i = 0; i < 4; ++i) sum[i] += w * channels[i];
            weights += w;
          }
        }
        to.row(y)[x] = {Stored(sum[0] / weights), Stored(sum[1] / weights),
                        Stored(sum[2] / weights), Stored(sum[3] / weights)};
      }
    }
  }

 private:
  using Channel = decltype(Pixel::alpha);
  static constexpr double kFull = std::is_same_v<Channel, float> ? 1
                                  : sizeof(Channel) == 2         ? 32768
                                                                 : 255;
  static Channel Stored(double value) {
    if constexpr (std::is_same_v<Channel, float>)
      return static_cast<float>(value);
    else
      return static_cast<Channel>(value + 0.5);
  }
};
