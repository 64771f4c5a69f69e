#pragma once

#include <cstddef>
#include <cstdint>
#include <stdexcept>

#include "platform/tessel/filesupport.h"
#include "stabilizer/effect/src/state_format/saved_state.h"

namespace kelp::effect {

// The source as it is now. 1 by 1 is that of an instance without a layer, on which any state loads.
struct PresentSource {
  std::int32_t width = 0, height = 0;
  std::int32_t par_num = 1;
  std::uint32_t par_den = 1;

  bool one_by_one() const { return width == 1 && height == 1; }
};

// Why a payload is not taken.
class StateRefused : public std::runtime_error {
 public:
  enum class Reason {
    Damaged,
    SourceSize,  // of a source of the size in stored_width and stored_height
    Grid         // warps over another grid than frames of this size have now
  };
  StateRefused(Reason why, const char* detail) : std::runtime_error(detail), reason(why) {}

  Reason reason;
  std::int32_t stored_width = 0, stored_height = 0;
};

// Reads a payload of the version, kOldestVersion to kPresentVersion of format.h; versions before
// raw payloads were known are deflated whatever `raw` says. Nothing may follow the state. Throws
// StateRefused, and std::bad_alloc: it takes no more memory than a small multiple of the inflated
// bytes, and nothing on the word of a count alone.
//
// What older versions lack is filled in so that the missing work is done again and no other: a
// solved state without a crop has a crop hash that no parameters have.
SavedState ReadState(const void* payload, std::size_t size, std::uint32_t version, bool raw,
                     const PresentSource& present);

}  // namespace kelp::effect
