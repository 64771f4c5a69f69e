#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <stdexcept>
#include <vector>

#include "host/stabilize/homography.h"
#include "host/stabilize/similarity.h"

// What a solved effect remembers, for programs that look at its warps or change what they show. The
// bytes are told in docs/state_format.md.
//
// All planes below are in square pixels, x to the right, y downwards, the origin in the centre of
// the top left pixel. The stabilized plane is where the warps put the frames; the output frame is
// as large as a frame.
namespace calmframe::host {

// A frame's row of the track table, by slot: where the track is, in the source's own pixels,
// centres at whole numbers; and what it is: n > 0 a track that begins here, in row n - 1; 0 one
// that goes on; the two of one that is deleted, which nothing was solved with; else below 0 none
// here, and the place means nothing.
inline constexpr std::int32_t kDeletedTrackBegins = -10, kDeletedTrackGoesOn = -11;
struct TrackRow {
  std::vector<Point> places;
  std::vector<std::int32_t> statuses;

  bool operator==(const TrackRow&) const = default;
};

// What a clip has of each frame, which is expanded when it is asked for: of all of them at once it
// would be many times as large as what it comes from. Any thread.
class SolvedFrames {
 public:
  virtual ~SolvedFrames() = default;
  // By row and column: where each vertex lands in the stabilized plane, before crop and scale. A
  // frame without a solution has zeros. From a file they may be any number, and none.
  virtual void ReadVertices(std::size_t frame, std::vector<Point>& vertices) const = 0;
  virtual void ReadTracks(std::size_t frame, TrackRow& row) const = 0;
};

struct SolvedClip {
  int source_width = 0, source_height = 0;  // of a frame, in its own pixels
  int width = 0, height = 0;                // the same in square pixels
  // Row 0 of all below is this frame of the source; both count fields where the source is
  // interlaced.
  int first_frame = 0;
  int frame_count = 0;  // at least 1

  // Vertices of a warp's grid, at least 2 each. They stand evenly over the frame, the outermost on
  // its first and last pixel centres.
  int columns = 0, rows = 0;
  int slots = 0;                               // places for tracks in a frame, at least 1
  std::shared_ptr<const SolvedFrames> frames;  // never null

  std::vector<Point> VerticesOf(std::size_t frame) const;
  TrackRow TracksOf(std::size_t frame) const;

  // What a framing that fills the edges lays behind a frame: another one, whose pixels the matrix
  // takes to the stabilized plane, where frame `in` stands. From a file it may be any, and of no
  // number.
  struct Neighbour {
    std::int32_t frame, in;
    Matrix plane_from_frame;
  };
  std::vector<Neighbour> neighbours;  // by frame, then by where it is laid

  // The effect's own framing. `left` to `bottom` from `origin`, both ends included.
  struct Window {
    float left, top, right, bottom;
  };
  struct Crop {
    int width = 0, height = 0;    // of all windows; not above 0: the frames have nothing in common
    Point origin;                 // in the stabilized plane
    std::vector<Window> windows;  // none or one a frame
  };
  std::optional<Crop> crop;
};

// An instance is none of a solved effect, of another version, or damaged.
class NoSolvedClip : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Of a flattened instance, as SavedEffect has it, which the clip keeps. Throws NoSolvedClip; of
// counts no memory is taken before the bytes are there.
SolvedClip ReadSolvedClip(std::vector<std::uint8_t> instance);

// A frame's warp as it was solved, or none: then the stabilized plane is the source itself.
enum class Warps { solved, none };

// Where a frame's vertices stand in the source, by row, column.
std::vector<Point> GridAtRest(const SolvedClip& clip);

// The clip's neighbours in the plane that its frames make. Without warps each is taken from where
// its frame's warp puts the frame back to the frame, by the homography that is nearest to the warp:
// what that bends besides is left.
std::vector<SolvedClip::Neighbour> NeighboursIn(const SolvedClip& clip, Warps warps);

// How the framing places the picture that an instance is loaded under: 2 and 3 by its crop, 1 and 4
// by the bounds of all frames' outlines.
enum class PlacedBy { crop, bounds };

// The instance of an effect that shows, of each frame, what windows[frame] tells: it takes points
// of the output frame to the stabilized plane. What the instance holds besides stays, byte by byte,
// so that nothing is analysed, solved or framed anew where it is loaded, on a layer of the same
// source, with the values that it was saved with. Only the additional scale must be 100 %.
//
// A framing that crops (2 and 3) then shows the output frame, whole, at scale 1. The instance must
// have been saved under the very framing and maximum scale that it is loaded with: otherwise the
// effect takes what it shows for the plane, and finds a crop of its own there.
//
// A framing that does not crop (1 and 4) centres the bounds of all frames' outlines, wherever the
// output frame lies in them. PlacedBy::bounds puts the output frame in their middle, to the
// fraction of a pixel: some frame's corner goes as far out as it takes, up to once for each side.
// It is one of a cell that lies beside the output frame, so that nobody sees it; or, where there is
// none in any frame, that which goes the least way. Neighbours that fill the edges go with their
// frame.
//
// Vertices are rounded to 1/256 pixel of the output frame. For the effect's sake the plane of the
// new instance may lie some whole pixels to the left of the output frame, and above; its crop's
// windows are the output frame. Without warps the neighbours are those of NeighboursIn; deblurring
// goes by the warps that were solved. Throws NoSolvedClip as above, and std::invalid_argument
// where the windows are not one a frame, or one has no inverse.
std::vector<std::uint8_t> WithWindows(const std::vector<std::uint8_t>& instance,
                                      const std::vector<Similarity>& windows,
                                      Warps warps = Warps::solved,
                                      PlacedBy placed_by = PlacedBy::crop);

// How far from its place in the output frame a framing that does not crop shows every picture, to
// the right and downwards, in the source's own pixels, at full render scale and 100 %; of a clip
// that was read from what WithWindows made. It is the same for all frames, and 0 where it was made
// for PlacedBy::bounds: the effect centres the bounds of all frames' outlines, and rounds that to
// whole pixels for the place of the frame in its buffer. Windows alone can't undo it, since what
// moves them all moves the bounds too. Throws std::invalid_argument for a clip without windows.
Point ShiftWithoutCrop(const SolvedClip& clip);

}  // namespace calmframe::host
