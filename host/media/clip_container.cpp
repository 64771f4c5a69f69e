#include "host/media/clip_container.h"

#include <cstring>
#include <filesystem>
#include <utility>

#include "host/media/clip_files.h"
#include "host/media/decoder.h"
#include "host/media/encoder.h"
#include "host/media/ffmpeg_log.h"
#include "host/media/output_choice.h"

namespace calmframe::media {
namespace {

// MP4 and its relatives, by what their muxer knows.
bool IsIsobmff(const AVFormatContext& container) {
  return container.oformat->priv_class &&
         av_opt_find(container.priv_data, "movflags", nullptr, 0, 0) != nullptr;
}

}  // namespace

void ClipContainer::Delete::operator()(AVFormatContext* container) const {
  if (container->pb) avio_closep(&container->pb);
  avformat_free_context(container);
}

ClipContainer::ClipContainer(const std::string& path, const ClipInfo& source,
                             const EncodeSettings& settings)
    : shown_(path == "-" ? "standard output" : path),
      to_pipe_(path == "-"),
      video_alone_(settings.video_alone) {
  ListenToFfmpeg();
  const bool into_folder = path.ends_with('/');
  const std::string name = into_folder ? path + "%06d.png" : path;
  format_ = to_pipe_ ? FormatForPipe(settings) : av_guess_format(nullptr, name.c_str(), nullptr);
  std::error_code ignored;
  if (!into_folder && std::filesystem::is_directory(path, ignored)) {
    Fail("is a directory; with a / at its end, pictures are written into it");
  }
  const std::string extension = std::filesystem::path(path).extension().string();
  const bool pictures = format_ && HoldsPictures(*format_);
  const auto numbered = NumberedPath::Of(name);
  if (pictures && !numbered) {
    Fail("is one picture alone; f%04d" + extension + " names one for each frame");
  }
  if (!format_ || format_->video_codec == AV_CODEC_ID_NONE ||
      ((format_->flags & AVFMT_NOFILE) && !pictures)) {
    Fail((extension.empty() ? "its name has no extension to tell the kind of file"
                            : "no kind of video file ends in '" + extension + "'") +
         "; .mp4, .mov, .mkv and .webm are some");
  }
  std::vector<std::string> sources;
  if (!source.path.empty()) sources = FilesOf(source.path).paths;
  if (pictures) {
    picture_codec_ = avcodec_get_name(
        av_guess_codec(format_, nullptr, name.c_str(), nullptr, AVMEDIA_TYPE_VIDEO));
    if (!settings.codec.empty() && settings.codec != picture_codec_) {
      Fail("the pictures' extension picks their codec, " + picture_codec_);
    }
    pictures_.emplace(*numbered, sources, source.frame_count, settings.overwrite, into_folder);
  } else if (!to_pipe_) {
    file_.emplace(path, sources.empty() ? "" : sources[0], settings.overwrite);
  }
}

void ClipContainer::Begin(const Video& video, const ClipInfo& source,
                          std::vector<std::string>& warnings) {
  warnings_ = &warnings;
  clock_ = video.clock;
  AVFormatContext* container = nullptr;
  Check(avformat_alloc_output_context2(&container, format_, nullptr, nullptr));
  container_.reset(container);
  container->strict_std_compliance = FF_COMPLIANCE_UNOFFICIAL;
  AVStream* stream = NotNull(avformat_new_stream(container, nullptr));
  Check(avcodec_parameters_copy(stream->codecpar, &video.parameters));
  stream->codecpar->codec_tag = TagFor(*format_, video.parameters);
  const bool isobmff =
      std::strcmp(format_->name, "mp4") == 0 || std::strcmp(format_->name, "mov") == 0;
  if (isobmff && stream->codecpar->codec_id == AV_CODEC_ID_HEVC) {
    // Some players show no hev1, the muxer's own choice; parameter sets are in the header anyhow.
    stream->codecpar->codec_tag = MKTAG('h', 'v', 'c', '1');
  }
  stream->time_base = clock_;
  stream->sample_aspect_ratio = video.pixel_aspect;
  stream->avg_frame_rate = video.frame_rate;
  const bool raw_frames = std::strcmp(format_->name, "yuv4mpegpipe") == 0;
  if (!raw_frames && !pictures_ && !video_alone_ && !source.path.empty()) {
    copy_.emplace(source, shown_, *container, warnings);
  }

  if ((stream->codecpar->codec_id == AV_CODEC_ID_VP8 ||
       stream->codecpar->codec_id == AV_CODEC_ID_VP9) &&
      stream->codecpar->format == AV_PIX_FMT_YUVA420P) {
    av_dict_set(&stream->metadata, "alpha_mode", "1", 0);
  }

  const std::string url = to_pipe_    ? "pipe:1"
                          : pictures_ ? "file:" + pictures_->temporary().Pattern()
                                      : "file:" + file_->temporary();
  container->url = NotNull(av_strdup(url.c_str()));
  if (pictures_) {
    container->opaque = &write_error_;
    container->io_close2 = CloseAndKeepError;
  } else {
    Check(avio_open(&container->pb, url.c_str(), AVIO_FLAG_WRITE));
  }
  AVDictionary* options = nullptr;
  // Whoever plays a file while it is on its way needs the index in front.
  if (IsIsobmff(*container)) {
    av_dict_set(&options, "movflags", "+faststart", 0);
  }
  // The source's clock, kept as it is.
  if (std::strcmp(format_->name, "mpegts") == 0) av_dict_set(&options, "mpegts_copyts", "1", 0);
  // A pipe can't take back what is said in it: nothing before the first frame.
  const int error = to_pipe_ ? avformat_init_output(container, &options)
                             : avformat_write_header(container, &options);
  av_dict_free(&options);
  Check(error);
  headed_ = !to_pipe_;
}

void ClipContainer::Write(PacketPtr packet) {
  WriteHeader();
  const std::int64_t shift = copy_ ? av_rescale_q(copy_->offset(), AV_TIME_BASE_Q, clock_) : 0;
  if (packet->pts != AV_NOPTS_VALUE) packet->pts -= shift;
  if (packet->dts != AV_NOPTS_VALUE) packet->dts -= shift;
  av_packet_rescale_ts(packet.get(), clock_, container_->streams[0]->time_base);
  packet->stream_index = 0;
  Check(av_interleaved_write_frame(container_.get(), packet.get()));
  CheckWritten();
}

void ClipContainer::CopyUntil(std::int64_t video_time) {
  WriteHeader();
  if (copy_) CopyUntilCommon(av_rescale_q(video_time, clock_, AV_TIME_BASE_Q) - copy_->offset());
}

void ClipContainer::CopyUntilCommon(std::int64_t time) {
  while (copy_ && copy_->time() <= time) {
    PacketPtr packet = copy_->Next();
    if (!packet) return TellEarlyEnd();
    const int stream = packet->stream_index;
    const int error = av_interleaved_write_frame(container_.get(), packet.get());
    CheckWritten();
    if (error == AVERROR(ENOMEM)) throw std::bad_alloc();
    if (error < 0) {
      const std::string line = shown_ + ": packets of stream " + std::to_string(stream) +
                               " can't be copied: " + ErrorText(error);
      if (warnings_->empty() || warnings_->back() != line) warnings_->push_back(line);
    }
  }
}

// Of what can't be read the picture tells too, but another way.
void ClipContainer::TellEarlyEnd() {
  if (copy_->error() == 0 || told_early_end_) return;
  told_early_end_ = true;
  warnings_->push_back(shown_ + ": the other streams of the clip can't be read to their end: " +
                       ErrorText(copy_->error()));
}

void ClipContainer::Finish() {
  WriteHeader();
  CopyUntilCommon(INT64_MAX);
  Check(av_interleaved_write_frame(container_.get(), nullptr));
  Check(av_write_trailer(container_.get()));
  if (container_->pb) {
    avio_flush(container_->pb);
    const int error = container_->pb->error;
    const int closed = avio_closep(&container_->pb);
    Check(error);
    Check(closed);
  }
  if (file_) {
    CheckIndex();
    file_->Commit();
  }
  if (pictures_) pictures_->Commit();
}

// The muxer of MP4 goes on, and tells nothing, where a part of the index finds no memory.
void ClipContainer::CheckIndex() const {
  if (!IsIsobmff(*container_)) return;
  AVFormatContext* opened = nullptr;
  avformat_open_input(&opened, file_->temporary().c_str(), nullptr, nullptr);
  const InputPtr written(opened);
  const auto frames = [](const AVFormatContext& container) {
    const AVStream* const first = container.nb_streams > 0 ? container.streams[0] : nullptr;
    return first && first->codecpar->codec_type == AVMEDIA_TYPE_VIDEO ? first->nb_frames : -1;
  };
  if (!written || frames(*written) != frames(*container_)) Fail("can't be written: no whole index");
}

void ClipContainer::Fail(const std::string& cause) const {
  throw Failure(Failure::Side::output, shown_ + ": " + cause);
}

void ClipContainer::Check(int error) const {
  if (error < 0) Fail("can't be written: " + ErrorText(error));
}

// The muxer of pictures closes each without a look at what came of it.
int ClipContainer::CloseAndKeepError(AVFormatContext* container, AVIOContext* file) {
  avio_flush(file);
  if (file->error < 0) *static_cast<int*>(container->opaque) = file->error;
  return avio_close(file);
}

void ClipContainer::WriteHeader() {
  if (std::exchange(headed_, true)) return;
  Check(avformat_write_header(container_.get(), nullptr));
}

}  // namespace calmframe::media
