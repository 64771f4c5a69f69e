#pragma once

#include <string>
#include <utility>
#include <vector>

#include "host/media/ffmpeg.h"
#include "host/media/ffmpeg_log.h"

// What is asked of an encoder besides its quality and its frames, as options by FFmpeg's names.
namespace calmframe::media {

using EncoderOption = std::pair<std::string, std::string>;

// In the order that they are set in: how fast it is, by settings.preset or for encoders that are
// slow by themselves; then settings.options. Throws std::invalid_argument: one line that names a
// preset that the encoder lacks.
std::vector<EncoderOption> OptionsOf(const AVCodec& codec, const EncodeSettings& settings);

// Whether they say how large or how good the file is to be.
bool TellQuality(const std::vector<EncoderOption>& options);

// Sets one before the encoder is opened. Throws std::invalid_argument: one line that names an
// option that the encoder lacks, with the nearest, or a value that it doesn't take.
void SetOption(AVCodecContext& encoder, const EncoderOption& option);

// Lists of settings within one option (x264-params and its like) are read as the encoder opens,
// which is not stopped by one that it doesn't know: the line that it then says, or nothing.
std::string RefusedSetting(const Heard& heard);

}  // namespace calmframe::media
