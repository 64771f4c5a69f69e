#pragma once

#include <string>

#include "host/media/jpeg.h"

namespace calmframe::report {

// A JPEG of `width` square pixels across, over black, as a data URL. pixel_aspect: width : height
// of one of the picture's. Throws what JpegEncoder does.
std::string DataUrlOf(const media::PictureView& picture, double pixel_aspect, int width);

}  // namespace calmframe::report
