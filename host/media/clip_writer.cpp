#include <cstring>
#include <memory>
#include <optional>
#include <stdexcept>
#include <utility>

#include "host/media/clip.h"
#include "host/media/clip_container.h"
#include "host/media/decoder.h"
#include "host/media/encoder.h"
#include "host/media/pixel_conversion.h"

namespace calmframe::media {
namespace {

class FfmpegWriter final : public ClipWriter {
 public:
  FfmpegWriter(const std::string& path, const ClipInfo& source, int width, int height,
               const EncodeSettings& settings)
      : container_(path, source, SettingsFor(path, width, height, settings)) {
    EncodeSettings encode = settings;
    if (!container_.picture_codec().empty()) encode.codec = container_.picture_codec();
    const AVOutputFormat& format = container_.format();
    encoder_.emplace(container_.shown(), format, source, width, height, encode, warnings_);
    to_frame_.emplace(encoder_->pixel_format(), width, height, encoder_->colour());
    const auto free = [](AVCodecParameters* of) { avcodec_parameters_free(&of); };
    const std::unique_ptr<AVCodecParameters, decltype(free)> parameters(
        NotNull(avcodec_parameters_alloc()), free);
    if (avcodec_parameters_from_context(parameters.get(), &encoder_->context()) < 0) {
      throw std::bad_alloc();
    }
    parameters->format = encoder_->pixel_format();  // not what its device makes of it
    if (std::strcmp(format.name, "yuv4mpegpipe") == 0) TagRawFrames(source.colour, *parameters);
    container_.Begin({*parameters, encoder_->time_base(), encoder_->context().framerate,
                      encoder_->context().sample_aspect_ratio},
                     source, warnings_);
  }

  void Write(std::size_t frame, const HX_Pixel8* pixels, std::ptrdiff_t row_bytes) override {
    WriteAs(frame, pixels, row_bytes);
  }
  void Write(std::size_t frame, const HX_Pixel16* pixels, std::ptrdiff_t row_bytes) override {
    WriteAs(frame, pixels, row_bytes);
  }
  void Write(std::size_t frame, const HX_PixelFloat* pixels, std::ptrdiff_t row_bytes) override {
    WriteAs(frame, pixels, row_bytes);
  }

  const std::vector<std::string>& warnings() const override { return warnings_; }

  void Finish() override {
    encoder_->Send(0, nullptr);
    WriteEncoded();
    container_.Finish();
  }

 private:
  static const EncodeSettings& SettingsFor(const std::string& path, int width, int height,
                                           const EncodeSettings& settings) {
    if (width >= 1 && height >= 1 && std::int64_t{width} * height <= kMaximumPixels) {
      return settings;
    }
    throw Failure(Failure::Side::output, (path == "-" ? "standard output" : path) +
                                             ": can't hold frames of " + std::to_string(width) +
                                             " x " + std::to_string(height) + " pixels");
  }

  // YUV4MPEG2 tells the range, and of 4:2:0 in 8 bits where chroma lies, which without a word would
  // be another place than the one it has here.
  void TagRawFrames(const ColourTags& colour, AVCodecParameters& parameters) {
    std::string dropped;
    const auto drop = [&](const char* tag, int value, const char* name) {
      if (value == 0 || value == AVCOL_SPC_UNSPECIFIED) return;
      dropped += std::string(dropped.empty() ? "" : ", ") + tag + " " + (name ? name : "?");
    };
    drop("primaries", colour.primaries,
         av_color_primaries_name(static_cast<AVColorPrimaries>(colour.primaries)));
    drop("transfer", colour.transfer,
         av_color_transfer_name(static_cast<AVColorTransferCharacteristic>(colour.transfer)));
    drop("matrix", colour.matrix, av_color_space_name(static_cast<AVColorSpace>(colour.matrix)));
    const auto chroma = encoder_->colour().chroma;
    if (parameters.format == AV_PIX_FMT_YUV420P) parameters.chroma_location = chroma;
    const AVPixFmtDescriptor& layout =
        *NotNull(av_pix_fmt_desc_get(static_cast<AVPixelFormat>(parameters.format)));
    const bool placed = parameters.format == AV_PIX_FMT_YUV420P
                            ? chroma <= AVCHROMA_LOC_TOPLEFT
                            : chroma == AVCHROMA_LOC_LEFT || layout.log2_chroma_w == 0;
    if (!placed) {
      dropped += std::string(dropped.empty() ? "" : ", ") + "chroma location " +
                 av_chroma_location_name(chroma);
    }
    if (dropped.empty()) return;
    warnings_.push_back(
        container_.shown() + ": raw frames don't tell the clip's colour tags (" + dropped + "); " +
        (container_.to_pipe() ? "--codec rawvideo keeps them" : "an .mkv file keeps them"));
  }

  template <class Pixel>
  void WriteAs(std::size_t frame, const Pixel* pixels, std::ptrdiff_t row_bytes) {
    if (last_ && frame <= *last_) throw std::invalid_argument("frames are written in order");
    last_ = frame;
    FramePtr converted;
    try {
      converted = to_frame_->Convert(pixels, row_bytes);
    } catch (const std::bad_alloc&) {
      throw;
    } catch (const std::exception& error) {
      container_.Fail(error.what());
    }
    encoder_->Send(frame, std::move(converted));
    container_.CopyUntil(encoder_->TimeOf(frame).pts);
    WriteEncoded();
  }

  void WriteEncoded() {
    while (PacketPtr packet = encoder_->Receive()) container_.Write(std::move(packet));
  }

  std::vector<std::string> warnings_;
  ClipContainer container_;
  std::optional<Encoder> encoder_;
  std::optional<PixelsToFrame> to_frame_;
  std::optional<std::size_t> last_;
};

}  // namespace

std::unique_ptr<ClipWriter> ClipWriter::Create(const std::string& path, const ClipInfo& source,
                                               int width, int height,
                                               const EncodeSettings& settings) {
  return std::make_unique<FfmpegWriter>(path, source, width, height, settings);
}

}  // namespace calmframe::media
