// Whatever a payload holds, it is refused or it loads; what loads is written, and that loads as the
// very same.

#include <zlib.h>

#include <cstdint>
#include <cstdlib>
#include <string>

#include "fuzz/state_input.h"
#include "stabilizer/effect/src/state_format/format.h"
#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"
#include "tests/stabilizer/effect/state_format/samples.h"

namespace {

using namespace kelp::effect;

std::string Written(const SavedState& state) {
  tessel::filesupport::OStringByteStream out;
  WriteState(out, state);
  return out.Take();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  if (size < 2) return 0;
  const std::uint32_t version = kFirstVersion + data[0] % kVersionCount;
  const std::uint8_t flags = data[1];
  SourceShape present{64, 36, 1, 1};
  if (flags & kOneByOne) present.width = present.height = 1;
  if (flags & kAnamorphic) present.par_num = 2;
  std::string payload(reinterpret_cast<const char*>(data + 2), size - 2);
  bool raw = !(flags & kAsItStands);
  if (raw && version < state_format::kRawPayloads) {
    payload = Deflated(payload);
    raw = false;
  }
  try {
    const SavedState state = ReadState(payload.data(), payload.size(), version, raw, present);
    const std::string once = Written(state);
    const SavedState again =
        ReadState(once.data(), once.size(), state_format::kPresentVersion, true, present);
    if (Written(again) != once) std::abort();
  } catch (const StateRefused&) {
  }
  return 0;
}
