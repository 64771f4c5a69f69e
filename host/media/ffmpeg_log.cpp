#include "host/media/ffmpeg_log.h"

#include <array>
#include <atomic>
#include <cstdio>
#include <exception>

#include "host/media/ffmpeg.h"

namespace calmframe::media {
namespace {

thread_local Heard* listener = nullptr;

// Of a decoder of ours, on any of its threads: its context, or a copy of it, leads to the count.
void CountComplaint(void* speaker, int level) {
  if (level > AV_LOG_INFO || !speaker) return;
  if (*static_cast<const AVClass* const*>(speaker) != avcodec_get_class()) return;
  void* const count = static_cast<AVCodecContext*>(speaker)->opaque;
  if (count) ++*static_cast<std::atomic<int>*>(count);
}

void Hear(void* speaker, int level, const char* format, va_list arguments) {
  CountComplaint(speaker, level);
  if (listener && level <= AV_LOG_WARNING) listener->Take(level, format, arguments);
}

}  // namespace

void ListenToFfmpeg() {
  av_log_set_level(AV_LOG_QUIET);
  av_log_set_callback(Hear);
}

Heard::Heard() {
  listener = this;
}

Heard::~Heard() {
  listener = nullptr;
}

void Heard::Take(int level, const char* format, va_list arguments) noexcept {
  std::array<char, 1024> said;
  std::vsnprintf(said.data(), said.size(), format, arguments);
  try {
    if (!goes_on_) lines_.push_back({"", level <= AV_LOG_ERROR});
    std::string& text = lines_.back().text;
    text += said.data();
    goes_on_ = !text.empty() && text.back() != '\n';
    while (!text.empty() && (text.back() == '\n' || text.back() == '.')) text.pop_back();
  } catch (const std::exception&) {
  }
}

std::string Heard::FirstError() const {
  for (const Line& line : lines_) {
    if (line.is_error) return line.text;
  }
  return "";
}

}  // namespace calmframe::media
