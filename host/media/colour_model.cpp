#include "host/media/colour_model.h"

#include <cstring>
#include <type_traits>
#include <utility>

namespace calmframe::media {
namespace {

// What stands in an enumeration's place, as long as it is one of the first `count` values: any
// other may not even be looked at as one.
template <class Code>
int Known(const Code& code, int count, int not_told) {
  std::underlying_type_t<Code> number;
  std::memcpy(&number, &code, sizeof number);
  return std::in_range<int>(number) && number < static_cast<decltype(number)>(count)
             ? static_cast<int>(number)
             : not_told;
}

}  // namespace

ColourTags TagsOf(const AVFrame& frame) {
  return {Known(frame.color_primaries, AVCOL_PRI_NB, AVCOL_PRI_UNSPECIFIED),
          Known(frame.color_trc, AVCOL_TRC_NB, AVCOL_TRC_UNSPECIFIED),
          Known(frame.colorspace, AVCOL_SPC_NB, AVCOL_SPC_UNSPECIFIED),
          Known(frame.color_range, AVCOL_RANGE_NB, AVCOL_RANGE_UNSPECIFIED),
          Known(frame.chroma_location, AVCHROMA_LOC_NB, AVCHROMA_LOC_UNSPECIFIED)};
}

ColourModel ModelOf(const ColourTags& tags, AVPixelFormat format, int width, int height) {
  ColourModel model;
  model.matrix = static_cast<AVColorSpace>(tags.matrix);
  switch (model.matrix) {
    case AVCOL_SPC_BT709:
    case AVCOL_SPC_FCC:
    case AVCOL_SPC_BT470BG:
    case AVCOL_SPC_SMPTE170M:
    case AVCOL_SPC_SMPTE240M:
    case AVCOL_SPC_BT2020_NCL:
      break;
    case AVCOL_SPC_BT2020_CL:
    case AVCOL_SPC_ICTCP:
      model.matrix = AVCOL_SPC_BT2020_NCL;
      break;
    default:
      model.matrix = width >= 1280 || height >= 720 ? AVCOL_SPC_BT709 : AVCOL_SPC_SMPTE170M;
  }
  const AVPixFmtDescriptor* layout = av_pix_fmt_desc_get(format);
  const bool jpeg = layout && std::strncmp(layout->name, "yuvj", 4) == 0;
  const bool grey = layout && layout->nb_components < 3;
  model.full_range =
      jpeg || tags.range == AVCOL_RANGE_JPEG || (grey && tags.range == AVCOL_RANGE_UNSPECIFIED);
  model.chroma = static_cast<AVChromaLocation>(tags.chroma_location);
  if (model.chroma == AVCHROMA_LOC_UNSPECIFIED) {
    model.chroma = jpeg ? AVCHROMA_LOC_CENTER : AVCHROMA_LOC_LEFT;
  }
  return model;
}

LumaWeights WeightsOf(AVColorSpace matrix) {
  switch (matrix) {
    case AVCOL_SPC_BT709:
      return {0.2126, 0.0722};
    case AVCOL_SPC_FCC:
      return {0.30, 0.11};
    case AVCOL_SPC_SMPTE240M:
      return {0.212, 0.087};
    case AVCOL_SPC_BT2020_NCL:
      return {0.2627, 0.0593};
    default:
      return {0.299, 0.114};
  }
}

bool IsYuv(const AVPixFmtDescriptor& layout) {
  return layout.nb_components >= 3 &&
         !(layout.flags & (AV_PIX_FMT_FLAG_RGB | AV_PIX_FMT_FLAG_PAL | AV_PIX_FMT_FLAG_FLOAT |
                           AV_PIX_FMT_FLAG_BAYER)) &&
         std::strncmp(layout.name, "xyz", 3) != 0;
}

bool ByFields(const ColourModel& model, const AVPixFmtDescriptor& layout, int height) {
  return model.fields && layout.log2_chroma_h == 1 && height % 4 == 0;
}

FramePtr FieldOf(const AVFrame& frame, int parity) {
  FramePtr field = NewFrame();
  if (av_frame_ref(field.get(), &frame) < 0) throw std::bad_alloc();
  field->height /= 2;
  for (int plane = 0; plane < 4 && field->data[plane]; ++plane) {
    field->data[plane] += std::ptrdiff_t{parity} * field->linesize[plane];
    field->linesize[plane] *= 2;
  }
  return field;
}

}  // namespace calmframe::media
