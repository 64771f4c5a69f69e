#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <memory>
#include <optional>
#include <stdexcept>
#include <string>
#include <vector>

#include "platform/hx/hx_pixel.h"

// Video files in and out. Frames are numbered 0 .. frame_count - 1 in the order shown, each exactly
// one frame of the file whatever its time stamp. Pixels are as shown: rotation metadata is applied,
// pixel aspect is not.
namespace calmframe::media {

// That a clip can have: four days at 29 a second; an index of so many takes some 400 MB.
constexpr std::int64_t kMaximumFrames = 10'000'000;

// What went wrong with a file, in one line that names it. `input`: reading; `output`: writing.
class Failure : public std::runtime_error {
 public:
  enum class Side { input, output };
  Failure(Side failed_side, const std::string& line)
      : std::runtime_error(line), side(failed_side) {}
  const Side side;
};

struct Ratio {
  std::int64_t num = 1;
  std::int64_t den = 1;
  bool operator==(const Ratio&) const = default;
};

enum class FieldOrder { progressive, top_first, bottom_first };

// Time of a frame, in ticks of the clip's time base. Strictly ascending from frame to frame: where
// the file lacks a time stamp or repeats one, the next free tick stands.
struct FrameTime {
  std::int64_t pts = 0;
  std::int64_t duration = 0;
  bool operator==(const FrameTime&) const = default;
};

// Frames of a clip, the end excluded.
struct FrameRange {
  std::size_t first = 0, end = 0;
  std::size_t size() const { return end - first; }
  bool Holds(const FrameRange& other) const { return first <= other.first && other.end <= end; }
  bool operator==(const FrameRange&) const = default;
};

// Where a clip that is a part of a longer one begins there: at which frame, and at which of its
// ticks.
struct Cut {
  std::size_t frame = 0;
  std::int64_t pts = 0;
  bool operator==(const Cut&) const = default;
};

// The file's colour tags as it has them, code points of ITU-T H.273 (2: unspecified).
struct ColourTags {
  int primaries = 2;
  int transfer = 2;
  int matrix = 2;
  int range = 0;            // 0 unspecified, 1 limited, 2 full
  int chroma_location = 0;  // 0 unspecified, 1 left, 2 centre, 3 top left, 4 top, 5, 6 bottom
  bool operator==(const ColourTags&) const = default;
};

struct ClipInfo {
  std::string path;  // empty: made, not read; such a clip has no other streams
  int width = 0;     // as shown
  int height = 0;
  Ratio pixel_aspect;  // width : height of one pixel as shown
  Ratio frame_rate;    // average; a clip with varying rate keeps its own time stamps
  std::size_t frame_count = 0;
  Ratio time_base{1, 25};        // of times, in seconds a tick
  std::vector<FrameTime> times;  // one a frame; empty for a made clip: even times at frame_rate
  std::string codec;             // of the video stream
  std::string pixel_format;      // of the decoded frames, FFmpeg's name; empty of a made clip
  int bit_depth = 8;             // of a component in the file
  bool has_alpha = false;
  int rotation = 0;       // degrees clockwise that were applied to the pixels: 0, 90, 180 or 270
  bool mirrored = false;  // left and right were swapped too, after the rotation
  ColourTags colour;
  FieldOrder field_order = FieldOrder::progressive;
  int stream = -1;         // the video stream's place in the file
  std::optional<Cut> cut;  // of PartOf; then frames and times count from the part's first
  std::string warning;  // one line, empty when all is well: a damaged stream, and how many frames
                        // of it decode
  bool operator==(const ClipInfo&) const = default;
};

// The clip as whoever writes a part of it sees it; all of it is the clip itself. range: one frame
// at least, of a clip that is no part.
ClipInfo PartOf(const ClipInfo& clip, const FrameRange& range);

// What stands behind a reader's info: frames; or still promises of the container; or promises that
// the frames have broken, after which the reader and those made of it give no frame.
enum class Standing { decoded, promised, broken };

// What is known of a clip's frames, to be kept beside work that was made of it. Any thread.
class FoundFrames {
 public:
  virtual ~FoundFrames() = default;
  // Changes once at most, from `promised`, before the frame is given that decides it.
  virtual Standing standing() const = 0;
  // For ClipReader::Open, in this process or another. Some nine bytes a frame; none unless it
  // stands decoded.
  virtual std::vector<std::uint8_t> Bytes() const = 0;
};

// Reads any frame of a clip's first video stream. For one thread at a time.
class ClipReader {
 public:
  // Opens what FilesOf takes and finds every frame, which costs decoding all of it. Not so where
  // `found` tells what was found before in a file of the same contents; whatever else stands there,
  // or comes from other libraries, counts for nothing. Throws Failure (input).
  static std::unique_ptr<ClipReader> Open(const std::string& path,
                                          const std::vector<std::uint8_t>& found = {});
  // The same by the promises of its packets: whoever reads all frames in order anyhow, from the
  // first on, spares decoding them once more, but has to look at how found() stands when it has
  // read them, and to open the clip anew where the promise is broken. A clip whose promises are not
  // worth much is decoded all the same.
  // With a `part`, which is asked once the times of all frames are known: the same of these frames
  // alone; the others are neither decoded nor looked at, and cost a search from the start if they
  // are asked for after all. Throws Failure (input), and what `part` throws.
  using Part = std::function<FrameRange(const ClipInfo& clip)>;
  static std::unique_ptr<ClipReader> OpenPromised(const std::string& path, const Part& part = {});
  virtual ~ClipReader() = default;

