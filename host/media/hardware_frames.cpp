#include "host/media/hardware_frames.h"

#include <array>
#include <stdexcept>
#include <string_view>

#include "host/media/ffmpeg_log.h"

extern "C" {
#include <libavutil/hwcontext.h>
}

namespace calmframe::media {
namespace {

// Frames in an encoder at once, those that it may reorder and those under way: devices of VAAPI
// make all of them at first.
constexpr int kFramesInWork = 24;

bool IsOnDevice(AVPixelFormat format) {
  return (NotNull(av_pix_fmt_desc_get(format))->flags & AV_PIX_FMT_FLAG_HWACCEL) != 0;
}

[[noreturn]] void Refuse(const std::string& what, const Heard& heard, int error) {
  if (error == AVERROR(ENOMEM)) throw std::bad_alloc();
  const std::string said = heard.FirstError();
  throw std::invalid_argument(what + ": " + (said.empty() ? ErrorText(error) : said));
}

}  // namespace

std::unique_ptr<HardwareFrames> HardwareFrames::For(const AVCodec& codec) {
  if (!codec.pix_fmts) return nullptr;
  for (const AVPixelFormat* f = codec.pix_fmts; *f != AV_PIX_FMT_NONE; ++f) {
    if (!IsOnDevice(*f)) return nullptr;
  }
  const AVCodecHWConfig* config = nullptr;
  for (int i = 0; (config = avcodec_get_hw_config(&codec, i)); ++i) {
    if (config->methods & AV_CODEC_HW_CONFIG_METHOD_HW_FRAMES_CTX) break;
  }
  if (!config) return nullptr;
  const Heard heard;
  AVBufferRef* device = nullptr;
  const int error = av_hwdevice_ctx_create(&device, config->device_type, nullptr, nullptr, 0);
  if (error < 0) {
    const char* const kind = av_hwdevice_get_type_name(config->device_type);
    Refuse(std::string("encoder ") + codec.name + " finds no " + (kind ? kind : "such") + " device",
           heard, error);
  }
  std::unique_ptr<HardwareFrames> frames(new HardwareFrames);
  frames->format_ = config->pix_fmt;
  frames->device_.reset(device);
  return frames;
}

std::vector<AVPixelFormat> HardwareFrames::Formats() const {
  const auto free = [](AVHWFramesConstraints* c) { av_hwframe_constraints_free(&c); };
  const std::unique_ptr<AVHWFramesConstraints, decltype(free)> constraints(
      av_hwdevice_get_hwframe_constraints(device_.get(), nullptr), free);
  std::vector<AVPixelFormat> formats;
  if (!constraints || !constraints->valid_sw_formats) return {AV_PIX_FMT_NV12};
  for (const AVPixelFormat* f = constraints->valid_sw_formats; *f != AV_PIX_FMT_NONE; ++f) {
    formats.push_back(*f);
  }
  return formats;
}

void HardwareFrames::LendTo(AVCodecContext& encoder, AVPixelFormat format) const {
  const Heard heard;
  std::unique_ptr<AVBufferRef, Unreference> pool(NotNull(av_hwframe_ctx_alloc(device_.get())));
  auto& frames = *reinterpret_cast<AVHWFramesContext*>(pool->data);
  frames.format = format_;
  frames.sw_format = format;
  frames.width = encoder.width;
  frames.height = encoder.height;
  frames.initial_pool_size = kFramesInWork;
  const int error = av_hwframe_ctx_init(pool.get());
  if (error < 0) {
    Refuse(std::string("the device of encoder ") + encoder.codec->name + " has no such frames",
           heard, error);
  }
  encoder.pix_fmt = format_;
  encoder.hw_frames_ctx = pool.release();
}

FramePtr HardwareFrames::Upload(const AVCodecContext& encoder, const AVFrame& frame) {
  FramePtr there = NewFrame();
  int error = av_hwframe_get_buffer(encoder.hw_frames_ctx, there.get(), 0);
  if (error >= 0) error = av_hwframe_transfer_data(there.get(), &frame, 0);
  if (error >= 0) error = av_frame_copy_props(there.get(), &frame);
  if (error == AVERROR(ENOMEM)) throw std::bad_alloc();
  if (error < 0)
    throw std::runtime_error("a frame can't be brought to the device: " + ErrorText(error));
  return there;
}

std::string LackedHardware(const std::string& encoder) {
  constexpr std::array<std::string_view, 9> kKinds = {
      "_amf", "_mf", "_nvenc", "_omx", "_qsv", "_v4l2m2m", "_vaapi", "_videotoolbox", "_vulkan"};
  for (const std::string_view kind : kKinds) {
    if (encoder.size() > kind.size() && encoder.ends_with(kind) &&
        !avcodec_find_encoder_by_name(encoder.c_str())) {
      return "FFmpeg is built without encoder " + encoder + " here";
    }
  }
  return "";
}

}  // namespace calmframe::media
