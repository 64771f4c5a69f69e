#pragma once

#include <memory>
#include <string>
#include <vector>

#include "host/media/clip.h"
#include "host/pixels/world_buffer.h"
#include "host/timeline/picture.h"

namespace calmframe {

// A clip before and after, beside each other in one file, before on the left: a second result of
// the frames that are drawn for the first one, which stands whatever becomes of this one.
class SideBySide {
 public:
  // Both halves are as large as the clip where the encoder takes that, else of half its sides
  // (rounded down), and progressive; then warnings() has a line. labelled: with a word on each and
  // a seam between them. Throws media::Failure (output).
  SideBySide(const std::string& path, const media::ClipInfo& info,
             const media::EncodeSettings& encode, bool labelled);

  // As media::ClipWriter. What fails is kept; nothing is written from then on, and no file is left.
  void Write(std::size_t frame, const host::Picture& before, const host::WorldBuffer& after);
  void Finish();

  std::vector<std::string> warnings() const;
  // Throws media::Failure (output) if a write or the end failed.
  void Throw() const;

 private:
  void Label(host::WorldBuffer& both) const;
  template <class Work>
  void Attempt(const Work& work);

  const bool labelled_;
  int width_, height_;  // of a half
  std::vector<std::string> warnings_;
  std::unique_ptr<media::ClipWriter> writer_;  // null once it has failed
  std::string failure_;
};

}  // namespace calmframe