  // Another reader of the clip, with a place of its own. One of a file doesn't search it again for
  // its frames, but decodes first what is still promised. Throws Failure (input).
  virtual std::unique_ptr<ClipReader> Again() { return Open(info().path); }

  // Of a clip whose frames are read in order, and then once more by this reader or by others made
  // of it: from now on the last of those that are read, as many as fit in `bytes`, stay as they
  // were decoded. 0, as at first: no more do, and those that did go as they are read. A frame is
  // the same either way.
  virtual void KeepDecoded(std::size_t /*bytes*/) {}

  virtual const ClipInfo& info() const = 0;
  // Null of a clip that is made, not read.
  virtual std::shared_ptr<const FoundFrames> found() const { return nullptr; }

  // Writes frame `frame` into info().height rows of info().width pixels, row_bytes apart, alpha as
  // in the file or full. Ascending frames are decoded ahead on a thread of the reader's own. Throws
  // Failure (input).
  virtual void Read(std::size_t frame, HX_Pixel8* pixels, std::ptrdiff_t row_bytes) = 0;
  virtual void Read(std::size_t frame, HX_Pixel16* pixels, std::ptrdiff_t row_bytes) = 0;
  virtual void Read(std::size_t frame, HX_PixelFloat* pixels, std::ptrdiff_t row_bytes) = 0;
};

struct EncodeSettings {
  std::string codec;  // an encoder's or codec's name; empty: H.264 (or what the container takes)
  int crf = 18;       // for encoders with such a setting; for other lossy ones a like quality
  // Empty: alpha, chroma and depth of the source, as far as encoder and container have them; what
  // they have not is a warning.
  std::string pixel_format;
  // How much time the encoder takes: what it calls its preset or speed, or for any that has such a
  // setting one of x264's words (ultrafast to placebo); `draft` is fast for all encoders.
  std::string preset = {};
  std::vector<std::string> options =
      {};  // KEY=VALUE, of the encoder's own; they count over all else
  bool overwrite = false;
  bool video_alone = false;  // nothing of the source's other streams, chapters and tags
};

// Writes a clip beside the source's other streams; of a part what lies within it, by whole packets:
// sound begins with the packet that is heard when the part begins, subtitles that last into it or
// beyond it are cut, chapters too. Everything goes to a name of its own beside
// `path`, which Finish renames; a writer destroyed before leaves nothing.
class ClipWriter {
 public:
  // width, height: of the written frames, in the source's pixel aspect; with an odd one the default
  // pixel format is 4:4:4, which alone keeps the size. `path` "-": to the standard output, raw
  // frames (YUV4MPEG2) and nothing else, or with a codec Matroska (NUT where that can't hold it).
  // With one %d or %04d, or a / at its end: pictures, from number 1 on. Everything that can be
  // refused is refused here, so a program creates the writer before it spends time on the frames.
  // Throws Failure (output; input where the source's other streams are to be had no more).
  static std::unique_ptr<ClipWriter> Create(const std::string& path, const ClipInfo& source,
                                            int width, int height, const EncodeSettings& settings);
  virtual ~ClipWriter() = default;

  // Frames in strictly ascending order; `frame` takes the time stamp and duration of that frame of
  // the source. Transparent pixels show black where the codec has no alpha. Throws Failure
  // (output).
  virtual void Write(std::size_t frame, const HX_Pixel8* pixels, std::ptrdiff_t row_bytes) = 0;
  virtual void Write(std::size_t frame, const HX_Pixel16* pixels, std::ptrdiff_t row_bytes) = 0;
  virtual void Write(std::size_t frame, const HX_PixelFloat* pixels, std::ptrdiff_t row_bytes) = 0;

  // One line for each thing that the written file leaves out or changes. Whole after Finish.
  virtual const std::vector<std::string>& warnings() const = 0;

  // Copies what is left of the other streams, closes the file, gives it its name.
  virtual void Finish() = 0;
};

}  // namespace calmframe::media
