#include "stabilizer/effect/src/state_format/solve_sections.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <limits>
#include <stdexcept>
#include <utility>
#include <vector>

#include "stabilizer/effect/src/state_format/format.h"

namespace kelp::effect::state_format {

using marrow::stabilization::CPWarper;
using marrow::stabilization::matrix3;
using marrow::stabilization::MtoNMap;
using marrow::stabilization::packed_warp;
using marrow::stabilization::point2;
using marrow::stabilization::quantised_warp;
using tessel::filesupport::InputByteStream;
using tessel::filesupport::OutputByteStream;
using tessel::filesupport::StreamError;

namespace {

constexpr std::uint64_t kMapEntryBytes = 80;
constexpr std::uint64_t kCropEntryBytes = 16;
static_assert(sizeof(point2) == 16 && sizeof(matrix3) == 72);

std::int32_t Side(std::uint64_t pixels) {
  constexpr auto kMost = std::uint64_t{std::numeric_limits<std::int32_t>::max()};
  return static_cast<std::int32_t>(std::min(pixels, kMost));
}

}  // namespace

void WriteWarps(OutputByteStream& out, const CPWarper& warper, PayloadForm form) {
  out << warper.gridCols() << warper.gridRows();
  for (std::size_t f = 0; f < warper.frameWarpCount(); ++f) {
    if (form == PayloadForm::packed) {
      const packed_warp& warp = warper.packedWarp(f);
      out.Write(warp.corners.data(), sizeof warp.corners);
      out << static_cast<std::uint32_t>(warp.offsets.size());
      out.Write(warp.offsets.data(), warp.offsets.size());
      continue;
    }
    const quantised_warp warp = warper.storedWarp(f);
    out.Write(warp.corners.data(), sizeof warp.corners);
    out.Write(warp.offsets.data(), warp.offsets.size() * sizeof warp.offsets[0]);
  }
}

GridSize ReadGridSize(InputByteStream& in) {
  GridSize size;
  in >> size.cols >> size.rows;
  return size;
}

namespace {

void ReadPackedWarps(InputByteStream& in, CPWarper& warper) {
  for (std::int32_t f = 0; f < warper.frameCount(); ++f) {
    packed_warp warp;
    in.Read(warp.corners.data(), sizeof warp.corners);
    std::uint32_t size = 0;
    in >> size;
    ExpectRoomFor(in, size, 1);
    warp.offsets.resize(size);
    in.Read(warp.offsets.data(), size);
    try {
      warper.storeFrameWarp(std::move(warp));
    } catch (const std::invalid_argument&) {
      throw StreamError("a packed warp's bytes are none");
    }
  }
}

}  // namespace

void ReadWarps(InputByteStream& in, PayloadForm form, CPWarper& warper) {
  if (form == PayloadForm::packed) return ReadPackedWarps(in, warper);
  const std::int32_t cols = warper.gridCols(), rows = warper.gridRows();
  quantised_warp warp;
  warp.offsets.resize(2 * static_cast<std::size_t>(cols) * static_cast<std::size_t>(rows));
  const std::size_t offset_bytes = warp.offsets.size() * sizeof warp.offsets[0];
  ExpectRoomFor(in, static_cast<std::uint64_t>(warper.frameCount()),
                sizeof warp.corners + offset_bytes);
  for (std::int32_t f = 0; f < warper.frameCount(); ++f) {
    in.Read(warp.corners.data(), sizeof warp.corners);
    in.Read(warp.offsets.data(), offset_bytes);
    // Exactly what was stored: rounding it again would move what lies far outside.
    warper.storeFrameWarp(warp);
  }
}

void WriteFrameMap(OutputByteStream& out, const MtoNMap* map) {
  if (!map) {
    out << std::int32_t{0} << std::int32_t{0};
    return;
  }
  out << static_cast<std::int32_t>(map->entries().size()) << map->radius();
  for (const auto& [frames, motion] : map->entries()) {
    out << frames.first << frames.second;
    out.Write(motion.data(), sizeof motion);
  }
}

boost::shared_ptr<const MtoNMap> ReadFrameMap(InputByteStream& in, std::int32_t frame_count) {
  const std::uint64_t count = ReadCount(in);
  std::int32_t radius = 0;
  in >> radius;
  if (radius < 0) throw StreamError("frame map's span below 0");
  ExpectRoomFor(in, count, kMapEntryBytes);
  MtoNMap::entries_t entries;
  for (std::uint64_t i = 0; i < count; ++i) {
    std::int32_t m = 0, n = 0;
    matrix3 motion;
    in >> m >> n;
    in.Read(motion.data(), sizeof motion);
    if (m == n || m < 0 || n < 0 || m >= frame_count || n >= frame_count ||
        !entries.emplace(std::pair(m, n), motion).second) {
      throw StreamError("frame map's key is none");
    }
  }
  return boost::make_shared<MtoNMap>(frame_count, radius, std::move(entries));
}

void WriteCrop(OutputByteStream& out, const cropper& crop) {
  out << static_cast<std::int32_t>(crop.rects.size());
  out << Side(crop.maskWidth) << Side(crop.maskHeight) << crop.cropWidth << crop.cropHeight;
  for (const crop_rect& rect : crop.rects) {
    const float sides[] = {rect.left, rect.top, rect.right, rect.bottom};
    static_assert(sizeof sides == kCropEntryBytes);
    out.Write(sides, sizeof sides);
  }
}

boost::shared_ptr<const cropper> ReadCrop(InputByteStream& in, std::int32_t frame_count) {
  const std::uint64_t count = ReadCount(in);
  if (count != 0 && count != static_cast<std::uint64_t>(frame_count)) {
    throw StreamError("crop of another clip");
  }
  const std::uint64_t mask_width = ReadCount(in), mask_height = ReadCount(in);
  std::int32_t crop_width = 0, crop_height = 0;
  in >> crop_width >> crop_height;
  ExpectRoomFor(in, count, kCropEntryBytes);
  const auto crop = boost::make_shared<cropper>(0, mask_width, mask_height);
  crop->cropWidth = crop_width;
  crop->cropHeight = crop_height;
  for (std::uint64_t f = 0; f < count; ++f) {
    float sides[4];
    in.Read(sides, sizeof sides);
    crop->rects.push_back({sides[0], sides[2], sides[1], sides[3]});
  }
  return crop;
}

}  // namespace kelp::effect::state_format
