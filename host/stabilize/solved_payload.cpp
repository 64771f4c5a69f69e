#include "host/stabilize/solved_payload.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>
#include <string>
#include <utility>

#include "platform/memory/packed_grid.h"
#include "platform/memory/packed_words.h"
#include "platform/tessel/filesupport.h"

namespace calmframe::host {
namespace {

using tessel::filesupport::InputByteStream;
using tessel::filesupport::StreamError;

constexpr std::uint32_t kVersion = 16;
constexpr std::int32_t kSolved = 2;
// As many as a grid has over the widest frame, and more.
constexpr std::size_t kMostPackedVertices = std::size_t{1} << 16;
constexpr std::int32_t kMost = std::numeric_limits<std::int32_t>::max();

// What stands before a payload.
struct Header {
  std::uint32_t version;
  std::uint8_t flattened;
  std::uint8_t raw;
  std::uint8_t nothing[2];
  std::uint64_t slot;
  std::uint64_t payload_length;
};
static_assert(sizeof(Header) == 24);

// A marker's four letters as they are told; in the file they lie in reverse.
constexpr std::int32_t Marker(const char (&letters)[5]) {
  std::int32_t marker = 0;
  for (int i = 0; i < 4; ++i) marker = marker << 8 | letters[i];
  return marker;
}

// Tells where it stands, and passes all that it reads on into a copy, if there is one.
class WalkedStream final : public InputByteStream {
 public:
  WalkedStream(InputByteStream& in, std::vector<std::uint8_t>* copy) : in_(in), copy_(copy) {}
  std::size_t ReadSome(void* data, std::size_t size) override {
    const std::size_t got = in_.ReadSome(data, size);
    const auto* const bytes = static_cast<const std::uint8_t*>(data);
    if (copy_) copy_->insert(copy_->end(), bytes, bytes + got);
    position_ += got;
    return got;
  }
  std::uint64_t MaxBytesLeft() const override { return in_.MaxBytesLeft(); }
  std::size_t position() const { return position_; }

 private:
  InputByteStream& in_;
  std::vector<std::uint8_t>* const copy_;
  std::size_t position_ = 0;
};

constexpr std::size_t kCornerBytes = 4 * 2 * sizeof(double);
constexpr std::size_t kOffsetBytes = 2 * sizeof(std::int32_t);  // of a vertex
// Of a cell of the track table; raw, positions and statuses stand apart.
constexpr std::size_t kPositionBytes = 2 * sizeof(std::int32_t);
constexpr std::size_t kStatusBytes = sizeof(std::int32_t);

// Walks over a payload from end to end.
class LayoutReader {
 public:
  LayoutReader(WalkedStream& in, PayloadForm form)
      : in_(in), is_packed_(form == PayloadForm::packed) {}

  SolvedLayout Read() {
    ReadAnalysis();
    ReadSolve();
    Expect(Marker("StrF"), "StrF");
    in_ >> layout_.first_frame;
    layout_.tracks = in_.position();
    if (is_packed_) {
      const auto slots = static_cast<std::size_t>(layout_.slots);
      SkipPacked(0, memory::LeastPacked(2 * slots) + memory::LeastPacked(slots),
                 layout_.packed_tracks);
    } else {
      Skip(layout_.cells(), kPositionBytes + kStatusBytes);
    }
    ReadCrop();
    Expect(Marker("Pup "), "Pup");
    return layout_;
  }

 private:
  template <class T>
  T Next() {
    T value{};
    in_ >> value;
    return value;
  }
  void Expect(std::int32_t marker, const std::string& name) {
    if (Next<std::int32_t>() != marker) throw StreamError("no section " + name);
  }
  static void Check(bool holds, const char* what) {
    if (!holds) throw StreamError(what);
  }
  // By pieces: a zip stream's bound may lie far above what it holds.
  void Skip(std::uint64_t count, std::uint64_t size) {
    if (size == 0) return;
    Check(count <= in_.MaxBytesLeft() / size, "more records than bytes");
    std::array<char, 1 << 14> piece;
    for (std::uint64_t left = count * size; left > 0;) {
      const std::size_t bytes = std::min<std::uint64_t>(left, piece.size());
      in_.Read(piece.data(), bytes);
      left -= bytes;
    }
  }

  // One record a frame: so many bytes, then a count, at least so much, and as many.
  void SkipPacked(std::uint64_t ahead, std::size_t least, std::vector<std::size_t>& places) {
    for (std::int32_t f = 0; f < layout_.frames; ++f) {
      places.push_back(in_.position());
      Skip(1, ahead);
      const auto size = Next<std::uint32_t>();
      Check(size >= least, "a packed record of fewer bytes than it takes");
      Skip(size, 1);
    }
  }

