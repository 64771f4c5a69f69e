#pragma once

#include <zimg.h>

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <vector>

#include "host/media/colour_model.h"
#include "host/media/ffmpeg.h"
#include "host/media/yuv420.h"
#include "platform/hx/hx_pixel.h"

namespace calmframe::media {

// Planar YUV of 8 to 16 bits to pixels of 8 bits and back, by zimg: chroma by the bicubic of
// Keys (1981) with a = -0.6 at its tagged position, each field by itself in an interlaced 4:2:0
// frame; the matrix in floats, rounded once. Packed row by row, while a row is in the cache.
// Progressive 4:2:0 of 8 bits goes by Yuv420, to the same samples. Errors: std::bad_alloc;
// std::runtime_error where zimg refuses the colours.
class PlanarYuv {
 public:
  // Frames of whole chroma samples in this machine's byte order.
  static bool Takes(AVPixelFormat format, int width, int height);

  void ToPixels(const AVFrame& frame, const ColourModel& model, HX_Pixel8* pixels,
                std::ptrdiff_t row_bytes);
  // `frame` is one of NewPicture. Where it has no alpha, pixels stand over black.
  void FromPixels(const HX_Pixel8* pixels, std::ptrdiff_t row_bytes, const ColourModel& model,
                  AVFrame& frame);

 private:
  struct FreeGraph {
    void operator()(zimg_filter_graph* graph) const { zimg_filter_graph_free(graph); }
  };
  struct Key {
    int width = 0, height = 0, format = -1;
    bool to_pixels = false;
    ColourModel model;
    bool operator==(const Key&) const = default;
  };
  struct Graph {
    Key key;
    std::unique_ptr<zimg_filter_graph, FreeGraph> graph;
    std::size_t scratch = 0;
    unsigned rows = 0;  // of the ring beside the pixels, a power of two or all
  };
  const Graph& GraphFor(const Key& key, int part);
  // Byte: of the pixels, const where they are read.
  template <class Byte>
  void Process(const AVFrame& frame, const ColourModel& model, Byte* pixels,
               std::ptrdiff_t row_bytes);
  std::uint8_t* Memory(std::size_t bytes);
  // Null where the frame is zimg's.
  Yuv420* Own(const AVFrame& frame, const ColourModel& model);

  Graph graphs_[3];  // whole frame, top field, bottom field
  std::vector<std::uint8_t> memory_;
  FramePtr aligned_;
  std::optional<Yuv420> own_;
};

}  // namespace calmframe::media
