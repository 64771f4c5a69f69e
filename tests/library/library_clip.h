#pragma once

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

#include "library/calmframe.h"
#include "tests/support/drawn_clip.h"
#include "tests/support/scratch_folder.h"

namespace calmframe {

// A session that is closed at its end, and what its calls must end with.
class Opened {
 public:
  explicit Opened(const calmframe_options& options) {
    EXPECT_EQ(calmframe_open(&options, &handle_), CALMFRAME_OK) << Text(nullptr);
  }
  ~Opened() { Close(); }
  Opened(const Opened&) = delete;
  Opened& operator=(const Opened&) = delete;
  void Close() {
    if (!handle_) return;
    EXPECT_EQ(calmframe_close(handle_), CALMFRAME_OK);
    handle_ = nullptr;
  }

  operator calmframe_session() const { return handle_; }
  std::string Text() const { return Text(handle_); }
  static std::string Text(calmframe_session session) {
    std::string text(calmframe_error_text(session, nullptr, 0) + 1, 0);
    calmframe_error_text(session, text.data(), text.size());
    text.pop_back();
    return text;
  }
  // Started, and worked to its end.
  void Solve() const {
    ASSERT_EQ(calmframe_start(*this), CALMFRAME_OK) << Text();
    ASSERT_EQ(calmframe_wait(*this, -1), CALMFRAME_OK) << Text();
  }

 private:
  calmframe_session handle_ = nullptr;
};

// A frame of one plane, rows without a gap.
template <class Pixel>
calmframe_image ImageOf(const std::vector<Pixel>& pixels, int width, int height) {
  calmframe_image image{};
  image.width = width;
  image.height = height;
  image.plane[0] = const_cast<Pixel*>(pixels.data());
  image.stride[0] = static_cast<std::ptrdiff_t>(sizeof(Pixel)) * width;
  return image;
}

// A walk down a street, or one street behind the other: as a file, whose frames are just these, and
// as pixels.
struct Street {
  static constexpr int kWidth = 160, kHeight = 120, kFrames = 24;

  explicit Street(const std::vector<unsigned>& seeds = {7}) {
    media::EncodeSettings lossless;
    lossless.codec = "ffv1";
    lossless.pixel_format = "bgra";
    const media::ClipInfo info = Made(kWidth, kHeight, kFrames * seeds.size(), 25);
    synthetic::scene_options options;
    options.width = kWidth;
    options.height = kHeight;
    options.frame_count = kFrames;
    std::vector<synthetic::scene> scenes;
    for (const unsigned seed : seeds) {
      scenes.emplace_back(synthetic::street(seed), synthetic::handheld_path({}), options);
    }
    WriteClip(
        path, info,
        [&](int frame, HX_Pixel8* pixels) {
          scenes[frame / kFrames].render(frame % kFrames, pixels, kWidth);
          frames.emplace_back(pixels, pixels + std::size_t{kWidth} * kHeight);
        },
        lossless);
  }

  calmframe_options Options() const {
    calmframe_options options;
    calmframe_options_init(&options);
    options.width = kWidth;
    options.height = kHeight;
    options.format = CALMFRAME_ARGB;
    options.frame_count = static_cast<std::int64_t>(frames.size());
    return options;
  }
  // The same, where the frames are fetched.
  calmframe_options Fetching() {
    calmframe_options options = Options();
    options.user = this;
    options.fetch = [](void* user, std::int64_t frame, calmframe_image* image) -> std::int32_t {
      auto& street = *static_cast<Street*>(user);
      street.asked.push_back(frame);
      if (frame == street.refused) return 7;
      for (int y = 0; y < kHeight; ++y) {
        std::memcpy(static_cast<char*>(image->plane[0]) + image->stride[0] * y,
                    street.frames[frame].data() + std::size_t{kWidth} * y, kWidth * 4);
      }
      return 0;
    };
    return options;
  }
  calmframe_image Image(std::int64_t frame) const {
    return ImageOf(frames[frame], kWidth, kHeight);
  }
  void PushAll(calmframe_session session) const {
    for (int f = 0; f < kFrames; ++f) {
      const calmframe_image image = Image(f);
      ASSERT_EQ(calmframe_push(session, f, &image), CALMFRAME_OK) << Opened::Text(session);
    }
  }
  // Drawn steady. `source`: handed in, or to be fetched.
  std::vector<HX_Pixel8> Steady(calmframe_session session, std::int64_t frame,
                                bool source = true) const {
    std::vector<HX_Pixel8> pixels(frames[frame].size());
    const calmframe_image out = ImageOf(pixels, kWidth, kHeight), image = Image(frame);
    EXPECT_EQ(calmframe_render(session, frame, source ? &image : nullptr, &out), CALMFRAME_OK)
        << Opened::Text(session);
    return pixels;
  }

  const ScratchFolder folder;
  const std::string path = folder.In("street.mkv");
  std::vector<std::vector<HX_Pixel8>> frames;
  std::vector<std::int64_t> asked;  // of the fetching session
  std::int64_t refused = -1;        // frame that it doesn't get
};

}  // namespace calmframe
