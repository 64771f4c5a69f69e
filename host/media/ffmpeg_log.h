#pragma once

#include <cstdarg>
#include <string>
#include <vector>

namespace calmframe::media {

// From now on FFmpeg prints nothing; its decoders' complaints are counted in the std::atomic<int>
// that a context's `opaque` leads to, and Heard hears. Any thread.
void ListenToFfmpeg();

// What FFmpeg says on this thread, warnings and worse, while it lives. One at a time.
class Heard {
 public:
  Heard();
  ~Heard();
  Heard(const Heard&) = delete;
  Heard& operator=(const Heard&) = delete;

  struct Line {
    std::string text;  // without a stop at its end
    bool is_error = false;
  };
  const std::vector<Line>& lines() const { return lines_; }
  // The first error; empty where none was said.
  std::string FirstError() const;

  // For the log. Goes without what it has no memory for.
  void Take(int level, const char* format, va_list arguments) noexcept;

 private:
  std::vector<Line> lines_;
  bool goes_on_ = false;  // the last line has not ended
};

}  // namespace calmframe::media
