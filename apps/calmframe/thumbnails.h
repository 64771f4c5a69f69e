#pragma once

#include <cstddef>
#include <nlohmann/json_fwd.hpp>
#include <string>

#include "host/media/clip.h"
#include "host/media/jpeg.h"
#include "platform/hx/hx_world.h"

namespace calmframe {

// Which frame stands for a clip of so many: not its first, which may be black, and one that is
// decoded soon.
std::size_t ThumbnailFrame(std::size_t frames);

// Small pictures, as data URLs, in an object for batch's page. pixel_aspect: of both.
nlohmann::ordered_json Thumbnails(const media::PictureView& before, const media::PictureView& after,
                                  const media::Ratio& pixel_aspect);
// The same of frames of any depth.
nlohmann::ordered_json Thumbnails(const HX_World& before, const HX_World& after,
                                  const media::Ratio& pixel_aspect);

}  // namespace calmframe
