#include "apps/calmframe/thumbnails.h"

#include <algorithm>
#include <nlohmann/json.hpp>

#include "host/pixels/world_buffer.h"
#include "host/pixels/world_operations.h"

namespace calmframe {

std::size_t ThumbnailFrame(std::size_t frames) {
  constexpr std::size_t kSoon = 25;
  return std::min(frames / 2, kSoon);
}

nlohmann::ordered_json Thumbnails(const report::PictureView& before,
                                  const report::PictureView& after) {
  constexpr int kWidth = 160;  // pixels
  return {{"before", report::DataUrlOf(before, kWidth)},
          {"after", report::DataUrlOf(after, kWidth)}};
}

nlohmann::ordered_json Thumbnails(const HX_World& before, const HX_World& after,
                                  const media::Ratio& pixel_aspect) {
  const double aspect =
      static_cast<double>(pixel_aspect.num) / static_cast<double>(pixel_aspect.den);
  host::WorldBuffer shot(before.width, before.height, HX_FORMAT_ARGB8);
  host::WorldBuffer steady(after.width, after.height, HX_FORMAT_ARGB8);
  host::CopyWorld(before, shot.world(), nullptr, nullptr);
  host::CopyWorld(after, steady.world(), nullptr, nullptr);
  const auto view = [aspect](host::WorldBuffer& pixels) {
    const HX_World& world = pixels.world();
    return report::PictureView{pixels.row<HX_Pixel8>(0), world.row_bytes, world.width, world.height,
                               aspect};
  };
  return Thumbnails(view(shot), view(steady));
}

}  // namespace calmframe
