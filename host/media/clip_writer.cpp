#include <cstring>
#include <filesystem>
#include <optional>
#include <stdexcept>
#include <utility>

#include "host/media/clip.h"
#include "host/media/decoder.h"
#include "host/media/encoder.h"
#include "host/media/output_file.h"
#include "host/media/pixel_conversion.h"
#include "host/media/stream_copy.h"

namespace calmframe::media {
namespace {

struct OutputDelete {
  void operator()(AVFormatContext* container) const {
    if (container->pb) avio_closep(&container->pb);
    avformat_free_context(container);
  }
};

class FfmpegWriter final : public ClipWriter {
 public:
  FfmpegWriter(const std::string& path, const ClipInfo& source, int width, int height,
               const EncodeSettings& settings)
      : shown_(path == "-" ? "standard output" : path), to_pipe_(path == "-") {
    ListenToFfmpeg();
    if (width < 1 || height < 1 || std::int64_t{width} * height > kMaximumPixels) {
      Fail("can't hold frames of " + std::to_string(width) + " x " + std::to_string(height) +
           " pixels");
    }
    const AVOutputFormat* format = to_pipe_ ? av_guess_format("yuv4mpegpipe", nullptr, nullptr)
                                            : av_guess_format(nullptr, path.c_str(), nullptr);
    std::error_code ignored;
    if (std::filesystem::is_directory(path, ignored)) Fail("is a directory");
    const std::string extension = std::filesystem::path(path).extension().string();
    if (!format || format->video_codec == AV_CODEC_ID_NONE || (format->flags & AVFMT_NOFILE)) {
      Fail((extension.empty() ? "its name has no extension to tell the kind of file"
                              : "no kind of video file ends in '" + extension + "'") +
           "; .mp4, .mov, .mkv and .webm are some");
    }
    if (!to_pipe_) file_.emplace(path, source.path, settings.overwrite);
    encoder_.emplace(shown_, *format, source, width, height, settings, warnings_);
    to_frame_.emplace(encoder_->context().pix_fmt, width, height, encoder_->colour());

    AVFormatContext* container = nullptr;
    Check(avformat_alloc_output_context2(&container, format, nullptr, nullptr));
    container_.reset(container);
    container->strict_std_compliance = FF_COMPLIANCE_UNOFFICIAL;
    AVStream* stream = NotNull(avformat_new_stream(container, nullptr));
    Check(avcodec_parameters_from_context(stream->codecpar, &encoder_->context()));
    const bool isobmff =
        std::strcmp(format->name, "mp4") == 0 || std::strcmp(format->name, "mov") == 0;
    if (isobmff && stream->codecpar->codec_id == AV_CODEC_ID_HEVC) {
      // Some players show no hev1, the muxer's own choice; parameter sets are in the header anyhow.
      stream->codecpar->codec_tag = MKTAG('h', 'v', 'c', '1');
    }
    stream->time_base = encoder_->time_base();
    stream->sample_aspect_ratio = encoder_->context().sample_aspect_ratio;
    stream->avg_frame_rate = encoder_->context().framerate;
    if (!to_pipe_ && !source.path.empty()) CopyFrom(source);

    const std::string url = to_pipe_ ? "pipe:1" : "file:" + file_->temporary();
    Check(avio_open(&container->pb, url.c_str(), AVIO_FLAG_WRITE));
    AVDictionary* options = nullptr;
    // The source's clock, kept as it is.
    if (std::strcmp(format->name, "mpegts") == 0) av_dict_set(&options, "mpegts_copyts", "1", 0);
    // A pipe can't take back what is said in it: nothing before the first frame.
    const int error = to_pipe_ ? avformat_init_output(container, &options)
                               : avformat_write_header(container, &options);
    av_dict_free(&options);
    Check(error);
    headed_ = !to_pipe_;
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
    WriteHeader();
    encoder_->Send(0, nullptr);
    WriteEncoded();
    CopyUntil(INT64_MAX);
    Check(av_interleaved_write_frame(container_.get(), nullptr));
    Check(av_write_trailer(container_.get()));
    avio_flush(container_->pb);
    const int error = container_->pb->error;
    const int closed = avio_closep(&container_->pb);
    Check(error);
    Check(closed);
    if (file_) file_->Commit();
  }

 private:
  [[noreturn]] void Fail(const std::string& cause) const {
    throw Failure(Failure::Side::output, shown_ + ": " + cause);
  }
  void Check(int error) const {
    if (error < 0) Fail("can't be written: " + ErrorText(error));
  }

  void WriteHeader() {
    if (std::exchange(headed_, true)) return;
    Check(avformat_write_header(container_.get(), nullptr));
  }

  void CopyFrom(const ClipInfo& source) {
    try {
      copy_.emplace(source, shown_, *container_, warnings_);
    } catch (const Failure& failure) {
      warnings_.push_back(std::string(failure.what()) + "; its other streams are left out");
    }
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
      Fail(error.what());
    }
    WriteHeader();
    encoder_->Send(frame, std::move(converted));
    // Only as far as the video has come: the muxer holds what it can't interleave yet in memory.
    const FrameTime time = encoder_->TimeOf(frame);
    CopyUntil(av_rescale_q(time.pts, encoder_->time_base(), AV_TIME_BASE_Q) - Offset());
    WriteEncoded();
  }

  std::int64_t Offset() const { return copy_ ? copy_->offset() : 0; }

  void WriteEncoded() {
    const AVRational from = encoder_->time_base();
    const AVRational to = container_->streams[0]->time_base;
    const std::int64_t shift = av_rescale_q(Offset(), AV_TIME_BASE_Q, from);
    while (PacketPtr packet = encoder_->Receive()) {
      if (packet->pts != AV_NOPTS_VALUE) packet->pts -= shift;
      if (packet->dts != AV_NOPTS_VALUE) packet->dts -= shift;
      av_packet_rescale_ts(packet.get(), from, to);
      packet->stream_index = 0;
      Check(av_interleaved_write_frame(container_.get(), packet.get()));
      Check(container_->pb->error);
    }
  }

  void CopyUntil(std::int64_t time) {
    while (copy_ && copy_->time() <= time) {
      PacketPtr packet = copy_->Next();
      if (!packet) break;
      const int stream = packet->stream_index;
      const int error = av_interleaved_write_frame(container_.get(), packet.get());
      Check(container_->pb->error);
      if (error == AVERROR(ENOMEM)) throw std::bad_alloc();
      if (error < 0) {
        const std::string line = shown_ + ": packets of stream " + std::to_string(stream) +
                                 " can't be copied: " + ErrorText(error);
        if (warnings_.empty() || warnings_.back() != line) warnings_.push_back(line);
      }
    }
  }

  const std::string shown_;
  const bool to_pipe_;
  std::vector<std::string> warnings_;
  std::optional<OutputFile> file_;
  std::optional<Encoder> encoder_;
  std::optional<PixelsToFrame> to_frame_;
  std::unique_ptr<AVFormatContext, OutputDelete> container_;
  bool headed_ = false;
  std::optional<StreamCopy> copy_;
  std::optional<std::size_t> last_;
};

}  // namespace

std::unique_ptr<ClipWriter> ClipWriter::Create(const std::string& path, const ClipInfo& source,
                                               int width, int height,
                                               const EncodeSettings& settings) {
  return std::make_unique<FfmpegWriter>(path, source, width, height, settings);
}

}  // namespace calmframe::media
