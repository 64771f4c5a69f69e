#include "host/media/decoder.h"

#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>
#include <fstream>
#include <iterator>
#include <numeric>
#include <string_view>

#include "host/media/clip_files.h"
#include "host/media/ffmpeg_log.h"

namespace calmframe::media {
namespace {

[[noreturn]] void Fail(const std::string& path, const std::string& cause) {
  throw Failure(Failure::Side::input, path + ": " + cause);
}

// A damaged file asks for any amount.
[[noreturn]] void FailForMemory(const std::string& path) {
  Fail(path, "takes more memory than there is, or is damaged");
}

// FFmpeg's words, but for those that say no more than that it failed.
[[noreturn]] void Fail(const std::string& path, const std::string& cause, int error) {
  if (error == AVERROR(ENOMEM)) FailForMemory(path);
  const bool says_more = error != AVERROR_INVALIDDATA && error != AVERROR_EOF;
  Fail(path, says_more ? cause + ": " + ErrorText(error) : cause);
}

// Many damaged packets in a row end the stream: some demuxers return the same error for ever.
constexpr int kErrorLimit = 1000;

// Of an MP4 or MOV file: its "moov" box, which most recorders write last.
bool LacksIndex(const std::string& file) {
  std::ifstream in(file, std::ios::binary);
  std::uint8_t head[8];
  const auto number = [&head](std::size_t bytes) {  // big-endian
    return std::accumulate(head, head + bytes, std::uint64_t{0},
                           [](std::uint64_t sum, std::uint8_t byte) { return sum << 8 | byte; });
  };
  const auto read = [&] { return bool(in.read(reinterpret_cast<char*>(head), sizeof head)); };
  bool is_movie = false;
  for (std::uint64_t at = 0; in.seekg(static_cast<std::streamoff>(at));) {
    if (!read()) break;
    const std::string_view type(reinterpret_cast<const char*>(head) + 4, 4);
    if (type == "moov") return false;
    is_movie = is_movie || type == "ftyp" || type == "mdat";
    std::uint64_t size = number(4);
    if (size == 1 && read()) size = number(8);
    if (size < 8 || size > INT64_MAX - at) break;
    at += size;
  }
  return is_movie;
}

// FFmpeg's own decoders of VP8 and VP9 leave out the alpha beside the frames.
const AVCodec* AlphaDecoderFor(const AVStream& stream) {
  const AVDictionaryEntry* mode = av_dict_get(stream.metadata, "alpha_mode", nullptr, 0);
  if (!mode || std::string_view(mode->value) != "1") return nullptr;
  switch (stream.codecpar->codec_id) {
    case AV_CODEC_ID_VP8:
      return avcodec_find_decoder_by_name("libvpx");
    case AV_CODEC_ID_VP9:
      return avcodec_find_decoder_by_name("libvpx-vp9");
    default:
      return nullptr;
  }
}

// All demuxers but those that open what a file names, other files or addresses: a clip is what is
// in its file. And but the one that shows text as pictures.
std::string DemuxersForClips() {
  constexpr std::string_view kOthers[] = {"concat", "dash", "hls", "imf", "rtp",
                                          "rtsp",   "sap",  "sdp", "tty", "webm_dash_manifest"};
  std::string names;
  void* next = nullptr;
  while (const AVInputFormat* const format = av_demuxer_iterate(&next)) {
    const std::string_view name = format->name;  // or several, with commas between
    const std::string_view first = name.substr(0, name.find(','));
    if (std::find(std::begin(kOthers), std::end(kOthers), first) != std::end(kOthers)) continue;
    if (!names.empty()) names += ',';
    names += name;
  }
  return names;
}

}  // namespace

InputPtr OpenInput(const std::string& path) {
  ListenToFfmpeg();
  const ClipFiles files = FilesOf(path);
  const std::string& file = files.paths[0];
  struct stat status;
  if (stat(file.c_str(), &status) != 0) Fail(path, std::strerror(errno));
  if (access(file.c_str(), R_OK) != 0) Fail(path, std::strerror(errno));
  if (status.st_size == 0) Fail(path, "is empty");

  AVFormatContext* opened = nullptr;
  AVDictionary* options = nullptr;
  static const std::string demuxers = DemuxersForClips();
  if (av_dict_set(&options, "protocol_whitelist", "file", 0) < 0 ||
      av_dict_set(&options, "format_whitelist", demuxers.c_str(), 0) < 0) {
    throw std::bad_alloc();
  }
  const AVInputFormat* pictures = nullptr;
  if (!files.pattern.empty()) {
    pictures = av_find_input_format("image2");
    av_dict_set(&options, "pattern_type", files.is_glob ? "glob" : "sequence", 0);
    av_dict_set_int(&options, "start_number", files.first_number, 0);
  }
  const std::string url = pictures ? files.pattern : "file:" + file;
  int error = avformat_open_input(&opened, url.c_str(), pictures, &options);
  av_dict_free(&options);
  if (error < 0 && LacksIndex(file)) {
    Fail(path,
         "its index is missing, without which no frame is found: the recording or the copy "
         "broke off before its end");
  }
  constexpr char kNoClip[] = "not a video file, or damaged at its start";
  // Numbers that demuxers give for what they can't read; of the system's own, ruled out above.
  if (error == AVERROR(EINVAL) || error == AVERROR(EBUSY)) Fail(path, kNoClip);
  if (error < 0) Fail(path, kNoClip, error);
  InputPtr container(opened);
  error = avformat_find_stream_info(container.get(), nullptr);
  if (error < 0) Fail(path, "its streams can't be read", error);
  return container;
}

AVStream& VideoStreamOf(const AVFormatContext& container, const std::string& path) {
  int best = av_find_best_stream(const_cast<AVFormatContext*>(&container), AVMEDIA_TYPE_VIDEO, -1,
                                 -1, nullptr, 0);
  for (unsigned i = 0; best < 0 && i < container.nb_streams; ++i) {
    if (container.streams[i]->codecpar->codec_type == AVMEDIA_TYPE_VIDEO)
      best = static_cast<int>(i);
  }
  if (best < 0 || (container.streams[best]->disposition & AV_DISPOSITION_ATTACHED_PIC)) {
    Fail(path, "has no video stream");
  }
  AVStream& stream = *container.streams[best];
  const AVCodecParameters& parameters = *stream.codecpar;
  if (std::int64_t{parameters.width} * parameters.height > kMaximumPixels) {
    Fail(path, "frames of " + std::to_string(parameters.width) + " x " +
                   std::to_string(parameters.height) + " pixels are too large");
  }
  return stream;
}

Decoder::Decoder(const std::string& path, int threads)
    : path_(path), threads_(threads), packet_(NewPacket()) {
  Open();
}

void Decoder::Open() {
  codec_.reset();
  container_ = OpenInput(path_);
  stream_ = nullptr;
  draining_ = false;
  errors_in_a_row_ = 0;

  stream_ = &VideoStreamOf(*container_, path_);
  const AVCodecParameters& parameters = *stream_->codecpar;
  if (parameters.codec_id == AV_CODEC_ID_NONE) {
    Fail(path_, "its video is of a kind that is not known, or it is damaged at its start");
  }
  const AVCodec* const with_alpha = AlphaDecoderFor(*stream_);
  const AVCodec* decoder = with_alpha ? with_alpha : avcodec_find_decoder(parameters.codec_id);
  if (!decoder) {
    Fail(path_, std::string("no decoder for ") + avcodec_get_name(parameters.codec_id));
  }
  codec_.reset(NotNull(avcodec_alloc_context3(decoder)));
  int error = avcodec_parameters_to_context(codec_.get(), &parameters);
  codec_->pkt_timebase = stream_->time_base;
  // Other libraries' decoders give their versions as they open.
  codec_->opaque = decoder->wrapper_name ? nullptr : &complaints_;
  codec_->thread_count = threads_;
  codec_->thread_type = FF_THREAD_FRAME | FF_THREAD_SLICE;
  codec_->max_pixels = kMaximumPixels;
  if (error >= 0) error = avcodec_open2(codec_.get(), decoder, nullptr);
  if (error < 0) Fail(path_, std::string("decoder ") + decoder->name + " can't begin", error);
  codec_->opaque = &complaints_;
}

bool Decoder::Feed() {
  while (!draining_) {
    const int error = av_read_frame(container_.get(), packet_.get());
    if (error == AVERROR(ENOMEM)) FailForMemory(path_);
    if (error < 0 && error != AVERROR_EOF && ++errors_in_a_row_ < kErrorLimit) {
      ++damage_;
      // Only such a demuxer is worth asking again; a failing disk stays as it is.
      if (error == AVERROR_INVALIDDATA || error == AVERROR(EAGAIN)) continue;
    }
    if (error < 0) {
      draining_ = true;
      return avcodec_send_packet(codec_.get(), nullptr) >= 0;
    }
    const AVStream& from = *container_->streams[packet_->stream_index];
    if (TimeOrNone(packet_->pts) != AV_NOPTS_VALUE &&
        TimeOrNone(packet_->duration) != AV_NOPTS_VALUE) {
      const std::int64_t end =
          av_rescale_q(packet_->pts + packet_->duration, from.time_base, AV_TIME_BASE_Q);
      if (TimeOrNone(end) != AV_NOPTS_VALUE) last_time_ = std::max(last_time_, end);
    }
    if (&from != stream_) {
      av_packet_unref(packet_.get());
      continue;
    }
    if (packet_->flags & AV_PKT_FLAG_CORRUPT) ++damage_;
    const int sent = avcodec_send_packet(codec_.get(), packet_.get());
    av_packet_unref(packet_.get());
    if (sent == AVERROR(ENOMEM)) FailForMemory(path_);
    if (sent < 0) ++damage_;
    return true;
  }
  return false;
}

FramePtr Decoder::Next() {
  FramePtr frame = NewFrame();
  for (;;) {
    const int error = avcodec_receive_frame(codec_.get(), frame.get());
    if (error == 0) {
      errors_in_a_row_ = 0;
      if (frame->decode_error_flags || (frame->flags & AV_FRAME_FLAG_CORRUPT)) ++damage_;
      return frame;
    }
    if (error == AVERROR_EOF) return nullptr;
    if (error == AVERROR(ENOMEM)) FailForMemory(path_);
    if (error == AVERROR(EAGAIN)) {
      if (!Feed()) return nullptr;
      continue;
    }
    ++damage_;
    if (++errors_in_a_row_ >= kErrorLimit) return nullptr;
  }
}

bool Decoder::Seek(std::int64_t pts) {
  if (av_seek_frame(container_.get(), stream_->index, pts, AVSEEK_FLAG_BACKWARD) < 0) return false;
  avcodec_flush_buffers(codec_.get());
  draining_ = false;
  errors_in_a_row_ = 0;
  return true;
}

void Decoder::Rewind() {
  Open();
}

}  // namespace calmframe::media
