#pragma once

#include <cstdint>

// How library_fuzz's input tells of calls: a byte each, the upper bit of which picks one of two
// sessions, and what the call takes.
namespace calmframe::fuzz {

enum class LibraryCall : std::uint8_t {
  open,  // OpenInput
  close,
  set,  // two texts, each to its zero
  start,
  push,       // a byte, the frame; a byte of what follows
  push_some,  // a byte, how many from 0 on
  finish,
  wait,  // a byte, milliseconds
  cancel,
  ask,            // a byte
  render,         // as push
  save_and_load,  // into the other session
  load,           // saved work, to the input's end; started and waited for
  count
};

inline constexpr int kMostSide = 64;

struct OpenInput {
  std::int32_t format, depth, matrix, chroma_location;
  std::int32_t aspect_num, aspect_den, rate_num, rate_den;
  std::int32_t shots, fields;
  std::int64_t frame_count, refuses;
  std::int64_t starts[2];
  std::uint8_t width, height;  // wrap
  std::uint8_t flags, images;  // below
  std::uint8_t unused[4];
};
static_assert(sizeof(OpenInput) == 80);

enum : std::uint8_t {  // OpenInput's flags
  kFetches = 1,
  kTwoStarts = 2,
  kIdentity = 4,
  kNoOptions = 8,
  kFullRange = 16
};
enum : std::uint8_t {  // its images
  kFlat = 1,
  kNoNumbers = 2  // not only such as the format has
};
enum : std::uint8_t {  // of a picture
  kWideRows = 1,
  kUpsideDown = 2,
  kOtherSize = 4,
  kNoPlane = 8,
  kNoImage = 16
};

}  // namespace calmframe::fuzz
