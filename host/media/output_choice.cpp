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
  Extent extent;
  if (layout && layout->nb_components >= 3) extent = ExtentOf(*layout);
  if (layout && (layout->flags & AV_PIX_FMT_FLAG_PAL)) extent = ExtentOf(*layout);
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

std::vector<AVPixelFormat> UsableFormats(const AVCodec& codec, const AVOutputFormat& format) {
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
  const AVCodecDescriptor* codec_read = avcodec_descriptor_get_by_name(source.codec.c_str());
  const bool lossless =
      IsLossless(avcodec_descriptor_get(codec.id)) || (crf == 0 && CanBeLossless(codec, to));
  if (IsLossless(codec_read) && !lossless) losses.emplace_back("losslessness");
  return losses;
}

std::string WhatKeeps(const std::vector<std::string>& losses, const AVCodec& codec,
                      const AVOutputFormat& format, const ClipInfo& source,
                      AVPixelFormat pixel_format) {
  const std::string them = losses.size() == 1 ? "it" : "them";
  if (losses == std::vector<std::string>{"losslessness"} &&
      CanBeLossless(codec, ExtentOf(*av_pix_fmt_desc_get(pixel_format)))) {
    return "--crf 0 keeps it";
  }
  if (HoldsRawFrames(format)) return "--codec rawvideo to - keeps " + them;
  for (const char* name : {"libx264", "libx265", "libvpx-vp9", "prores_ks", "ffv1"}) {
    const AVCodec* other = avcodec_find_encoder_by_name(name);
    if (!other || avformat_query_codec(&format, other->id, FF_COMPLIANCE_NORMAL) != 1) continue;
    const AVPixelFormat best =
        Best(UsableFormats(*other, format), ExtentOf(source), *other, format);
    if (best != AV_PIX_FMT_NONE && Losses(*other, source, best, -1).empty()) {
      return std::string("--codec ") + name + " keeps " + them;
    }
  }
  return "--codec ffv1 keeps " + them + " in an .mkv file";
}

}  // namespace

bool HoldsPictures(const AVOutputFormat& format) {
  return IsNamed(format, "image2");
}

AVPixelFormat ChoosePixelFormat(const std::string& shown, const AVCodec& codec,
                                const AVOutputFormat& format, const ClipInfo& source, int width,
                                int height, const std::string& asked) {
  const std::vector<AVPixelFormat> usable = UsableFormats(codec, format);
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
  return shown + ": " + avcodec_get_name(codec.id) + " drops the clip's " + list + "; " +
         WhatKeeps(losses, codec, format, source, pixel_format);
}

}  // namespace calmframe::media
