#include "host/media/planar_yuv.h"

#include <bit>
#include <stdexcept>
#include <string>
#include <type_traits>

#include "host/media/pixel_planes.h"

namespace calmframe::media {
namespace {

constexpr std::size_t kAlignment = 32;  // of rows, as zimg asks
constexpr int kLargestChromaShift = 2;  // what zimg takes

bool Aligned(const AVFrame& frame) {
  for (int plane = 0; plane < 4 && frame.data[plane]; ++plane) {
    if (std::bit_cast<std::uintptr_t>(frame.data[plane]) % kAlignment != 0 ||
        frame.linesize[plane] % static_cast<int>(kAlignment) != 0) {
      return false;
    }
  }
  return true;
}

// One part of a picture in the host's pixels and the ring of rows that zimg works on beside it.
template <class Byte>
struct Rows {
  Byte* pixels;
  std::ptrdiff_t row_bytes;
  bool alpha;
  std::uint8_t* ring;
  std::size_t plane_bytes, ring_row_bytes;
  unsigned mask;

  std::uint8_t* Plane(int plane, unsigned row) const {
    return ring + static_cast<std::size_t>(plane) * plane_bytes + (row & mask) * ring_row_bytes;
  }
  Byte* Pixels(unsigned row) const { return pixels + static_cast<std::ptrdiff_t>(row) * row_bytes; }
};

int PackRow(void* user, unsigned row, unsigned left, unsigned right) {
  const auto& rows = *static_cast<const Rows<std::uint8_t>*>(user);
  const auto plane = [&](int p) { return rows.Plane(p, row) + left; };
  PackPixels({rows.alpha ? plane(3) : nullptr, plane(0), plane(1), plane(2)}, right - left,
             rows.Pixels(row) + 4 * std::size_t{left});
  return 0;
}

int UnpackRow(void* user, unsigned row, unsigned left, unsigned right) {
  const auto& rows = *static_cast<const Rows<const std::uint8_t>*>(user);
  const auto plane = [&](int p) { return rows.Plane(p, row) + left; };
  UnpackPixels(rows.Pixels(row) + 4 * std::size_t{left}, right - left,
               {rows.alpha ? plane(3) : nullptr, plane(0), plane(1), plane(2)});
  return 0;
}

void Check(zimg_error_code_e error) {
  if (error == ZIMG_ERROR_SUCCESS) return;
  char text[256] = {};
  zimg_get_last_error(text, sizeof text);
  zimg_clear_last_error();
  if (error == ZIMG_ERROR_OUT_OF_MEMORY) throw std::bad_alloc();
  throw std::runtime_error(std::string("no conversion of its colours: ") + text);
}

}  // namespace

bool PlanarYuv::Takes(AVPixelFormat format, int width, int height) {
  const AVPixFmtDescriptor* layout = av_pix_fmt_desc_get(format);
  if (!layout || !IsYuv(*layout) || !(layout->flags & AV_PIX_FMT_FLAG_PLANAR) ||
      layout->log2_chroma_w > kLargestChromaShift || layout->log2_chroma_h > kLargestChromaShift ||
      width % (1 << layout->log2_chroma_w) != 0 || height % (1 << layout->log2_chroma_h) != 0) {
    return false;
  }
  for (int c = 0; c < layout->nb_components; ++c) {
    const AVComponentDescriptor& component = layout->comp[c];
    const bool own_order = component.depth == 8 || !(layout->flags & AV_PIX_FMT_FLAG_BE);
    if (component.plane != c || component.shift != 0 || component.depth < 8 ||
        component.depth > 16 || component.step != (component.depth > 8 ? 2 : 1) || !own_order) {
      return false;
    }
  }
  return true;
}

const PlanarYuv::Graph& PlanarYuv::GraphFor(const Key& key, int part) {
  Graph& graph = graphs_[part];
  if (graph.graph && graph.key == key) return graph;
  const AVPixFmtDescriptor& layout =
      *NotNull(av_pix_fmt_desc_get(static_cast<AVPixelFormat>(key.format)));
  const bool alpha = (layout.flags & AV_PIX_FMT_FLAG_ALPHA) != 0;
  zimg_image_format yuv;
  zimg_image_format_default(&yuv, ZIMG_API_VERSION);
  yuv.width = static_cast<unsigned>(key.width);
  yuv.height = static_cast<unsigned>(key.height);
  yuv.field_parity = part == 0   ? ZIMG_FIELD_PROGRESSIVE
                     : part == 1 ? ZIMG_FIELD_TOP
                                 : ZIMG_FIELD_BOTTOM;
  yuv.alpha = alpha ? ZIMG_ALPHA_STRAIGHT : ZIMG_ALPHA_NONE;
  zimg_image_format rgb = yuv;
  rgb.pixel_type = ZIMG_PIXEL_BYTE;
  rgb.depth = 8;
  rgb.color_family = ZIMG_COLOR_RGB;
  rgb.matrix_coefficients = ZIMG_MATRIX_RGB;
  rgb.pixel_range = ZIMG_RANGE_FULL;
  yuv.depth = static_cast<unsigned>(layout.comp[0].depth);
  yuv.pixel_type = yuv.depth > 8 ? ZIMG_PIXEL_WORD : ZIMG_PIXEL_BYTE;
  yuv.subsample_w = layout.log2_chroma_w;
  yuv.subsample_h = layout.log2_chroma_h;
  yuv.color_family = ZIMG_COLOR_YUV;
  yuv.matrix_coefficients = static_cast<zimg_matrix_coefficients_e>(key.model.matrix);
  yuv.pixel_range = key.model.full_range ? ZIMG_RANGE_FULL : ZIMG_RANGE_LIMITED;
  static_assert(int{ZIMG_CHROMA_LEFT} == int{AVCHROMA_LOC_LEFT} - 1 &&
                int{ZIMG_CHROMA_BOTTOM} == int{AVCHROMA_LOC_BOTTOM} - 1);
  yuv.chroma_location = static_cast<zimg_chroma_location_e>(key.model.chroma - 1);
  zimg_graph_builder_params parameters;
  zimg_graph_builder_params_default(&parameters, ZIMG_API_VERSION);
  parameters.resample_filter_uv = ZIMG_RESIZE_BICUBIC;
  parameters.filter_param_a_uv = 0;
  parameters.filter_param_b_uv = 0.6;

  graph = {};
  graph.graph.reset(key.to_pixels ? zimg_filter_graph_build(&yuv, &rgb, &parameters)
                                  : zimg_filter_graph_build(&rgb, &yuv, &parameters));
  if (!graph.graph) Check(zimg_get_last_error(nullptr, 0));
  Check(zimg_filter_graph_get_tmp_size(graph.graph.get(), &graph.scratch));
  Check(key.to_pixels ? zimg_filter_graph_get_output_buffering(graph.graph.get(), &graph.rows)
                      : zimg_filter_graph_get_input_buffering(graph.graph.get(), &graph.rows));
  graph.key = key;
  return graph;
}

std::uint8_t* PlanarYuv::Memory(std::size_t bytes) {
  if (memory_.size() < bytes + kAlignment) memory_.resize(bytes + kAlignment);
  const std::size_t off = std::bit_cast<std::uintptr_t>(memory_.data()) % kAlignment;
  return memory_.data() + (kAlignment - off);
}

template <class Byte>
void PlanarYuv::Process(const AVFrame& frame, const ColourModel& model, Byte* pixels,
                        std::ptrdiff_t row_bytes) {
  constexpr bool kToPixels = !std::is_const_v<Byte>;
  const AVPixFmtDescriptor& layout =
      *NotNull(av_pix_fmt_desc_get(static_cast<AVPixelFormat>(frame.format)));
  const bool fields = ByFields(model, layout, frame.height);
  const int parts = fields ? 2 : 1;
  for (int p = 0; p < parts; ++p) {
    const Graph& graph = GraphFor(
        {frame.width, frame.height / parts, frame.format, kToPixels, model}, fields ? 1 + p : 0);
    const unsigned mask = zimg_select_buffer_mask(graph.rows);
    const std::size_t ring_row =
        (static_cast<std::size_t>(frame.width) + kAlignment - 1) / kAlignment * kAlignment;
    const std::size_t ring_rows =
        mask == ZIMG_BUFFER_MAX ? static_cast<std::size_t>(frame.height / parts) : mask + 1;
    const std::size_t scratch = (graph.scratch + kAlignment - 1) / kAlignment * kAlignment;
    std::uint8_t* const memory = Memory(scratch + 4 * ring_row * ring_rows);
    Rows<Byte> rows{pixels + p * row_bytes,
                    parts * row_bytes,
                    (layout.flags & AV_PIX_FMT_FLAG_ALPHA) != 0,
                    memory + scratch,
                    ring_row * ring_rows,
                    ring_row,
                    mask};
    const auto planes = [&](auto& buffer, bool picture) {
      for (int plane = 0; plane < (rows.alpha ? 4 : 3); ++plane) {
        auto& to = buffer.plane[plane];
        to.data = picture ? frame.data[plane] + std::ptrdiff_t{p} * frame.linesize[plane]
                          : rows.Plane(plane, 0);
        to.stride = picture ? std::ptrdiff_t{parts} * frame.linesize[plane]
                            : static_cast<std::ptrdiff_t>(ring_row);
        to.mask = picture ? ZIMG_BUFFER_MAX : mask;
      }
    };
    zimg_image_buffer_const from{ZIMG_API_VERSION, {}};
    zimg_image_buffer to{ZIMG_API_VERSION, {}};
    planes(from, kToPixels);
    planes(to, !kToPixels);
    if constexpr (kToPixels) {
      Check(zimg_filter_graph_process(graph.graph.get(), &from, &to, memory, nullptr, nullptr,
                                      PackRow, &rows));
    } else {
      Check(zimg_filter_graph_process(graph.graph.get(), &from, &to, memory, UnpackRow, &rows,
                                      nullptr, nullptr));
    }
  }
}

Yuv420* PlanarYuv::Own(const AVFrame& frame, const ColourModel& model) {
  const auto format = static_cast<AVPixelFormat>(frame.format);
  if (!Yuv420::Takes(format, frame.width, frame.height) ||
      ByFields(model, *NotNull(av_pix_fmt_desc_get(format)), frame.height)) {
    return nullptr;
  }
  if (!own_ || !own_->Fits(frame.width, frame.height, model)) {
    own_.emplace(frame.width, frame.height, model);
  }
  return &*own_;
}

void PlanarYuv::ToPixels(const AVFrame& frame, const ColourModel& model, HX_Pixel8* pixels,
                         std::ptrdiff_t row_bytes) {
  if (Yuv420* own = Own(frame, model)) return own->ToPixels(frame, pixels, row_bytes);
  const AVFrame* from = &frame;
  if (!Aligned(frame)) {
    // A decoder may hand out its frame from a cropped corner on.
    aligned_ = NewPicture(frame.format, frame.width, frame.height);
    if (av_frame_copy(aligned_.get(), &frame) < 0) throw std::runtime_error("no such frame");
    from = aligned_.get();
  }
  Process(*from, model, reinterpret_cast<std::uint8_t*>(pixels), row_bytes);
}

void PlanarYuv::FromPixels(const HX_Pixel8* pixels, std::ptrdiff_t row_bytes,
                           const ColourModel& model, AVFrame& frame) {
  if (Yuv420* own = Own(frame, model)) return own->FromPixels(pixels, row_bytes, frame);
  Process(frame, model, reinterpret_cast<const std::uint8_t*>(pixels), row_bytes);
}

}  // namespace calmframe::media
