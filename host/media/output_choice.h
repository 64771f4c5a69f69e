#pragma once

#include <string>
#include <vector>

#include "host/media/ffmpeg.h"

// What of a source a written file keeps.
namespace calmframe::media {

// Each frame a file of its own.
bool HoldsPictures(const AVOutputFormat& format);

// Whether the source's frames are of red, green and blue.
bool IsRgb(const ClipInfo& source);

// The pixel format of the encoder that keeps most of the source: its alpha, then its depth, then
// its chroma, and has least beyond. An odd size takes 4:4:4, which alone keeps it. `asked` (may be
// empty) is taken as it is. Throws Failure (output): the encoder lacks `asked`, which is answered
// with the nearest, or takes no frames from memory. `shown`: the path in the messages. `of_device`:
// the formats of an encoder that takes its frames from a device; else empty.
AVPixelFormat ChoosePixelFormat(const std::string& shown, const AVCodec& codec,
                                const AVOutputFormat& format, const ClipInfo& source, int width,
                                int height, const std::string& asked,
                                const std::vector<AVPixelFormat>& of_device = {});

// One line that names what of the source is lost in frames of that format and codec, and the flag
// that keeps it; empty where all is kept. crf: of the encoder.
std::string LossLine(const std::string& shown, const AVCodec& codec, const AVOutputFormat& format,
                     const ClipInfo& source, AVPixelFormat pixel_format, int crf);

}  // namespace calmframe::media
