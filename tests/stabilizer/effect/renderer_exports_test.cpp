#include <dlfcn.h>
#include <gtest/gtest.h>

#include <atomic>
#include <boost/make_shared.hpp>
#include <boost/weak_ptr.hpp>
#include <stdexcept>
#include <thread>
#include <vector>

#include "platform/hx/hx_exports.h"
#include "stabilizer/effect/src/shared_data.h"
#include "stabilizer/effect/src/stabilizer_effect.h"
#include "tests/stabilizer/effect/stabilizer_host.h"

namespace kelp::effect {
namespace {

class RendererExportsTest : public ::testing::Test {
 protected:
  RendererExportsTest() : library_(dlopen(CALMFRAME_PLUGIN, RTLD_NOW | RTLD_LOCAL)) {
    Find(allow, HX_EXPORT_ALLOW_CUDA_RENDERING);
    Find(warp, HX_EXPORT_GET_VAR_VECTOR);
    Find(window, HX_EXPORT_GET_CROP_WINDOW);
    Find(data, HX_EXPORT_GET_STABILIZER_DATA);
  }
  ~RendererExportsTest() override {
    if (library_) dlclose(library_);
  }
  void SetUp() override { ASSERT_TRUE(allow && warp && window && data) << dlerror(); }

  HX_AllowCUDARendering allow = nullptr;
  HX_GetOVVarVector warp = nullptr;
  HX_GetCropWindow window = nullptr;
  HX_GetStabilizerData data = nullptr;