  void ReadAnalysis() {
    Expect(Marker("Stab"), "Stab");
    in_ >> layout_.source_width >> layout_.source_height >> layout_.aspect;
    in_ >> layout_.aspect_divisor >> layout_.frames;
    const auto slots = Next<std::uint64_t>();
    Check(layout_.source_width > 0 && layout_.source_height > 0 && layout_.aspect > 0 &&
              layout_.aspect_divisor > 0 && layout_.square_width() < kMost &&
              layout_.source_height < kMost,
          "source without a size");
    Check(layout_.frames > 0, "no frames");
    Check(slots > 0 && slots <= kMost, "no tracks");
    layout_.slots = static_cast<std::int32_t>(slots);
    Next<std::u16string>();         // job input
    Next<tessel::utility::Guid>();  // tracker
    Next<std::uint64_t>();          // when the analysis began
    Expect(Marker("Guid"), "Guid");
    Next<tessel::utility::Guid>();             // source
    Next<bool>();                              // analysis pending
    Next<bool>();                              // needs a solve
    Next<boost::logic::tribool>();             // detailed
    if (Next<bool>()) Next<std::u16string>();  // job
  }

  void ReadSolve() {
    Expect(Marker("Solv"), "Solv");
    Check(Next<std::int32_t>() == kSolved, "not solved");
    Next<std::int64_t>();  // what the warps were made from
    Next<std::int64_t>();  // and the crop
    Expect(Marker("Mesh"), "Mesh");
    in_ >> layout_.columns >> layout_.rows;
    // What stands in so many bytes, or is packed, has no more vertices.
    Check(layout_.columns > 1 && layout_.rows > 1 &&
              layout_.vertices() <=
                  (is_packed_ ? kMostPackedVertices : in_.MaxBytesLeft() / kOffsetBytes),
          "no grid");
    layout_.warps = in_.position();
    if (is_packed_) {
      SkipPacked(kCornerBytes, memory::LeastPacked(2 * layout_.vertices()), layout_.packed_warps);
    } else {
      Skip(static_cast<std::uint64_t>(layout_.frames),
           kCornerBytes + layout_.vertices() * kOffsetBytes);
    }
    layout_.warps_end = in_.position();

    Expect(Marker("MtoN"), "MtoN");
    const auto entries = Next<std::int32_t>();
    Check(entries >= 0 && Next<std::int32_t>() >= 0, "frame map's count below 0");
    layout_.map = in_.position();
    layout_.map_entries = static_cast<std::size_t>(entries);
    for (std::int32_t i = 0; i < entries; ++i) {
      const auto m = Next<std::int32_t>(), n = Next<std::int32_t>();
      Check(m != n && std::min(m, n) >= 0 && std::max(m, n) < layout_.frames,
            "frame map's key is none");
      Skip(1, kMatrixBytes);
    }
  }

  void ReadCrop() {
    Expect(Marker("Crop"), "Crop");
    layout_.crop = in_.position();
    layout_.has_crop = Next<bool>();
    if (!layout_.has_crop) return;
    const auto windows = Next<std::int32_t>();
    Check(windows == 0 || windows == layout_.frames, "crop of another clip");
    Check(Next<std::int32_t>() >= 0 && Next<std::int32_t>() >= 0, "mask's size below 0");
    Skip(1, 2 * sizeof(std::int32_t));
    Skip(static_cast<std::uint64_t>(windows), sizeof(SolvedClip::Window));
  }

