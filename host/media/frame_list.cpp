#include "host/media/frame_list.h"

#include <algorithm>
#include <cstddef>
#include <utility>

#include "platform/tessel/filesupport.h"
#include "platform/tessel/utility.h"

namespace calmframe::media {
namespace {

using tessel::filesupport::StreamError;

// 2: damaged streams are read by one thread. 3: the pixel format, and alpha of VP9. 4: the frames
// that are known. Goes up with
// every change of what stands in the bytes, and of how ScanFrames numbers frames or what it tells
// of them.
constexpr std::uint32_t kVersion = 4;

constexpr std::size_t kLongestText = 200;
// Of a frame in the inflated bytes: two times, the fingerprint, the keyframe's mark.
constexpr std::uint64_t kBytesAFrame = 25;

// What must be the same, that frames are numbered and known again as they were.
template <class Visit>
void VisitMakers(const Visit& visit) {
  visit(kVersion);
  visit(std::uint32_t{avcodec_version()});
  visit(std::uint32_t{avformat_version()});
}

// All of the info but its path, times and warning. One list serves both ways.
template <class Info, class Visit>
void VisitInfo(Info& info, const Visit& visit) {
  visit(info.width);
  visit(info.height);
  for (auto* ratio : {&info.pixel_aspect, &info.frame_rate, &info.time_base}) {
    visit(ratio->num);
    visit(ratio->den);
  }
  visit(info.codec);
  visit(info.pixel_format);
  visit(info.bit_depth);
  visit(info.has_alpha);
  visit(info.rotation);
  visit(info.mirrored);
  auto& colour = info.colour;
  for (auto* tag : {&colour.primaries, &colour.transfer, &colour.matrix, &colour.range,
                    &colour.chroma_location}) {
    visit(*tag);
  }
  visit(info.field_order);
  visit(info.stream);
}

struct Writer {
  tessel::filesupport::OutputByteStream& out;

  void operator()(const std::string& text) const { out << tessel::utility::ToUTF16(text); }
  void operator()(FieldOrder order) const { out << static_cast<std::int32_t>(order); }
  template <class Value>
  void operator()(const Value& value) const {
    out << value;
  }
};

struct Reader {
  tessel::filesupport::InputByteStream& in;

