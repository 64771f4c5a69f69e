#include "host/media/output_choice.h"

#include <algorithm>
#include <array>
#include <cstring>

#include "host/base/nearest_match.h"

namespace calmframe::media {
namespace {

// What of colours a pixel format can tell.
struct Extent {
  bool colour = true, rgb = false, alpha = false;
  int depth = 8;             // bits of the shallowest of its colours
  int across = 1, down = 1;  // log2 of the luma samples to one of chroma

  std::string Chroma() const {
    if (across == 0) return down == 0 ? "4:4:4" : "4:4:0";
    if (across == 1) return down == 0 ? "4:2:2" : "4:2:0";
    return down == 0 ? "4:1:1" : "4:1:0";
  }
};

constexpr int kDeepest = 16;  // bits that are drawn

Extent ExtentOf(const AVPixFmtDescriptor& layout) {
  Extent extent;
  extent.alpha = (layout.flags & AV_PIX_FMT_FLAG_ALPHA) != 0;
  extent.across = layout.log2_chroma_w;
  extent.down = layout.log2_chroma_h;
  if (layout.flags & AV_PIX_FMT_FLAG_PAL) {
    extent.rgb = true;
    return extent;
  }
  extent.colour = layout.nb_components >= 3;
  extent.rgb = (layout.flags & AV_PIX_FMT_FLAG_RGB) || std::strncmp(layout.name, "xyz", 3) == 0;
  extent.depth = kDeepest;
  for (int c = 0; c < (extent.colour ? 3 : 1); ++c) {
    extent.depth = std::min(extent.depth, layout.comp[c].depth);
  }
  return extent;
}

Extent ExtentOf(const ClipInfo& source) {
  const AVPixFmtDescriptor* layout =
      av_pix_fmt_desc_get(av_get_pix_fmt(source.pixel_format.c_str()));
  Extent extent;  // grey goes into what takes 4:2:0
  if (layout && (layout->nb_components >= 3 || (layout->flags & AV_PIX_FMT_FLAG_PAL))) {
    extent = ExtentOf(*layout);
  }
  extent.alpha = source.has_alpha;
  extent.depth = source.bit_depth;
  return extent;
}

bool IsNamed(const AVOutputFormat& format, const char* name) {
  return std::strcmp(format.name, name) == 0;
}

bool HoldsRawFrames(const AVOutputFormat& format) {
  return IsNamed(format, "yuv4mpegpipe");
}

bool IsInRawFrames(const AVPixFmtDescriptor& layout) {
  const Extent extent = ExtentOf(layout);
  const bool planar = (layout.flags & AV_PIX_FMT_FLAG_PLANAR) != 0 && layout.comp[1].plane == 1 &&
                      layout.comp[2].plane == 2;
  const bool sampled = extent.Chroma() == "4:2:0" || extent.Chroma() == "4:2:2" ||
                       extent.Chroma() == "4:4:4" || std::strcmp(layout.name, "yuv411p") == 0;
  const bool own_order = extent.depth == 8 || !(layout.flags & AV_PIX_FMT_FLAG_BE);
  if (std::strncmp(layout.name, "gray", 4) == 0) {
    return own_order && extent.depth != 14 && !(layout.flags & AV_PIX_FMT_FLAG_FLOAT);
  }
  return extent.colour && !extent.rgb && !extent.alpha && planar && sampled && own_order &&
         std::strncmp(layout.name, "yuvj", 4) != 0;
}

std::vector<AVPixelFormat> UsableFormats(const AVCodec& codec, const AVOutputFormat& format,
                                         const std::vector<AVPixelFormat>& of_device = {}) {
  std::vector<AVPixelFormat> usable;
  const bool jpeg = codec.id == AV_CODEC_ID_MJPEG && HoldsPictures(format);
  // VP8 and VP9 have alpha beside their frames, for which there is a place here alone.
  const bool vpx = codec.id == AV_CODEC_ID_VP8 || codec.id == AV_CODEC_ID_VP9;
  const bool no_alpha = vpx && !IsNamed(format, "matroska") && !IsNamed(format, "webm");
  const auto add = [&](AVPixelFormat f) {
    const AVPixFmtDescriptor& layout = *av_pix_fmt_desc_get(f);
    const bool alpha = (layout.flags & AV_PIX_FMT_FLAG_ALPHA) != 0;
    const bool full_range = std::strncmp(layout.name, "yuvj", 4) == 0;
    if (sws_isSupportedOutput(f) && !(no_alpha && alpha) && (full_range || !jpeg)) {
      usable.push_back(f);
    }
  };
  if (!of_device.empty()) {
    for (const AVPixelFormat f : of_device) add(f);
    return usable;
  }
  if (codec.pix_fmts) {
    for (const AVPixelFormat* f = codec.pix_fmts; *f != AV_PIX_FMT_NONE; ++f) add(*f);
    return usable;
  }
  for (const AVPixFmtDescriptor* l = nullptr; (l = av_pix_fmt_desc_next(l));) {
    const AVPixelFormat f = av_pix_fmt_desc_get_id(l);
    const bool taken = HoldsRawFrames(format) ? IsInRawFrames(*l)
                                              : !(l->flags & AV_PIX_FMT_FLAG_FLOAT) &&
                                                    avcodec_pix_fmt_to_codec_tag(f) != 0;
    if (taken) add(f);
  }
  return usable;
}

bool IsLossless(const AVCodecDescriptor* codec) {
  return codec && (codec->props & AV_CODEC_PROP_LOSSLESS) && !(codec->props & AV_CODEC_PROP_LOSSY);
}

// x264 loses nothing at a quality of 0, in 8 bits.
bool CanBeLossless(const AVCodec& codec, const Extent& written) {
  return std::strcmp(codec.name, "libx264") == 0 && written.depth == 8;
}

// From the worst loss to a mere preference; less is better.
std::array<int, 9> CostOf(const AVPixFmtDescriptor& layout, const Extent& source, bool lossless) {
  const Extent has = ExtentOf(layout);
  // Players show RGB of a lossy codec seldom.
  const bool kind = lossless ? has.rgb != source.rgb : has.rgb;
  const bool second = std::strncmp(layout.name, "yuvj", 4) == 0 ||  // yuv420p serves as well
                      (layout.flags & AV_PIX_FMT_FLAG_FLOAT) ||
                      ((layout.flags & AV_PIX_FMT_FLAG_BE) && has.depth > 8) ||
                      (!has.rgb && !(layout.flags & AV_PIX_FMT_FLAG_PLANAR));
  return {!has.colour,
          source.alpha && !has.alpha,
          std::max(source.depth - has.depth, 0),
          std::max(has.across - source.across, 0) + std::max(has.down - source.down, 0),
          has.alpha && !source.alpha,
          kind,
          std::max(has.depth - source.depth, 0),
          std::max(source.across - has.across, 0) + std::max(source.down - has.down, 0),
          second};
}

AVPixelFormat Best(const std::vector<AVPixelFormat>& usable, Extent source, const AVCodec& codec,
                   const AVOutputFormat& format) {
  if (HoldsPictures(format)) source.rgb = true;  // as all their viewers show
  const bool lossless = IsLossless(avcodec_descriptor_get(codec.id));
  const auto cost = [&](AVPixelFormat f) {
    return CostOf(*NotNull(av_pix_fmt_desc_get(f)), source, lossless);
  };
  const auto less = [&](AVPixelFormat a, AVPixelFormat b) { return cost(a) < cost(b); };
  const auto best = std::min_element(usable.begin(), usable.end(), less);
  return best == usable.end() ? AV_PIX_FMT_NONE : *best;
}

std::vector<std::string> Losses(const AVCodec& codec, const ClipInfo& source,
                                AVPixelFormat pixel_format, int crf) {
  const Extent from = ExtentOf(source);
  const Extent to = ExtentOf(*NotNull(av_pix_fmt_desc_get(pixel_format)));
  std::vector<std::string> losses;
  if (!to.colour) losses.emplace_back("colour");
  if (from.alpha && !to.alpha) losses.emplace_back("alpha");
  if (to.depth < from.depth) {
    losses.push_back(std::to_string(from.depth) + " bits (" + std::to_string(to.depth) + " stay)");
  }
  if (to.colour && (to.across > from.across || to.down > from.down)) {
    losses.push_back(from.Chroma() + " chroma (" + to.Chroma() + " stays)");
  }
  const bool exact = !from.rgb || to.rgb;  // words of YUV round RGB
  const bool lossless = exact && (IsLossless(avcodec_descriptor_get(codec.id)) ||
                                  (crf == 0 && CanBeLossless(codec, to)));
  if (IsLossless(avcodec_descriptor_get_by_name(source.codec.c_str())) && !lossless) {
    losses.emplace_back("losslessness");
  }
  return losses;
}

// Whether that encoder in that container keeps all.
bool Keeps(const AVCodec& codec, const AVOutputFormat& format, const ClipInfo& source, int crf) {
  const AVPixelFormat best = Best(UsableFormats(codec, format), ExtentOf(source), codec, format);
  return best != AV_PIX_FMT_NONE && Losses(codec, source, best, crf).empty();
}

// Empty where nothing does.
std::string WhatKeeps(const AVCodec& codec, const AVOutputFormat& format, const ClipInfo& source) {
  if (Keeps(codec, format, source, 0)) return "--crf 0";
  const AVCodec* png = avcodec_find_encoder(AV_CODEC_ID_PNG);
  if (HoldsPictures(format)) {
    return png && Keeps(*png, format, source, -1) ? "a name like f%04d.png" : "";
  }
  if (HoldsRawFrames(format)) return "--codec rawvideo to -";
  const struct {
    const char *codec, *extension;  // empty: the one that it has
  } ways[] = {{"libx264", ""}, {"libx265", ""},         {"libvpx-vp9", ""},    {"prores_ks", ""},
              {"ffv1", ""},    {"libvpx-vp9", ".webm"}, {"prores_ks", ".mov"}, {"ffv1", ".mkv"}};
  for (const auto& way : ways) {
    const AVCodec* other = avcodec_find_encoder_by_name(way.codec);
    const AVOutputFormat* kind =
        *way.extension ? av_guess_format(nullptr, way.extension, nullptr) : &format;
    if (other && kind && avformat_query_codec(kind, other->id, FF_COMPLIANCE_NORMAL) == 1 &&
        Keeps(*other, *kind, source, -1)) {
      return std::string("--codec ") + way.codec + (*way.extension ? " in " : "") + way.extension;
    }
  }
  return "";
}

}  // namespace

bool HoldsPictures(const AVOutputFormat& format) {
  return IsNamed(format, "image2");
}

bool IsRgb(const ClipInfo& source) {
  return ExtentOf(source).rgb;
}

AVPixelFormat ChoosePixelFormat(const std::string& shown, const AVCodec& codec,
                                const AVOutputFormat& format, const ClipInfo& source, int width,
                                int height, const std::string& asked,
                                const std::vector<AVPixelFormat>& of_device) {
  const std::vector<AVPixelFormat> usable = UsableFormats(codec, format, of_device);
  if (!asked.empty()) {
    const AVPixelFormat known = av_get_pix_fmt(asked.c_str());
    const bool any = !codec.pix_fmts && !HoldsRawFrames(format);
    if (known != AV_PIX_FMT_NONE && sws_isSupportedOutput(known) &&
        (any || std::find(usable.begin(), usable.end(), known) != usable.end())) {
      return known;
    }
    std::vector<std::string> names;
    for (const AVPixelFormat f : usable) names.emplace_back(av_get_pix_fmt_name(f));
    throw Failure(Failure::Side::output, shown + ": pixel format '" + asked + "' is not one of " +
                                             codec.name + "'s" + NearestHint(asked, names));
  }
  Extent wanted = ExtentOf(source);
  if (width % 2 != 0 || height % 2 != 0) wanted.across = wanted.down = 0;
  const AVPixelFormat best = Best(usable, wanted, codec, format);
  if (best == AV_PIX_FMT_NONE) {
    throw Failure(Failure::Side::output,
                  shown + ": encoder " + codec.name + " takes no frames from memory");
  }
  return best;
}

std::string LossLine(const std::string& shown, const AVCodec& codec, const AVOutputFormat& format,
                     const ClipInfo& source, AVPixelFormat pixel_format, int crf) {
  const std::vector<std::string> losses = Losses(codec, source, pixel_format, crf);
  if (losses.empty()) return "";
  std::string list;
  for (std::size_t i = 0; i < losses.size(); ++i) {
    list += (i == 0 ? "" : i + 1 == losses.size() ? " and " : ", ") + losses[i];
  }
  const std::string keeps = WhatKeeps(codec, format, source);
  return shown + ": " + (HoldsRawFrames(format) ? "YUV4MPEG2" : avcodec_get_name(codec.id)) +
         " drops the clip's " + list + (keeps.empty() ? "" : "; " + keeps + " keeps all");
}

}  // namespace calmframe::media
