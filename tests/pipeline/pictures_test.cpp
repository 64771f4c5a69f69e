#include "pipeline/pictures.h"

#include <gtest/gtest.h>

#include <type_traits>

namespace calmframe::pipeline {
namespace {

// Frames whose pixel (x, y) is 10 y + x, plus 100 a frame.
class Ramp final : public media::ClipReader {
 public:
  explicit Ramp(media::FieldOrder order) {
    info_.width = 3;
    info_.height = 5;
    info_.frame_count = 2;
    info_.field_order = order;
  }
  const media::ClipInfo& info() const override { return info_; }
  void Read(std::size_t f, HX_Pixel8* p, std::ptrdiff_t r) override { Fill(f, p, r); }
  void Read(std::size_t f, HX_Pixel16* p, std::ptrdiff_t r) override { Fill(f, p, r); }
  void Read(std::size_t f, HX_PixelFloat* p, std::ptrdiff_t r) override { Fill(f, p, r); }
  int reads = 0;

 private:
  template <class Pixel>
  void Fill(std::size_t frame, Pixel* pixels, std::ptrdiff_t row_bytes) {
    ++reads;
    WorldX<Pixel> world(info_.width, info_.height, row_bytes, pixels);
    using Sample = decltype(Pixel::red);
    for (int y = 0; y < info_.height; ++y) {
      for (int x = 0; x < info_.width; ++x) {
        const auto v = static_cast<Sample>(100 * frame + 10 * y + x);
        world.row(y)[x] = {static_cast<Sample>(1), v, v, v};
      }
    }
  }
  media::ClipInfo info_;
};

template <class Pixel>
class PicturesOf : public ::testing::Test {};
using Depths = ::testing::Types<HX_Pixel8, HX_Pixel16, HX_PixelFloat>;
TYPED_TEST_SUITE(PicturesOf, Depths);

TYPED_TEST(PicturesOf, AFieldFillsItsFrameFromItsOwnLines) {
  Ramp clip(media::FieldOrder::top_first);
  PictureReader<TypeParam> reader(clip);
  ASSERT_EQ(reader.pictures().count(), 4u);
  const auto row = [&](std::size_t picture, int y) {
    return static_cast<double>(reader.Read(picture)->row(y)[2].green);
  };
  // Lines 0 2 4 of frame 1, with 1 and 3 between them.
  EXPECT_EQ(row(2, 0), 102);
  EXPECT_EQ(row(2, 1), 112);
  EXPECT_EQ(row(2, 4), 142);
  // Lines 1 and 3, and the nearest of them at the edges.
  EXPECT_EQ(row(3, 0), 112);
  EXPECT_EQ(row(3, 1), 112);
  EXPECT_EQ(row(3, 2), 122);
  EXPECT_EQ(row(3, 4), 132);
  EXPECT_EQ(clip.reads, 1) << "both fields come from one frame";
  EXPECT_EQ(row(2, 0), 102) << "the frame is kept whole";
}

TYPED_TEST(PicturesOf, TheFieldShotFirstIsThePictureBefore) {
  Ramp clip(media::FieldOrder::bottom_first);
  PictureReader<TypeParam> reader(clip);
  EXPECT_EQ(reader.Read(0)->row(0)[0].red, 10);
  EXPECT_EQ(reader.Read(1)->row(0)[0].red, 0);

  // Woven again, each line comes from its own picture.
  WorldX<TypeParam> woven(3, 5);
  for (std::size_t picture : {0, 1}) {
    CopyField(*reader.Read(picture), reader.pictures().parity_of(picture), woven);
  }
  for (int y = 0; y < 5; ++y) EXPECT_EQ(woven.row(y)[1].blue, 10 * y + 1);
}

TYPED_TEST(PicturesOf, AProgressiveFrameIsAPictureUntouched) {
  Ramp clip(media::FieldOrder::progressive);
  PictureReader<TypeParam> reader(clip);
  ASSERT_EQ(reader.pictures().count(), 2u);
  for (int y = 0; y < 5; ++y) EXPECT_EQ(reader.Read(1)->row(y)[0].red, 100 + 10 * y);
}

}  // namespace
}  // namespace calmframe::pipeline
