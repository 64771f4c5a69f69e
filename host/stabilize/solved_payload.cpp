#include "host/stabilize/solved_payload.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <limits>

#include "platform/tessel/filesupport.h"

namespace calmframe::host {
namespace {

using tessel::filesupport::InputByteStream;
using tessel::filesupport::StreamError;

constexpr std::uint32_t kVersion = 16;
constexpr std::int32_t kSolved = 2;
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

// Passes all it reads on into a copy.
class CopiedStream final : public InputByteStream {
 public:
  CopiedStream(InputByteStream& in, std::string& copy) : in_(in), copy_(copy) {}
  std::size_t ReadSome(void* data, std::size_t size) override {
    const std::size_t got = in_.ReadSome(data, size);
    copy_.append(static_cast<const char*>(data), got);
    return got;
  }
  std::uint64_t MaxBytesLeft() const override { return in_.MaxBytesLeft(); }
  std::size_t position() const { return copy_.size(); }

 private:
  InputByteStream& in_;
  std::string& copy_;
};

// Walks over a payload from end to end.
class LayoutReader {
 public:
  explicit LayoutReader(CopiedStream& in) : in_(in) {}

  SolvedLayout Read() {
    ReadAnalysis();
    ReadSolve();
    Expect(Marker("StrF"), "StrF");
    in_ >> layout_.first_frame;
    layout_.tracks = in_.position();
    Skip(layout_.cells(), kPositionBytes + kStatusBytes);
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
    Check(count <= in_.MaxBytesLeft() / size, "more records than bytes");
    std::array<char, 1 << 14> piece;
    for (std::uint64_t left = count * size; left > 0;) {
      const std::size_t bytes = std::min<std::uint64_t>(left, piece.size());
      in_.Read(piece.data(), bytes);
      left -= bytes;
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
    Check(layout_.columns > 1 && layout_.rows > 1 &&
              layout_.vertices() <= in_.MaxBytesLeft() / kOffsetBytes,
          "no grid");
    layout_.warps = in_.position();
    Skip(static_cast<std::uint64_t>(layout_.frames),
         kCornerBytes + layout_.vertices() * kOffsetBytes);

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

  CopiedStream& in_;
  SolvedLayout layout_;
};

}  // namespace

double SolvedLayout::square_width() const {
  const double width = static_cast<double>(source_width) * aspect / aspect_divisor;
  return std::max(std::floor(width + 0.5), 1.0);
}

SolvedPayload ReadPayload(const std::vector<std::uint8_t>& instance) try {
  Header header;
  if (instance.size() < sizeof header) throw StreamError("data ends early");
  std::memcpy(&header, instance.data(), sizeof header);
  if (header.version != kVersion) throw StreamError("another version");
  if (header.flattened != 1) throw StreamError("of an instance at work");
  if (header.payload_length > instance.size() - sizeof header) throw StreamError("data ends early");

  tessel::filesupport::IStringByteStream stored(instance.data() + sizeof header,
                                                static_cast<std::size_t>(header.payload_length));
  SolvedPayload payload;
  if (header.raw) {
    CopiedStream in(stored, payload.bytes);
    payload.layout = LayoutReader(in).Read();
    if (stored.MaxBytesLeft() != 0) throw StreamError("more data than was expected");
  } else {
    tessel::filesupport::IZipByteStream inflated(stored);
    CopiedStream in(inflated, payload.bytes);
    payload.layout = LayoutReader(in).Read();
    inflated.Finish();
  }
  return payload;
} catch (const StreamError& error) {
  throw NoSolvedClip(std::string("not of a solved effect: ") + error.what());
}

std::vector<std::uint8_t> InstanceOf(const std::string& payload) {
  const Header header = {kVersion, 1, 1, {}, 0, payload.size()};
  std::vector<std::uint8_t> instance(sizeof header + payload.size());
  std::memcpy(instance.data(), &header, sizeof header);
  std::memcpy(instance.data() + sizeof header, payload.data(), payload.size());
  return instance;
}

}  // namespace calmframe::host
