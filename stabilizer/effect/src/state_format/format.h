#pragma once

#include <cstdint>

#include "platform/hx/hx_suites.h"
#include "platform/tessel/filesupport.h"

// The frame of the format: its versions, and the marks between its sections.
namespace kelp::effect::state_format {

// Four letters, read as a big-endian number; they lie in the file in reverse.
enum class Marker : std::int32_t {
  Stab = 0x53746162,
  Guid = 0x47756964,
  Solv = 0x536f6c76,
  Mesh = 0x4d657368,
  MtoN = 0x4d746f4e,
  StrF = 0x53747246,
  Crop = 0x43726f70,
  Pup = 0x50757020
};

// What each version of the format brought.
enum : std::uint32_t {
  kOldestVersion = 3,
  kFixedPointPositions = 4,
  kSourceIdentity = 5,
  kPendingFlag = 6,
  kSolveResults = 7,
  kAnalysisTick = 8,
  kFrameMap = 10,
  kNeedsSolveFlag = 11,
  kMarkersAndSize = 12,
  kRawPayloads = 13,
  kTrackerIdentity = 14,
  kDetailedFlag = 15,
  kCropWindow = 16,
  kPresentVersion = kCropWindow
};

// How a payload stands in its handle, as the handle's raw flag tells it. Packed ones stay in the
// memory of the process that makes them: a host asks for them by their preference.
enum class PayloadForm : std::uint8_t {
  deflated = HX_PAYLOAD_DEFLATED,
  raw = HX_PAYLOAD_RAW,       // and whatever is none of the others
  packed = HX_PAYLOAD_PACKED  // raw, but for warps and tracks; of the present version alone
};
inline PayloadForm FormOf(std::uint32_t version, std::uint8_t raw) {
  if (raw == HX_PAYLOAD_DEFLATED || version < kRawPayloads) return PayloadForm::deflated;
  const bool is_packed = raw == HX_PAYLOAD_PACKED;
  return is_packed && version == kPresentVersion ? PayloadForm::packed : PayloadForm::raw;
}

// Throws StreamError unless `count` records of at least `size` bytes each can still follow. To be
// asked before memory is taken for them.
inline void ExpectRoomFor(const tessel::filesupport::InputByteStream& in, std::uint64_t count,
                          std::uint64_t size) {
  if (count > in.MaxBytesLeft() / size) {
    throw tessel::filesupport::StreamError("more records than bytes");
  }
}

// A count as it is stored: never below 0.
inline std::uint64_t ReadCount(tessel::filesupport::InputByteStream& in) {
  std::int32_t count = 0;
  in >> count;
  if (count < 0) throw tessel::filesupport::StreamError("count below 0");
  return static_cast<std::uint64_t>(count);
}

}  // namespace kelp::effect::state_format
