#include <gtest/gtest.h>

#include <boost/make_shared.hpp>

#include "tests/stabilizer/effect/shifted_clip.h"

// The numbers that a renderer outside of the plug-in gets; tests/contract asks what it may rely on.
namespace calmframe::host {
namespace {

class RendererExportsTest : public ShiftedClipTest {
 protected:
  const PluginExports& exports() { return hosted().host().library().exports(); }
  bool Ask(const void* block) {
    return exports().get_stabilizer_data(block, &n[0], &n[1], &n[2], &n[3], &n[4], &n[5], &f[0],
                                         &f[1], &f[2], &f[3], &n[6], &n[7]);
  }
  void Window(const void* block, std::int32_t frame) {
    exports().get_crop_window(block, frame, &f[0], &f[1], &f[2], &f[3]);
  }

  // Frames, first, columns, rows, width and height of the window, of the source.
  std::vector<std::int32_t> n = std::vector<std::int32_t>(8, -77);
  std::vector<float> f = std::vector<float>(4, -77.0f);
};

TEST_F(RendererExportsTest, ABlocksAnswers) {
  const std::vector<std::int32_t> no_numbers = n;
  const std::vector<float> no_bounds = f;
  const auto warper = kelp::effect::ShiftingWarper(kWidth, kHeight, {{0, 0}, {10, -6}});
  Load(warper, {{kFraming, 1}});
  EXPECT_FALSE(exports().allow_cuda_rendering(nullptr));
  EXPECT_FALSE(Ask(nullptr));
  Window(nullptr, 0);
  const void* const block = hosted().effect().opaque_data();
  Window(block, 0);  // without a crop
  EXPECT_EQ(n, no_numbers);
  EXPECT_EQ(f, no_bounds);

  const HX_VarVector* const record = exports().get_var_vector(block, 1);
  ASSERT_TRUE(record);
  EXPECT_EQ(record->columns, warper->gridCols());
  EXPECT_EQ(record->rows, warper->gridRows());
  EXPECT_EQ(record->values[0], 10);
  EXPECT_FLOAT_EQ(record->values[2 * record->columns * record->rows - 1], 47 - 6);
  ASSERT_TRUE(Ask(block));
  EXPECT_EQ(n, (std::vector<std::int32_t>{2, 0, warper->gridCols(), warper->gridRows(), -77, -77,
                                          kWidth, kHeight}));
  EXPECT_EQ(f, (std::vector<float>{0, -6, 73, 47}));

  hosted().Inside([](kelp::effect::StabilizerEffect& effect) {
    const auto crop = boost::make_shared<cropper>(2, 74, 54);
    crop->cropWidth = 40;
    crop->cropHeight = 30;
    crop->rects[1] = {1, 2, 3, 4};  // left, right, top, bottom
    KeepCrop(*effect.GetState(), crop);
    effect.PublishSharedData();
  });
  ASSERT_TRUE(Ask(block));
  EXPECT_EQ(n[4], 40);
  EXPECT_EQ(n[5], 30);
  Window(block, 1);
  EXPECT_EQ(f, (std::vector<float>{1, 3, 2, 4}));
}

}  // namespace
}  // namespace calmframe::host
