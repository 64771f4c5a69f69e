#pragma once

#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "host/media/ffmpeg.h"
#include "host/media/output_file.h"
#include "host/media/stream_copy.h"

namespace calmframe::media {

// The file, the pipe or the pictures that a clip is written to: a container with the video stream
// and what is copied of the source's others. It has its name once it is finished, see ClipWriter;
// one that is destroyed before leaves nothing.
class ClipContainer {
 public:
  // Finds by the path what it is to be, and reserves its name. Throws Failure (output).
  ClipContainer(const std::string& path, const ClipInfo& source, const EncodeSettings& settings);

  const std::string& shown() const { return shown_; }  // the path in messages
  const AVOutputFormat& format() const { return *format_; }
  bool to_pipe() const { return to_pipe_; }
  // The codec that the pictures' extension picks; empty where there are none.
  const std::string& picture_codec() const { return picture_codec_; }

  // Adds the video stream, whose packets' times are ticks of `clock`, and the source's others.
  // Throws Failure (output). `warnings`: what is left out, until Finish.
  struct Video {
    const AVCodecParameters& parameters;
    AVRational clock, frame_rate, pixel_aspect;
  };
  void Begin(const Video& video, const ClipInfo& source, std::vector<std::string>& warnings);
  // A packet of the video, in its clock, of which the source's own start is not yet taken. In the
  // order that they are decoded in. Throws Failure (output).
  void Write(PacketPtr packet);
  // Copies the other streams as far as the video has come, in its clock: the muxer holds what it
  // can't interleave yet in memory.
  void CopyUntil(std::int64_t video_time);
  // Copies what is left, and gives the file its name.
  void Finish();

  [[noreturn]] void Fail(const std::string& cause) const;

 private:
  struct Delete {
    void operator()(AVFormatContext* container) const;
  };

  void Check(int error) const;
  void CheckWritten() const { Check(container_->pb ? container_->pb->error : write_error_); }
  static int CloseAndKeepError(AVFormatContext* container, AVIOContext* file);
  void WriteHeader();
  void CopyUntilCommon(std::int64_t time);
  void TellEarlyEnd();
  void CheckIndex() const;

  const std::string shown_;
  const bool to_pipe_;
  const AVOutputFormat* format_ = nullptr;
  std::string picture_codec_;
  const bool video_alone_;
  std::optional<OutputFile> file_;
  std::optional<OutputPictures> pictures_;
  int write_error_ = 0;  // of pictures
  std::unique_ptr<AVFormatContext, Delete> container_;
  AVRational clock_{1, 25};
  bool headed_ = false;
  std::optional<StreamCopy> copy_;
  std::vector<std::string>* warnings_ = nullptr;
  bool told_early_end_ = false;
};

}  // namespace calmframe::media
