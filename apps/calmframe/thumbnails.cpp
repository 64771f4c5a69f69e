#include "apps/calmframe/thumbnails.h"

#include <algorithm>
#include <nlohmann/json.hpp>

#include "apps/report/data_url.h"
#include "host/pixels/world_buffer.h"
#include "host/pixels/world_operations.h"

namespace calmframe {

std::size_t ThumbnailFrame(std::size_t frames) {
  constexpr std::size_t kSoon = 25;
  return std::min(frames / 2, kSoon);
}

nlohmann::ordered_json Thumbnails(const media::PictureView& before, const media::PictureView& after,
                                  const media::Ratio& pixel_aspect) {
  constexpr int kWidth = 160;  // pixels
  const double aspect =
      static_cast<double>(pixel_aspect.num) / static_cast<double>(pixel_aspect.den);
  return {{"before", report::DataUrlOf(before, aspect, kWidth)},
          {"after", report::DataUrlOf(after, aspect, kWidth)}};
}

nlohmann::ordered_json Thumbnails(const HX_World& before, const HX_World& after,
                                  const media::Ratio& pixel_aspect) {
  host::WorldBuffer shot(before.width, before.height, HX_FORMAT_ARGB8);
  host::WorldBuffer steady(after.width, after.height, HX_FORMAT_ARGB8);
  host::CopyWorld(before, shot.world(), nullptr, nullptr);
  host::CopyWorld(after, steady.world(), nullptr, nullptr);
  const auto view = [](host::WorldBuffer& pixels) {
    const HX_World& world = pixels.world();
    return media::PictureView{pixels.row<HX_Pixel8>(0), world.row_bytes, world.width, world.height};
  };
  return Thumbnails(view(shot), view(steady), pixel_aspect);
}

}  // namespace calmframe
