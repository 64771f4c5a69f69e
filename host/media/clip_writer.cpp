#include <cstring>
#include <filesystem>
#include <optional>
#include <stdexcept>
#include <utility>

#include "host/media/clip.h"
#include "host/media/clip_files.h"
#include "host/media/decoder.h"
#include "host/media/encoder.h"
#include "host/media/output_choice.h"
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
    const bool into_folder = path.ends_with('/');
    const std::string name = into_folder ? path + "%06d.png" : path;
    const AVOutputFormat* format =
        to_pipe_ ? FormatForPipe(settings) : av_guess_format(nullptr, name.c_str(), nullptr);
    std::error_code ignored;
    if (!into_folder && std::filesystem::is_directory(path, ignored)) {
      Fail("is a directory; with a / at its end, pictures are written into it");
    }
    const std::string extension = std::filesystem::path(path).extension().string();
    const bool pictures = format && HoldsPictures(*format);
    const auto numbered = NumberedPath::Of(name);
    if (pictures && !numbered) {
      Fail("is one picture alone; f%04d" + extension + " names one for each frame");
    }
    if (!format || format->video_codec == AV_CODEC_ID_NONE ||
        ((format->flags & AVFMT_NOFILE) && !pictures)) {
      Fail((extension.empty() ? "its name has no extension to tell the kind of file"
                              : "no kind of video file ends in '" + extension + "'") +
           "; .mp4, .mov, .mkv and .webm are some");
    }
    EncodeSettings encode = settings;
    std::vector<std::string> sources;
    if (!source.path.empty()) sources = FilesOf(source.path).paths;
    if (pictures) {
      encode.codec = avcodec_get_name(
          av_guess_codec(format, nullptr, name.c_str(), nullptr, AVMEDIA_TYPE_VIDEO));
      if (!settings.codec.empty() && settings.codec != encode.codec) {
        Fail("the pictures' extension picks their codec, " + encode.codec);
      }
      pictures_.emplace(*numbered, sources, source.frame_count, settings.overwrite, into_folder);
    } else if (!to_pipe_) {
      file_.emplace(path, sources.empty() ? "" : sources[0], settings.overwrite);
    }
    encoder_.emplace(shown_, *format, source, width, height, encode, warnings_);
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
    const bool raw_frames = std::strcmp(format->name, "yuv4mpegpipe") == 0;
    if (raw_frames) TagRawFrames(source.colour, *stream->codecpar);
    if (!raw_frames && !pictures && !source.path.empty()) CopyFrom(source);

    if ((stream->codecpar->codec_id == AV_CODEC_ID_VP8 ||
         stream->codecpar->codec_id == AV_CODEC_ID_VP9) &&
        stream->codecpar->format == AV_PIX_FMT_YUVA420P) {
      av_dict_set(&stream->metadata, "alpha_mode", "1", 0);
    }

    const std::string url = to_pipe_   ? "pipe:1"
                            : pictures ? "file:" + pictures_->temporary().Pattern()
                                       : "file:" + file_->temporary();
    container->url = NotNull(av_strdup(url.c_str()));
    if (pictures) {
      container->opaque = &write_error_;
      container->io_close2 = CloseAndKeepError;
    } else {
      Check(avio_open(&container->pb, url.c_str(), AVIO_FLAG_WRITE));
    }
    AVDictionary* options = nullptr;
    // Whoever plays a file while it is on its way needs the index in front.
    if (format->priv_class && av_opt_find(container->priv_data, "movflags", nullptr, 0, 0)) {
      av_dict_set(&options, "movflags", "+faststart", 0);
    }
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
    if (container_->pb) {
      avio_flush(container_->pb);
      const int error = container_->pb->error;
      const int closed = avio_closep(&container_->pb);
      Check(error);
      Check(closed);
    }
    if (file_) file_->Commit();
    if (pictures_) pictures_->Commit();
  }

 private:
  [[noreturn]] void Fail(const std::string& cause) const {
    throw Failure(Failure::Side::output, shown_ + ": " + cause);
  }
  void Check(int error) const {
    if (error < 0) Fail("can't be written: " + ErrorText(error));
  }

  void CheckWritten() const { Check(container_->pb ? container_->pb->error : write_error_); }
  // The muxer of pictures closes each without a look at what came of it.
  static int CloseAndKeepError(AVFormatContext* container, AVIOContext* file) {
    avio_flush(file);
    if (file->error < 0) *static_cast<int*>(container->opaque) = file->error;
    return avio_close(file);
  }

  void WriteHeader() {
    if (std::exchange(headed_, true)) return;
    Check(avformat_write_header(container_.get(), nullptr));
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
    warnings_.push_back(shown_ + ": raw frames don't tell the clip's colour tags (" + dropped +
                        "); " +
                        (to_pipe_ ? "--codec rawvideo keeps them" : "an .mkv file keeps them"));
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
      CheckWritten();
    }
  }

  void CopyUntil(std::int64_t time) {
    while (copy_ && copy_->time() <= time) {
      PacketPtr packet = copy_->Next();
      if (!packet) break;
      const int stream = packet->stream_index;
      const int error = av_interleaved_write_frame(container_.get(), packet.get());
      CheckWritten();
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
  std::optional<OutputPictures> pictures_;
  int write_error_ = 0;  // of pictures
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
