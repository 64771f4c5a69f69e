#pragma once

#include <cstddef>
#include <cstdint>
#include <stdexcept>

#include "platform/tessel/filesupport.h"
#include "stabilizer/effect/src/state_format/saved_state.h"

namespace kelp::effect {

// Why a payload is not taken.
class StateRefused : public std::runtime_error {
 public:
  enum class Reason {
    Damaged,
    SourceSize,  // of the source in `stored`
    Grid         // warps over another grid than frames of this size have now
  };
  StateRefused(Reason why, const char* detail) : std::runtime_error(detail), reason(why) {}

  Reason reason;
  SourceShape stored;
};

// Reads a payload of the version, kOldestVersion to kPresentVersion of format.h. `raw`: the flag
// that came with it; see PayloadForm. Versions before raw payloads were known are deflated whatever
// it says. Nothing may follow the state.
// `present`: the source as it is now; on that of an instance without a layer any state loads.
// Throws StateRefused, and std::bad_alloc: it takes no more memory than a small multiple of the
// inflated bytes, and nothing on the word of a count alone.
//
// What older versions lack is filled in so that the missing work is done again and no other: a
// solved state without a crop has a crop hash that no parameters have.
SavedState ReadState(const void* payload, std::size_t size, std::uint32_t version, std::uint8_t raw,
                     const SourceShape& present);

}  // namespace kelp::effect