  WalkedStream& in_;
  const bool is_packed_;
  SolvedLayout layout_;
};

}  // namespace

double SolvedLayout::square_width() const {
  const double width = static_cast<double>(source_width) * aspect / aspect_divisor;
  return std::max(std::floor(width + 0.5), 1.0);
}

SolvedPayload ReadPayload(std::span<const std::uint8_t> instance) try {
  Header header;
  if (instance.size() < sizeof header) throw StreamError("data ends early");
  std::memcpy(&header, instance.data(), sizeof header);
  if (header.version != kVersion) throw StreamError("another version");
  if (header.flattened != 1) throw StreamError("of an instance at work");
  if (header.payload_length > instance.size() - sizeof header) throw StreamError("data ends early");

  const std::span stored =
      instance.subspan(sizeof header, static_cast<std::size_t>(header.payload_length));
  tessel::filesupport::IStringByteStream bytes(stored.data(), stored.size());
  SolvedPayload payload;
  if (header.raw) {
    if (header.raw == static_cast<std::uint8_t>(PayloadForm::packed)) {
      payload.form = PayloadForm::packed;
    }
    payload.bytes = stored;
    WalkedStream in(bytes, nullptr);
    payload.layout = LayoutReader(in, payload.form).Read();
    if (bytes.MaxBytesLeft() != 0) throw StreamError("more data than was expected");
  } else {
    tessel::filesupport::IZipByteStream inflated(bytes);
    WalkedStream in(inflated, &payload.inflated);
    payload.layout = LayoutReader(in, payload.form).Read();
    inflated.Finish();
    payload.bytes = payload.inflated;
  }
  return payload;
} catch (const StreamError& error) {
  throw NoSolvedClip(std::string("not of a solved effect: ") + error.what());
}

std::span<const std::uint8_t> SolvedPayload::Packed(std::size_t place) const {
  return bytes.subspan(place + sizeof(std::uint32_t), At<std::uint32_t>(place));
}

void SolvedPayload::Read(std::size_t frame, StoredWarp& warp) const {
  warp.offsets.resize(2 * layout.vertices());
  if (form == PayloadForm::packed) {
    const std::size_t place = layout.packed_warps[frame];
    warp.corners = At<std::array<Point, 4>>(place);
    if (!memory::UnpackGrid(Packed(place + kCornerBytes), static_cast<std::size_t>(layout.columns),
                            warp.offsets)) {
      throw NoSolvedClip("a packed warp's bytes are none");
    }
    return;
  }
  const std::size_t size = kCornerBytes + layout.vertices() * kOffsetBytes;
  const std::size_t place = layout.warps + frame * size;
  warp.corners = At<std::array<Point, 4>>(place);
  std::memcpy(warp.offsets.data(), bytes.data() + place + kCornerBytes, size - kCornerBytes);
}

void SolvedPayload::Read(std::size_t frame, TrackRow& row) const {
  constexpr double kTrackStep = 1.0 / 32;
  const auto slots = static_cast<std::size_t>(layout.slots);
  row.places.resize(slots);
  row.statuses.resize(slots);
  if (form == PayloadForm::packed) {
    std::vector<std::int32_t> words(2 * slots);
    const std::span<const std::uint8_t> packed = Packed(layout.packed_tracks[frame]);
    std::size_t place = 0;
    if (!memory::UnpackWords(packed, place, words) ||
        !memory::UnpackWords(packed, place, row.statuses) || place != packed.size()) {
      throw NoSolvedClip("a row of tracks is none");
    }
    const auto seed = static_cast<std::int32_t>(frame + 1);
    for (std::size_t s = 0; s < slots; ++s) {
      row.places[s] = {words[s] * kTrackStep, words[slots + s] * kTrackStep};
      // A seed of this row is 1, and 1 what that would be.
      std::int32_t& status = row.statuses[s];
      if (status == 1 || status == seed) status = status == 1 ? seed : 1;
    }
    return;
  }
  const std::size_t first = frame * slots;
  for (std::size_t s = 0; s < slots; ++s) {
    const auto steps =
        At<std::array<std::int32_t, 2>>(layout.tracks + (first + s) * kPositionBytes);
    row.places[s] = {steps[0] * kTrackStep, steps[1] * kTrackStep};
  }
  std::memcpy(row.statuses.data(),
              bytes.data() + layout.tracks + layout.cells() * kPositionBytes + first * kStatusBytes,
              slots * kStatusBytes);
}

InstanceWriter::InstanceWriter(PayloadForm form, std::size_t size) : form_(form) {
  instance_.reserve(sizeof(Header) + size);
  instance_.resize(sizeof(Header));
}

void InstanceWriter::Append(std::span<const std::uint8_t> bytes) {
  instance_.insert(instance_.end(), bytes.begin(), bytes.end());
}

void InstanceWriter::Append(const StoredWarp& warp, std::size_t columns) {
  Append(warp.corners);
  if (form_ == PayloadForm::packed) {
    std::vector<std::uint8_t> packed;
    memory::PackGrid(warp.offsets, columns, packed);
    Append(static_cast<std::uint32_t>(packed.size()));
    Append(std::span<const std::uint8_t>(packed));
  } else {
    Append(std::span(reinterpret_cast<const std::uint8_t*>(warp.offsets.data()),
                     warp.offsets.size() * sizeof warp.offsets[0]));
  }
}

std::vector<std::uint8_t> InstanceWriter::Take() {
  const Header header = {kVersion, 1, static_cast<std::uint8_t>(form_),
                         {},       0, instance_.size() - sizeof(Header)};
  std::memcpy(instance_.data(), &header, sizeof header);
  return std::move(instance_);
}

}  // namespace calmframe::host
