#pragma once

#include "host/media/clip.h"
#include "host/media/ffmpeg.h"

namespace calmframe::media {

// How a frame's numbers mean colours: the tags, and where they are silent what players assume.
struct ColourModel {
  AVColorSpace matrix = AVCOL_SPC_BT709;
  bool full_range = false;
  AVChromaLocation chroma = AVCHROMA_LOC_LEFT;
  bool fields = false;  // 4:2:0 chroma belongs to each field
  bool operator==(const ColourModel&) const = default;
};

// The frame's. A code point that FFmpeg doesn't know, which bitstreams may tell all the same,
// counts as not told.
ColourTags TagsOf(const AVFrame& frame);

// width, height: of the clip; BT.709 from 720 lines or 1280 columns on, BT.601 below.
ColourModel ModelOf(const ColourTags& tags, AVPixelFormat format, int width, int height);

// Luma weights, ITU-R BT.601, BT.709, BT.2020 and older ones. Those of green are the rest.
struct LumaWeights {
  double red, blue;
};
LumaWeights WeightsOf(AVColorSpace matrix);

// Luma and two planes or components of chroma, in whole numbers.
bool IsYuv(const AVPixFmtDescriptor& layout);

// Whether a conversion of frames of this format and height goes field by field.
bool ByFields(const ColourModel& model, const AVPixFmtDescriptor& layout, int height);

// Every second row of a frame from `parity` on, sharing its memory.
FramePtr FieldOf(const AVFrame& frame, int parity);

}  // namespace calmframe::media
