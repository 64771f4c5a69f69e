#include "apps/report/data_url.h"

extern "C" {
#include <libavutil/base64.h>
}

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <new>

namespace calmframe::report {
namespace {

// About 85 on the scale that other programs have.
constexpr int kQuantizer = 3;

std::string Base64Of(const std::string& bytes) {
  std::string text(AV_BASE64_SIZE(bytes.size()), '\0');
  if (!av_base64_encode(text.data(), static_cast<int>(text.size()),
                        reinterpret_cast<const std::uint8_t*>(bytes.data()),
                        static_cast<int>(bytes.size()))) {
    throw std::bad_alloc();
  }
  text.pop_back();  // the terminating zero
  return text;
}

}  // namespace

std::string DataUrlOf(const media::PictureView& picture, double pixel_aspect, int width) {
  width = std::clamp(width, 1, picture.width);
  const double shape = picture.width * pixel_aspect / picture.height;
  const int height = std::clamp(static_cast<int>(std::lround(width / shape)), 1, picture.height);
  return "data:image/jpeg;base64," +
         Base64Of(media::JpegEncoder().Encode({picture}, width, height, kQuantizer));
}

}  // namespace calmframe::report
