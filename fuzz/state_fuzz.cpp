// Whatever a payload holds, it is refused or it loads; what loads is written, raw and packed, and
// that loads as the very same. What a host reads of it and of those is read to its end or refused.

#include <zlib.h>

#include <cstdint>
#include <cstdlib>
#include <string>

#include "fuzz/state_input.h"
#include "host/stabilize/solved_clip.h"
#include "stabilizer/effect/src/instance_handle.h"
#include "stabilizer/effect/src/state_format/format.h"
#include "stabilizer/effect/src/state_format/state_reader.h"
#include "stabilizer/effect/src/state_format/state_writer.h"
#include "tests/stabilizer/effect/state_format/samples.h"

namespace {

using namespace kelp::effect;
using state_format::PayloadForm;

std::string Written(const SavedState& state, PayloadForm form = PayloadForm::raw) {
  tessel::filesupport::OStringByteStream out;
  WriteState(out, state, form);
  return out.Take();
}

// A host's own reading, of what the effect has written or of what anybody says that it has.
void ReadAsHost(const std::string& payload, std::uint32_t version, std::uint8_t raw) {
  const InstanceHandleHeader header{version, 1, raw, nullptr, payload.size()};
  std::vector<std::uint8_t> instance(sizeof header + payload.size());
  std::memcpy(instance.data(), &header, sizeof header);
  std::memcpy(instance.data() + sizeof header, payload.data(), payload.size());
  try {
    const calmframe::host::SolvedClip clip = calmframe::host::ReadSolvedClip(std::move(instance));
    for (std::size_t f = 0; f < static_cast<std::size_t>(clip.frame_count); ++f) {
      clip.VerticesOf(f);
      clip.TracksOf(f);
    }
  } catch (const calmframe::host::NoSolvedClip&) {
  }
}

SavedState Read(const std::string& payload, PayloadForm form, const SourceShape& present) {
  return ReadState(payload.data(), payload.size(), state_format::kPresentVersion,
                   static_cast<std::uint8_t>(form), present);
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
  std::uint8_t raw = flags & kAsItStands ? HX_PAYLOAD_DEFLATED : HX_PAYLOAD_RAW;
  if (raw && flags & kPacked) raw = HX_PAYLOAD_PACKED;
  if (raw && version < state_format::kRawPayloads) {
    payload = Deflated(payload);
    raw = HX_PAYLOAD_DEFLATED;
  }
  ReadAsHost(payload, version, raw);
  try {
    const SavedState state = ReadState(payload.data(), payload.size(), version, raw, present);
    const std::string once = Written(state), packed = Written(state, PayloadForm::packed);
    const SavedState again = Read(once, PayloadForm::raw, present);
    if (Written(again) != once) std::abort();
    const SavedState unpacked = Read(packed, PayloadForm::packed, present);
    if (Written(unpacked) != once || Written(unpacked, PayloadForm::packed) != packed) std::abort();
    ReadAsHost(packed, state_format::kPresentVersion, HX_PAYLOAD_PACKED);
  } catch (const StateRefused&) {
  }
  return 0;
}
