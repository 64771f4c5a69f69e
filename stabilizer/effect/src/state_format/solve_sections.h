#pragma once

#include <boost/shared_ptr.hpp>
#include <cstdint>

#include "platform/tessel/filesupport.h"
#include "stabilization/crop/cropper.h"
#include "stabilization/warp/cp_warper.h"
#include "stabilization/warp/frame_map.h"
#include "stabilizer/effect/src/state_format/format.h"

// The sections of a solve's results within a stored state. Readers throw StreamError for damage and
// take no more memory than a small multiple of what they have read.
namespace kelp::effect::state_format {

// The grid's size and one record a frame.
void WriteWarps(tessel::filesupport::OutputByteStream& out,
                const marrow::stabilization::CPWarper& warper, PayloadForm form);
struct GridSize {
  std::int32_t cols = 0;
  std::int32_t rows = 0;
};
GridSize ReadGridSize(tessel::filesupport::InputByteStream& in);
// All records of a warper that has none yet.
void ReadWarps(tessel::filesupport::InputByteStream& in, PayloadForm form,
               marrow::stabilization::CPWarper& warper);

// Two zeros for no map, as for an empty one.
void WriteFrameMap(tessel::filesupport::OutputByteStream& out,
                   const marrow::stabilization::MtoNMap* map);
boost::shared_ptr<const marrow::stabilization::MtoNMap> ReadFrameMap(
    tessel::filesupport::InputByteStream& in, std::int32_t frame_count);

void WriteCrop(tessel::filesupport::OutputByteStream& out, const cropper& crop);
// Of no frames or of frame_count of them.
boost::shared_ptr<const cropper> ReadCrop(tessel::filesupport::InputByteStream& in,
                                          std::int32_t frame_count);

}  // namespace kelp::effect::state_format