 private:
  template <class Function>
  void Find(Function& function, const char* name) {
    if (library_) function = reinterpret_cast<Function>(dlsym(library_, name));
  }
  void* library_;
};

// What a renderer outside gets of a block.
TEST_F(RendererExportsTest, ABlocksAnswers) {
  std::int32_t n[8];
  float f[4];
  const auto reset = [&] {
    std::fill(std::begin(n), std::end(n), -77);
    std::fill(std::begin(f), std::end(f), -77.0f);
  };
  const auto ask = [&](const void* block) {
    return data(block, &n[0], &n[1], &n[2], &n[3], &n[4], &n[5], &f[0], &f[1], &f[2], &f[3], &n[6],
                &n[7]);
  };
  StabilizerSharedData block;
  for (const StabilizerSharedData* none : {static_cast<StabilizerSharedData*>(nullptr), &block}) {
    reset();
    EXPECT_EQ(allow(none), 0);
    EXPECT_EQ(warp(none, 0), nullptr);
    window(none, 0, &f[0], &f[1], &f[2], &f[3]);
    EXPECT_FALSE(ask(none));
    for (const std::int32_t word : n) EXPECT_EQ(word, -77);
    for (const float word : f) EXPECT_EQ(word, -77);
  }

  block.contents.warper = ShiftingWarper(64, 48, {{0, 0}, {10, -6}});
  block.contents.first_frame = 5;
  block.contents.source_width = 60;
  block.contents.source_height = 48;
  block.contents.gpu_allowed = true;
  EXPECT_EQ(allow(&block), 1);
  const HX_VarVector* const record = warp(&block, 1);
  ASSERT_TRUE(record);
  const auto& own = *block.contents.warper->frameWarp(1);
  EXPECT_EQ(record->values, own.values.data());
  EXPECT_EQ(record->columns, own.cols);
  EXPECT_EQ(record->rows, own.rows);
  EXPECT_THROW(warp(&block, 2), std::out_of_range);
  EXPECT_THROW(warp(&block, -1), std::out_of_range);
  reset();
  window(&block, 0, &f[0], &f[1], &f[2], &f[3]);
  EXPECT_EQ(f[0], -77);
  ASSERT_TRUE(ask(&block));
  const auto& grid = *block.contents.warper;
  const std::int32_t numbers[] = {2, 5, grid.gridCols(), grid.gridRows(), -77, -77, 60, 48};
  EXPECT_TRUE(std::equal(std::begin(n), std::end(n), numbers));
  const float bounds[] = {0, -6, 73, 47};
  EXPECT_TRUE(std::equal(std::begin(f), std::end(f), bounds));

  const auto crop = boost::make_shared<cropper>(2, 74, 54);
  crop->cropWidth = 40;
  crop->cropHeight = 30;
  crop->rects[1] = {1, 2, 3, 4};  // left, right, top, bottom
  block.contents.crop = crop;
  ASSERT_TRUE(ask(&block));
  EXPECT_EQ(n[4], 40);
  EXPECT_EQ(n[5], 30);
  window(&block, 1, &f[0], &f[1], &f[2], &f[3]);
  const float rect[] = {1, 3, 2, 4};
  EXPECT_TRUE(std::equal(std::begin(f), std::end(f), rect));
}

TEST_F(RendererExportsTest, AThreadsWarpOutlivesTheSolveItCameFrom) {
  StabilizerHost test;
  StabilizerState& state = test.Solved(ShiftingWarper(64, 48, {{0, 0}, {3, 5}}), nullptr);
  const HX_VarVector* const drawn = warp(state.shared, 1);
  EXPECT_THROW(warp(state.shared, 2), std::out_of_range);  // and lets go of nothing
  const boost::weak_ptr<const marrow::stabilization::VarVector> record = state.warper->frameWarp(1);
  state.warper = ShiftingWarper(64, 48, {{9, 9}});
  test.Effect().PublishSharedData();
  std::thread([&] { EXPECT_EQ(warp(state.shared, 0)->values[0], 9); }).join();
  EXPECT_EQ(drawn->values[0], 3);
  EXPECT_DOUBLE_EQ(drawn->values[2 * drawn->columns * drawn->rows - 1], 47 + 5);
  EXPECT_FALSE(record.expired());
  EXPECT_EQ(warp(nullptr, 0), nullptr);
  EXPECT_TRUE(record.expired());
}

// Four renderers outside read and draw while a hundred solves and framings are made.
TEST_F(RendererExportsTest, ReadWhileTheUserInterfaceSolves) {
  constexpr std::int32_t kFrames = 6;
  StabilizerHost test;
  test.host.in.width = 64;
  test.host.in.height = 48;
  auto table = ShakenTable(kFrames, 20);
  for (auto& cell : *table.features) {
    cell.x /= 10;
    cell.y /= 8;
  }
  const StabilizerSharedData* const block = test.Analysed(table).shared;
  std::atomic<bool> end{false};
  std::atomic<int> drawn{0}, allowed{0};
  std::vector<std::thread> readers;
  for (int i = 0; i < 4; ++i) {
    readers.emplace_back([&, i] {
      for (std::int32_t frame = i; !end; frame = (frame + 1) % kFrames) {
        allowed += allow(block);
        std::int32_t n[8];
        float bounds[4];
        const HX_VarVector* record = nullptr;
        if (!data(block, &n[0], &n[1], &n[2], &n[3], &n[4], &n[5], &bounds[0], &bounds[1],
                  &bounds[2], &bounds[3], &n[6], &n[7]) ||
            !(record = warp(block, frame))) {
          continue;
        }
        EXPECT_EQ(n[0], kFrames);
        EXPECT_EQ(record->columns, n[2]);
        EXPECT_EQ(record->rows, n[3]);
        float rect[4] = {-1, -1, -1, -1};  // left, top, right, bottom
        window(block, frame, &rect[0], &rect[1], &rect[2], &rect[3]);
        EXPECT_LE(rect[0], rect[2]);
        EXPECT_LE(rect[1], rect[3]);
        EXPECT_THROW(warp(block, kFrames), std::out_of_range);
        // What a renderer draws with stays whole: the frame's middle is near its place.
        const std::int32_t vertices = record->columns * record->rows;
        double x = 0, y = 0;
        for (std::int32_t v = 0; v < vertices; ++v) {
          x += record->values[2 * v] / vertices;
          y += record->values[2 * v + 1] / vertices;
        }
        EXPECT_NEAR(x, 31.5, 8);
        EXPECT_NEAR(y, 23.5, 8);
        ++drawn;
      }
    });
  }
  int framings = 0;
  for (int change = 0; change < 100; ++change) {
    {
      const std::lock_guard<std::recursive_mutex> lock(test.host.mutex());
      if (change % 2 == 0) {
        test.Set(kSmoothnessIndex, 20 + change);
      } else {
        test.Set(kMaximumScaleIndex, 110 + change);
      }
    }
    const auto warper = test.state()->warper;
    test.TickUntilSolved();
    framings += warper && test.state()->warper->frameWarp(0) == warper->frameWarp(0);
  }
  while (drawn < 100) std::this_thread::yield();
  end = true;
  for (std::thread& reader : readers) reader.join();
  EXPECT_EQ(framings, 50);
  EXPECT_GT(allowed, 0);
}

}  // namespace
}  // namespace kelp::effect
