// Whatever a file holds, it opens as a clip or is refused with a line, and any frame of it can be
// asked for, and written beside the clip's other streams.

#include <algorithm>
#include <cstdint>
#include <string>
#include <vector>

#include "fuzz/input.h"
#include "fuzz/scratch_file.h"
#include "host/media/clip.h"
#include "host/media/glance.h"

namespace {

using namespace calmframe;
using namespace calmframe::media;

enum : std::uint8_t {
  kPromised = 1,      // opened by the packets' promises
  kPart = 2,          // of the second frame to the last
  kFound = 4,         // opened again with what was found
  kDamagedFound = 8,  // a byte of that another one
  kDeep = 16,         // read at 16 bits, else at 8
  kWritten = 32,      // to a file, beside its other streams
  kMovie = 64         // that is an MP4, else a Matroska file
};

// More is honest work, and the time is better spent on other files.
constexpr std::int64_t kMostPixels = 1 << 16;

template <class Pixel>
void ReadSome(ClipReader& clip) {
  const ClipInfo& info = clip.info();
  if (std::int64_t{info.width} * info.height > kMostPixels) return;
  std::vector<Pixel> pixels(static_cast<std::size_t>(info.width) *
                            static_cast<std::size_t>(info.height));
  const std::size_t last = info.frame_count - 1;
  for (const std::size_t frame : {std::size_t{0}, last, last / 2, std::size_t{0}}) {
    try {
      clip.Read(frame, pixels.data(), std::ptrdiff_t{sizeof(Pixel)} * info.width);
    } catch (const Failure&) {
    }
  }
}

// Of its first frames, or without the first one.
void WriteSome(ClipReader& clip, std::uint8_t flags, const std::string& path) {
  const ClipInfo& info = clip.info();
  if (std::int64_t{info.width} * info.height > kMostPixels) return;
  constexpr std::size_t kMostFrames = 8;
  const FrameRange range{(flags & kPart) && info.frame_count > 1 ? std::size_t{1} : 0,
                         std::min(info.frame_count, kMostFrames)};
  const ClipInfo part = PartOf(info, range);
  std::vector<HX_Pixel8> pixels(static_cast<std::size_t>(info.width) *
                                static_cast<std::size_t>(info.height));
  EncodeSettings settings;
  settings.codec = flags & kMovie ? "mpeg4" : "ffv1";
  settings.overwrite = true;
  const auto writer = ClipWriter::Create(path, part, info.width, info.height, settings);
  for (std::size_t frame = range.first; frame < range.end; ++frame) {
    const std::ptrdiff_t row_bytes = std::ptrdiff_t{sizeof(HX_Pixel8)} * info.width;
    clip.Read(frame, pixels.data(), row_bytes);
    writer->Write(frame - range.first, pixels.data(), row_bytes);
  }
  writer->Finish();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  const auto flags = input.Take<std::uint8_t>();
  static const fuzz::ScratchFile file;
  file.Write(input.TakeRest());
  try {
    GlanceAt(file.path());
    const auto part = [](const ClipInfo& info) {
      return FrameRange{info.frame_count > 1 ? std::size_t{1} : 0, info.frame_count};
    };
    const auto clip = flags & kPromised ? ClipReader::OpenPromised(
                                              file.path(), flags & kPart ? ClipReader::Part(part)
                                                                         : ClipReader::Part())
                                        : ClipReader::Open(file.path());
    if (flags & kDeep) {
      ReadSome<HX_Pixel16>(*clip);
    } else {
      ReadSome<HX_Pixel8>(*clip);
    }
    if (flags & kWritten) {
      static const fuzz::ScratchFile written;
      WriteSome(*clip, flags, written.path() + (flags & kMovie ? ".mp4" : ".mkv"));
    }
    if (!(flags & kFound)) return 0;
    std::vector<std::uint8_t> found = clip->found()->Bytes();
    if ((flags & kDamagedFound) && !found.empty()) found[size % found.size()] ^= flags;
    ReadSome<HX_PixelFloat>(*ClipReader::Open(file.path(), found));
  } catch (const Failure&) {
  }
  return 0;
}