  void operator()(std::string& text) const {
    std::u16string read;
    in >> read;
    text = tessel::utility::ToUTF8(read);
    const auto shown = [](char c) { return c >= ' ' && c <= '~'; };
    if (text.size() > kLongestText || !std::all_of(text.begin(), text.end(), shown)) {
      throw StreamError("text is none of ours");
    }
  }
  void operator()(FieldOrder& order) const {
    std::int32_t read;
    in >> read;
    if (read < 0 || read > 2) throw StreamError("no such order of fields");
    order = static_cast<FieldOrder>(read);
  }
  template <class Value>
  void operator()(Value& value) const {
    in >> value;
  }
};

bool IsWithin(std::int64_t value, std::int64_t least, std::int64_t most) {
  return value >= least && value <= most;
}

// As ScanFrames leaves it.
bool IsSound(const ClipInfo& info) {
  const auto is_ratio = [](const Ratio& ratio) {
    return IsWithin(ratio.num, 1, INT32_MAX) && IsWithin(ratio.den, 1, INT32_MAX);
  };
  return info.width >= 1 && info.height >= 1 &&
         std::int64_t{info.width} * info.height <= kMaximumPixels && is_ratio(info.pixel_aspect) &&
         is_ratio(info.frame_rate) && is_ratio(info.time_base) && IsWithin(info.bit_depth, 8, 16) &&
         IsWithin(info.rotation, 0, 270) && info.rotation % 90 == 0 &&
         IsWithin(info.colour.primaries, 0, AVCOL_PRI_NB - 1) &&
         IsWithin(info.colour.transfer, 0, AVCOL_TRC_NB - 1) &&
         IsWithin(info.colour.matrix, 0, AVCOL_SPC_NB - 1) && IsWithin(info.colour.range, 0, 2) &&
         IsWithin(info.colour.chroma_location, 0, 6) && info.stream >= 0;
}

// Times by their steps, those of the index, which may be anything, by how they differ from them
// modulo 2^64: a column of like numbers deflates to next to nothing, so what is left of a frame is
// its fingerprint.
void WriteFrames(const FrameList& list, const Writer& write) {
  const std::vector<FrameTime>& times = list.info.times;
  write(static_cast<std::uint64_t>(times.size()));
  std::int64_t before = 0;
  for (const FrameTime& time : times) {
    write(time.pts - before);
    before = time.pts;
  }
  write(times.back().duration);
  for (std::size_t i = 0; i < times.size(); ++i) {
    write(static_cast<std::uint64_t>(list.index[i].pts) - static_cast<std::uint64_t>(times[i].pts));
  }
  for (const IndexEntry& entry : list.index) write(entry.keyframe);
  for (const IndexEntry& entry : list.index) write(entry.fingerprint);
  write(std::uint64_t{list.known.first});
  write(std::uint64_t{list.known.end});
}

void ReadFrames(tessel::filesupport::InputByteStream& in, FrameList& list) {
  std::uint64_t count;
  in >> count;
  if (count < 1 || count > kMaximumFrames || count * kBytesAFrame > in.MaxBytesLeft()) {
    throw StreamError("no such number of frames");
  }
  // RepairTimes leaves room behind the latest time that TimeOrNone lets pass.
  constexpr std::int64_t kLatest = std::int64_t{1} << 61;
  std::vector<FrameTime>& times = list.info.times;
  const auto read_duration = [&](FrameTime& time, std::int64_t ticks) {
    if (!IsWithin(ticks, 1, 2 * kLatest)) throw StreamError("times out of order");
    time.duration = ticks;
  };
  for (std::uint64_t i = 0; i < count; ++i) {
    std::int64_t step;
    in >> step;
    const std::int64_t before = times.empty() ? 0 : times.back().pts;
    if (!IsWithin(step, -kLatest, 2 * kLatest) || !IsWithin(before + step, -kLatest, kLatest)) {
      throw StreamError("time out of range");
    }
    if (!times.empty()) read_duration(times.back(), step);
    times.push_back({before + step, 0});
  }
  std::int64_t last;
  in >> last;
  read_duration(times.back(), last);
  list.info.frame_count = times.size();

  list.index.resize(times.size());
  for (std::size_t i = 0; i < times.size(); ++i) {
    std::uint64_t difference;
    in >> difference;
    list.index[i].pts =
        static_cast<std::int64_t>(static_cast<std::uint64_t>(times[i].pts) + difference);
  }
  for (IndexEntry& entry : list.index) in >> entry.keyframe;
  for (IndexEntry& entry : list.index) in >> entry.fingerprint;
  std::uint64_t first, end;
  in >> first;
  in >> end;
  if (first >= end || end > count) throw StreamError("no such frames");
  list.known = {first, end};
}

}  // namespace

std::vector<std::uint8_t> FrameList::Bytes() const {
  tessel::filesupport::OStringByteStream bytes;
  tessel::filesupport::OZipByteStream zip(bytes);
  const Writer write{zip};
  VisitMakers(write);
  VisitInfo(info, write);
  // The path in front of the warning may be another one later.
  write(info.warning.empty() ? info.warning : info.warning.substr(info.path.size() + 2));
  WriteFrames(*this, write);
  zip.Close();
  return {bytes.bytes().begin(), bytes.bytes().end()};
}

std::optional<FrameList> FrameListOf(const std::vector<std::uint8_t>& bytes,
                                     const std::string& path) try {
  tessel::filesupport::IStringByteStream stream(bytes.data(), bytes.size());
  tessel::filesupport::IZipByteStream zip(stream);
  bool same = true;
  VisitMakers([&](std::uint32_t own) {
    std::uint32_t read;
    zip >> read;
    same = same && read == own;
  });
  if (!same) return {};
  FrameList list;
  const Reader read{zip};
  VisitInfo(list.info, read);
  std::string damage;
  read(damage);
  ReadFrames(zip, list);
  zip.Finish();
  if (!IsSound(list.info)) return {};
  list.info.path = path;
  if (!damage.empty()) list.info.warning = path + ": " + damage;
  return list;
} catch (const StreamError&) {
  return {};
}

std::vector<std::uint8_t> JoinFound(const std::vector<std::vector<std::uint8_t>>& stretches) {
  std::optional<FrameList> whole;
  for (const std::vector<std::uint8_t>& bytes : stretches) {
    std::optional<FrameList> next = FrameListOf(bytes, "");
    if (!next) break;
    if (!whole) {
      whole = std::move(next);
      continue;
    }
    if (next->info != whole->info) return {};
    if (next->known.first > whole->known.end) break;
    if (next->known.end <= whole->known.end) continue;
    std::copy(next->index.begin() + static_cast<std::ptrdiff_t>(whole->known.end),
              next->index.begin() + static_cast<std::ptrdiff_t>(next->known.end),
              whole->index.begin() + static_cast<std::ptrdiff_t>(whole->known.end));
    whole->known.end = next->known.end;
  }
  return whole ? whole->Bytes() : std::vector<std::uint8_t>();
}

}  // namespace calmframe::media
