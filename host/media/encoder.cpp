#include "host/media/encoder.h"

#include <algorithm>
#include <cstdlib>
#include <cstring>
#include <new>
#include <stdexcept>

#include "host/base/nearest_match.h"
#include "host/media/ffmpeg_log.h"
#include "host/media/output_choice.h"

namespace calmframe::media {
namespace {

const AVCodec* FindEncoder(const std::string& name) {
  const AVCodec* codec = avcodec_find_encoder_by_name(name.c_str());
  if (!codec) {
    const AVCodecDescriptor* described = avcodec_descriptor_get_by_name(name.c_str());
    if (described) codec = avcodec_find_encoder(described->id);
  }
  return codec && codec->type == AVMEDIA_TYPE_VIDEO ? codec : nullptr;
}

std::vector<std::string> EncoderNames() {
  std::vector<std::string> names;
  void* at = nullptr;
  while (const AVCodec* codec = av_codec_iterate(&at)) {
    if (!av_codec_is_encoder(codec) || codec->type != AVMEDIA_TYPE_VIDEO) continue;
    names.emplace_back(codec->name);
    names.emplace_back(avcodec_get_name(codec->id));
  }
  return names;
}

// Encoders that find no memory while they are opened write so to the standard error, past the
// library's log and past whoever reads it. So what they take at least, with stacks of some threads,
// is asked for before. Throws std::bad_alloc.
void AskForMemory(std::size_t pixels) {
  constexpr std::size_t kLeast = std::size_t{64} << 20, kAPixel = 16;  // bytes
  // Volatile, or compilers take an allocation that is freed at once for had.
  void* volatile asked = std::malloc(kLeast + kAPixel * pixels);
  if (!asked) throw std::bad_alloc();
  std::free(asked);
}

// The encoder of that name, empty for the container's own. Throws Failure (output).
const AVCodec& CodecFor(const std::string& shown, const AVOutputFormat& format,
                        const std::string& name) {
  const auto fail = [&](const std::string& why) {
    throw Failure(Failure::Side::output, shown + ": " + why);
  };
  if (name.empty()) {
    const bool h264 = avformat_query_codec(&format, AV_CODEC_ID_H264, FF_COMPLIANCE_NORMAL) == 1 ||
                      format.video_codec == AV_CODEC_ID_H264 ||
                      std::strcmp(format.name, "mpegts") == 0;
    const AVCodec* codec = avcodec_find_encoder(h264 ? AV_CODEC_ID_H264 : format.video_codec);
    if (!codec) fail("no encoder for a " + std::string(format.name) + " file");
    return *codec;
  }
  const AVCodec* codec = FindEncoder(name);
  if (!codec) {
    const std::string lacked = LackedHardware(name);
    fail(lacked.empty() ? "no video codec '" + name + "'" + NearestHint(name, EncoderNames())
                        : lacked);
  }
  if (!HoldsPictures(format) &&
      avformat_query_codec(&format, codec->id, FF_COMPLIANCE_UNOFFICIAL) == 0) {
    fail(std::string("a ") + format.name + " file can't hold " + avcodec_get_name(codec->id));
  }
  return *codec;
}

// Some encoders write to the standard error past the library's log.
void KeepQuiet(AVCodecContext& encoder) {
  if (!encoder.priv_data) return;
  std::uint8_t* given = nullptr;
  if (av_opt_get(encoder.priv_data, "x265-params", 0, &given) >= 0) {
    const std::string params = given && *given ? reinterpret_cast<char*>(given) : "";
    av_free(given);
    av_opt_set(encoder.priv_data, "x265-params",
               ((params.empty() ? "" : params + ":") + "log-level=error").c_str(), 0);
  }
  // It looks for no other sign. A user's own stays.
  if (std::strcmp(encoder.codec->name, "libsvtav1") == 0) setenv("SVT_LOG", "0", 0);
}

}  // namespace

bool HasOneRate(const AVOutputFormat& format) {
  if (format.flags & AVFMT_NOTIMESTAMPS) return true;
  const std::string name = format.name;
  return name == "avi" || name == "dv" || name == "gxf" || name == "swf" || name == "yuv4mpegpipe";
}

const AVOutputFormat* FormatForPipe(const EncodeSettings& settings) {
  const auto named = [](const char* name) { return av_guess_format(name, nullptr, nullptr); };
  const AVCodec* codec = settings.codec.empty() ? nullptr : FindEncoder(settings.codec);
  if (settings.codec.empty() || (codec && codec->id == AV_CODEC_ID_WRAPPED_AVFRAME)) {
    return named("yuv4mpegpipe");
  }
  const AVOutputFormat* matroska = named("matroska");
  const bool taken =
      !codec || avformat_query_codec(matroska, codec->id, FF_COMPLIANCE_UNOFFICIAL) != 0;
  return taken ? matroska : named("nut");
}

Encoder::Encoder(const std::string& shown, const AVOutputFormat& format, const ClipInfo& source,
                 int width, int height, const EncodeSettings& settings,
                 std::vector<std::string>& warnings)
    : shown_(shown), source_(source), width_(width), height_(height) {
  ListenToFfmpeg();
  const AVCodec& codec = CodecFor(shown, format, settings.codec);
  even_times_ = HasOneRate(format);
  by_number_ = even_times_;
  try {
    options_ = OptionsOf(codec, settings);
    device_ = HardwareFrames::For(codec);
    pixel_format_ =
        ChoosePixelFormat(shown, codec, format, source, width, height, settings.pixel_format,
                          device_ ? device_->Formats() : std::vector<AVPixelFormat>());
    if (settings.pixel_format.empty()) {
      const std::string line = LossLine(shown, codec, format, source, pixel_format_, settings.crf);
      if (!line.empty()) warnings.push_back(line);
    }
    std::string cause;
    if (!Open(codec, format, source, settings, cause)) {
      by_number_ = true;  // MPEG-4 and older have coarse clocks
      if (!Open(codec, format, source, settings, cause)) {
        throw std::invalid_argument(std::string("encoder ") + codec.name + " refuses " +
                                    std::to_string(width) + " x " + std::to_string(height) + " " +
                                    av_get_pix_fmt_name(pixel_format_) + ", crf " +
                                    std::to_string(settings.crf) + ": " + cause);
      }
    }
  } catch (const std::invalid_argument& refused) {
    Close();
    throw Failure(Failure::Side::output, shown + ": " + refused.what());
  }
  clock_ = even_times_ ? codec_->time_base : ToRational(source.time_base);
  if (source.times.empty()) clock_ = codec_->time_base;
  if (even_times_ && !source.times.empty()) {
    const auto& times = source.times;
    const AVRational tick = ToRational(source.time_base);
    for (std::size_t i = 0; i < times.size(); ++i) {
      const std::int64_t even = av_rescale_q(static_cast<std::int64_t>(i), codec_->time_base, tick);
      if (std::abs(times[i].pts - times[0].pts - even) > 1) {
        warnings.push_back(shown + ": " + format.name +
                           " has one frame rate: uneven time stamps are evened out");
        break;
      }
    }
  }
}

Encoder::~Encoder() {
  Close();
}

// SVT-AV1 waits for ever for the last packet of a stream that never began.
void Encoder::Close() noexcept {
  if (!codec_ || has_begun_ || !avcodec_is_open(codec_.get()) ||
      std::strcmp(codec_->codec->name, "libsvtav1") != 0) {
    return;
  }
  try {
    const FramePtr blank = NewPicture(pixel_format_, width_, height_);
    blank->pts = 0;
    avcodec_send_frame(codec_.get(), blank.get());
    avcodec_send_frame(codec_.get(), nullptr);
    const PacketPtr packet = NewPacket();
    while (avcodec_receive_packet(codec_.get(), packet.get()) >= 0) av_packet_unref(packet.get());
  } catch (const std::bad_alloc&) {
  }
  has_begun_ = true;
}

bool Encoder::Open(const AVCodec& codec, const AVOutputFormat& format, const ClipInfo& source,
                   const EncodeSettings& settings, std::string& cause) {
  codec_.reset(NotNull(avcodec_alloc_context3(&codec)));
  AVCodecContext& c = *codec_;
  c.width = width_;
  c.height = height_;
  c.pix_fmt = pixel_format_;
  c.sample_aspect_ratio = ToRational(source.pixel_aspect);
  c.framerate = ToRational(source.frame_rate);
  if (codec.supported_framerates) {
    c.framerate =
        codec.supported_framerates[av_find_nearest_q_idx(c.framerate, codec.supported_framerates)];
  }
  const bool numbered = by_number_ || source.times.empty();
  c.time_base = numbered ? av_inv_q(c.framerate) : ToRational(source.time_base);
  if (by_number_) c.max_b_frames = 0;
  c.thread_count = 0;
  c.strict_std_compliance = FF_COMPLIANCE_UNOFFICIAL;

  const AVPixFmtDescriptor& layout = *av_pix_fmt_desc_get(pixel_format_);
  ColourTags colour = source.colour;
  // RGB says "full", which for YUV is the uncommon choice.
  const bool rgb = IsRgb(source) || colour.matrix == AVCOL_SPC_RGB;
  if (rgb && colour.range == AVCOL_RANGE_JPEG) colour.range = AVCOL_RANGE_MPEG;
  if (HoldsPictures(format)) {
    colour.matrix = AVCOL_SPC_BT470BG;  // JPEG knows no other, nor another place of chroma
    colour.chroma_location = AVCHROMA_LOC_CENTER;
  }
  model_ = ModelOf(colour, pixel_format_, source.width, source.height);
  c.color_primaries = static_cast<AVColorPrimaries>(colour.primaries);
  c.color_trc = static_cast<AVColorTransferCharacteristic>(colour.transfer);
  if (layout.flags & AV_PIX_FMT_FLAG_RGB) {
    c.colorspace = AVCOL_SPC_RGB;
    c.color_range = AVCOL_RANGE_JPEG;
  } else {
    const bool silent = colour.matrix == AVCOL_SPC_UNSPECIFIED;
    c.colorspace = silent ? AVCOL_SPC_UNSPECIFIED : model_.matrix;
    c.color_range = model_.full_range                         ? AVCOL_RANGE_JPEG
                    : colour.range == AVCOL_RANGE_UNSPECIFIED ? AVCOL_RANGE_UNSPECIFIED
                                                              : AVCOL_RANGE_MPEG;
  }
  c.chroma_sample_location = static_cast<AVChromaLocation>(colour.chroma_location);

  const bool interlaced = source.field_order != FieldOrder::progressive && height_ % 4 == 0;
  model_.fields = interlaced;
  if (interlaced) {
    const bool top = source.field_order == FieldOrder::top_first;
    c.field_order = top ? AV_FIELD_TT : AV_FIELD_BB;
    c.flags |= AV_CODEC_FLAG_INTERLACED_DCT;
  }

  cause.clear();
  if (!TellQuality(options_)) SetQuality(codec, settings.crf);
  // VP8 and VP9 have no hidden frames beside alpha.
  if (c.priv_data && (layout.flags & AV_PIX_FMT_FLAG_ALPHA)) {
    av_opt_set_int(c.priv_data, "auto-alt-ref", 0, 0);
  }
  for (const EncoderOption& option : options_) SetOption(c, option);
  if (format.flags & AVFMT_GLOBALHEADER) c.flags |= AV_CODEC_FLAG_GLOBAL_HEADER;
  KeepQuiet(c);
  if (device_) device_->LendTo(c, pixel_format_);
  AskForMemory(static_cast<std::size_t>(width_) * static_cast<std::size_t>(height_));
  const Heard heard;
  const int error = avcodec_open2(&c, &codec, nullptr);
  if (error == AVERROR(ENOMEM)) throw std::bad_alloc();
  if (const std::string refused = RefusedSetting(heard); !refused.empty()) {
    throw std::invalid_argument(std::string("encoder ") + codec.name + ": " + refused);
  }
  if (error < 0) cause = heard.FirstError().empty() ? ErrorText(error) : heard.FirstError();
  return error >= 0;
}

void Encoder::SetQuality(const AVCodec& codec, int crf) {
  AVCodecContext& c = *codec_;
  const auto has = [&](const char* name) {
    return c.priv_data && av_opt_find(c.priv_data, name, nullptr, 0, 0);
  };
  const bool on_device = (codec.capabilities & AV_CODEC_CAP_HARDWARE) != 0;
  if (has("crf")) {
    SetOption(c, {"crf", std::to_string(crf)});
    c.bit_rate = 0;  // else it bounds the quality
  } else if (on_device && has("qp")) {
    SetOption(c, {"qp", std::to_string(std::clamp(crf, 1, 51))});
  } else if (on_device) {
    c.global_quality = std::max(crf, 1);  // of a scale like crf's
  } else {
    c.flags |= AV_CODEC_FLAG_QSCALE;
    c.global_quality = FF_QP2LAMBDA * std::clamp(crf / 6, 1, 31);
  }
}

FrameTime Encoder::TimeOf(std::size_t number) const {
  const auto n = static_cast<std::int64_t>(number);
  if (source_.times.empty()) return {n, 1};
  if (!even_times_) return source_.times.at(number);
  return {n + av_rescale_q(source_.times[0].pts, ToRational(source_.time_base), clock_), 1};
}

void Encoder::Send(std::size_t number, FramePtr frame) {
  if (frame) {
    has_begun_ = true;
    frame->pts = by_number_ ? static_cast<std::int64_t>(number) : TimeOf(number).pts;
    numbers_[frame->pts] = number;
    if (codec_->flags & AV_CODEC_FLAG_INTERLACED_DCT) {
      frame->interlaced_frame = 1;
      frame->top_field_first = codec_->field_order == AV_FIELD_TT;
    }
    frame->sample_aspect_ratio = codec_->sample_aspect_ratio;
    frame->color_primaries = codec_->color_primaries;
    frame->color_trc = codec_->color_trc;
    frame->colorspace = codec_->colorspace;
    frame->color_range = codec_->color_range;
    frame->chroma_location = codec_->chroma_sample_location;
    if (codec_->flags & AV_CODEC_FLAG_QSCALE) frame->quality = codec_->global_quality;
  }
  if (frame && device_) {
    try {
      frame = HardwareFrames::Upload(*codec_, *frame);
    } catch (const std::runtime_error& failed) {
      throw Failure(Failure::Side::output, shown_ + ": " + failed.what());
    }
  }
  const int error = avcodec_send_frame(codec_.get(), frame.get());
  if (error < 0 && error != AVERROR_EOF) {
    throw Failure(Failure::Side::output, shown_ + ": encoding failed: " + ErrorText(error));
  }
}

PacketPtr Encoder::Receive() {
  PacketPtr packet = NewPacket();
  const int error = avcodec_receive_packet(codec_.get(), packet.get());
  if (error == AVERROR(EAGAIN) || error == AVERROR_EOF) return nullptr;
  if (error < 0) {
    throw Failure(Failure::Side::output, shown_ + ": encoding failed: " + ErrorText(error));
  }
  const auto found = numbers_.find(packet->pts);
  if (found != numbers_.end()) {
    const FrameTime time = TimeOf(found->second);
    packet->duration = time.duration;
    if (by_number_) packet->pts = packet->dts = time.pts;
    numbers_.erase(found);
  }
  return packet;
}

}  // namespace calmframe::media
