#include "host/media/yuv420.h"

#include <benchmark/benchmark.h>
#include <zimg.h>

#include <memory>
#include <random>
#include <vector>

#include "bench/side_by_side.h"

// Milliseconds of a frame of 4:2:0 in 8 bits to pixels and back. Beside it, turn by turn in the
// same run, zimg's graph of the same taps and matrix between planes: packing and unpacking come on
// top of that. The counter `ratio` is ours to zimg's, median to median. Arguments: width, height.
namespace {

using namespace calmframe::media;

struct FreeGraph {
  void operator()(zimg_filter_graph* graph) const { zimg_filter_graph_free(graph); }
};

std::unique_ptr<zimg_filter_graph, FreeGraph> GraphOf(int width, int height, bool to_pixels) {
  zimg_image_format yuv;
  zimg_image_format_default(&yuv, ZIMG_API_VERSION);
  yuv.width = static_cast<unsigned>(width);
  yuv.height = static_cast<unsigned>(height);
  yuv.pixel_type = ZIMG_PIXEL_BYTE;
  yuv.depth = 8;
  zimg_image_format rgb = yuv;
  rgb.color_family = ZIMG_COLOR_RGB;
  rgb.matrix_coefficients = ZIMG_MATRIX_RGB;
  rgb.pixel_range = ZIMG_RANGE_FULL;
  yuv.subsample_w = yuv.subsample_h = 1;
  yuv.color_family = ZIMG_COLOR_YUV;
  yuv.matrix_coefficients = ZIMG_MATRIX_BT709;
  yuv.pixel_range = ZIMG_RANGE_LIMITED;
  yuv.chroma_location = ZIMG_CHROMA_LEFT;
  zimg_graph_builder_params parameters;
  zimg_graph_builder_params_default(&parameters, ZIMG_API_VERSION);
  parameters.resample_filter_uv = ZIMG_RESIZE_BICUBIC;
  parameters.filter_param_a_uv = 0;
  parameters.filter_param_b_uv = 0.6;
  return std::unique_ptr<zimg_filter_graph, FreeGraph>(
      to_pixels ? zimg_filter_graph_build(&yuv, &rgb, &parameters)
                : zimg_filter_graph_build(&rgb, &yuv, &parameters));
}

template <bool to_pixels>
void BesideZimg(benchmark::State& state) {
  const int width = static_cast<int>(state.range(0)), height = static_cast<int>(state.range(1));
  const FramePtr yuv = NewPicture(AV_PIX_FMT_YUV420P, width, height);
  const FramePtr planes = NewPicture(AV_PIX_FMT_YUV444P, width, height);
  std::mt19937 random(1);
  const auto fill = [&](AVFrame& frame, int plane, int rows) {
    for (int i = 0; i < rows * frame.linesize[plane]; ++i) {
      frame.data[plane][i] = static_cast<std::uint8_t>(random());
    }
  };
  for (int p = 0; p < 3; ++p) {
    fill(*yuv, p, p > 0 ? height / 2 : height);
    fill(*planes, p, height);
  }
  std::vector<HX_Pixel8> pixels(static_cast<std::size_t>(width) * height);
  for (HX_Pixel8& pixel : pixels) {
    const auto byte = [&] { return static_cast<std::uint8_t>(random()); };
    pixel = {255, byte(), byte(), byte()};
  }
  const auto row_bytes = static_cast<std::ptrdiff_t>(sizeof(HX_Pixel8)) * width;
  Yuv420 own(width, height, ColourModel());
  const auto graph = GraphOf(width, height, to_pixels);
  std::size_t scratch_bytes = 0;
  if (!graph || zimg_filter_graph_get_tmp_size(graph.get(), &scratch_bytes) != 0) {
    return state.SkipWithError("zimg has no such graph");
  }
  const FramePtr scratch = NewPicture(AV_PIX_FMT_GRAY8, static_cast<int>(scratch_bytes), 1);
  zimg_image_buffer_const from{ZIMG_API_VERSION, {}};
  zimg_image_buffer to{ZIMG_API_VERSION, {}};
  for (int p = 0; p < 3; ++p) {
    AVFrame& source = to_pixels ? *yuv : *planes;
    AVFrame& target = to_pixels ? *planes : *yuv;
    from.plane[p] = {source.data[p], source.linesize[p], ZIMG_BUFFER_MAX};
    to.plane[p] = {target.data[p], target.linesize[p], ZIMG_BUFFER_MAX};
  }
  constexpr double kLimit = 1;
  side_by_side::Compare(
      state, kLimit, 1,
      [&] {
        if (to_pixels) {
          own.ToPixels(*yuv, pixels.data(), row_bytes);
        } else {
          own.FromPixels(pixels.data(), row_bytes, *yuv);
        }
      },
      [&] {
        zimg_filter_graph_process(graph.get(), &from, &to, scratch->data[0], nullptr, nullptr,
                                  nullptr, nullptr);
      });
}

BENCHMARK(BesideZimg<true>)
    ->Name("ToPixels")
    ->Args({1280, 720})
    ->Args({1920, 1080})
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond);
BENCHMARK(BesideZimg<false>)
    ->Name("FromPixels")
    ->Args({1280, 720})
    ->Args({1920, 1080})
    ->UseManualTime()
    ->Unit(benchmark::kMillisecond);

}  // namespace
