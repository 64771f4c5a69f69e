#pragma once

#include <cstddef>
#include <nlohmann/json_fwd.hpp>
#include <string>

#include "apps/report/data_url.h"
#include "host/media/clip.h"
#include "platform/hx/hx_world.h"

namespace calmframe {

// Which frame stands for a clip of so many: not its first, which may be black, and one that is
// decoded soon.
std::size_t ThumbnailFrame(std::size_t frames);

// Small pictures, as data URLs, in an object for batch's page.
nlohmann::ordered_json Thumbnails(const report::PictureView& before,
                                  const report::PictureView& after);
// The same of frames of any depth. pixel_aspect: of both.
nlohmann::ordered_json Thumbnails(const HX_World& before, const HX_World& after,
                                  const media::Ratio& pixel_aspect);

}  // namespace calmframe
