#include <zlib.h>

#include <algorithm>
#include <array>
#include <limits>
#include <new>

#include "platform/tessel/filesupport.h"

namespace tessel::filesupport {
namespace {

constexpr std::size_t kBufferSize = 1 << 15;
// Deflate's best: 258 bytes from two bits.
constexpr std::uint64_t kMaxRatio = 1032;
// Of a track table deflate's default saves another 4 % in four times the time, which whoever saves
// waits for.
constexpr int kLevel = 4;

uInt Piece(std::size_t size) {
  return static_cast<uInt>(std::min<std::size_t>(size, std::numeric_limits<uInt>::max()));
}

}  // namespace

struct OZipByteStream::State {
  explicit State(OutputByteStream& o) : out(o) {
    if (deflateInit(&zip, kLevel) != Z_OK) throw std::bad_alloc();
  }
  ~State() { deflateEnd(&zip); }

  // Deflates what next_in holds and, to finish, all that is left.
  void Run(int flush) {
    do {
      zip.next_out = buffer.data();
      zip.avail_out = static_cast<uInt>(buffer.size());
      const int status = deflate(&zip, flush);
      if (status != Z_OK && status != Z_STREAM_END && status != Z_BUF_ERROR) {
        throw StreamError("deflate failed");
      }
      out.Write(buffer.data(), buffer.size() - zip.avail_out);
    } while (zip.avail_out == 0);
  }

  OutputByteStream& out;
  z_stream zip{};
  std::array<Bytef, kBufferSize> buffer;
  bool closed = false;
};

OZipByteStream::OZipByteStream(OutputByteStream& out) : state_(std::make_unique<State>(out)) {}
OZipByteStream::~OZipByteStream() = default;

void OZipByteStream::Write(const void* data, std::size_t size) {
  if (state_->closed) throw StreamError("written to after its end");
  auto* from = static_cast<const Bytef*>(data);
  while (size > 0) {
    const uInt piece = Piece(size);
    state_->zip.next_in = const_cast<Bytef*>(from);
    state_->zip.avail_in = piece;
    state_->Run(Z_NO_FLUSH);
    from += piece;
    size -= piece;
  }
}

void OZipByteStream::Close() {
  if (state_->closed) return;
  state_->closed = true;
  state_->zip.avail_in = 0;
  state_->Run(Z_FINISH);
}

struct IZipByteStream::State {
  explicit State(InputByteStream& i) : in(i) {
    if (inflateInit(&zip) != Z_OK) throw std::bad_alloc();
  }
  ~State() { inflateEnd(&zip); }

  InputByteStream& in;
  z_stream zip{};
  std::array<Bytef, kBufferSize> buffer;
  bool ended = false;
};

IZipByteStream::IZipByteStream(InputByteStream& in) : state_(std::make_unique<State>(in)) {}
IZipByteStream::~IZipByteStream() = default;

std::size_t IZipByteStream::ReadSome(void* data, std::size_t size) {
  State& s = *state_;
  const uInt wanted = Piece(size);
  s.zip.next_out = static_cast<Bytef*>(data);
  s.zip.avail_out = wanted;
  while (!s.ended && s.zip.avail_out == wanted && wanted > 0) {
    if (s.zip.avail_in == 0) {
      s.zip.next_in = s.buffer.data();
      s.zip.avail_in = static_cast<uInt>(s.in.ReadSome(s.buffer.data(), s.buffer.size()));
    }
    const bool starved = s.zip.avail_in == 0;
    const int status = inflate(&s.zip, Z_NO_FLUSH);
    if (status == Z_MEM_ERROR) throw std::bad_alloc();
    s.ended = status == Z_STREAM_END;
    if (s.ended) break;
    if (status != Z_OK && status != Z_BUF_ERROR) throw StreamError("zlib data is damaged");
    if (starved && s.zip.avail_out == wanted) throw StreamError("zlib data ends early");
  }
  return wanted - s.zip.avail_out;
}

std::uint64_t IZipByteStream::MaxBytesLeft() const {
  if (state_->ended) return 0;
  // What inflate holds back is at most its window and one match.
  constexpr std::uint64_t kHeldBack = (1 << 15) + 258;
  const std::uint64_t deflated = state_->in.MaxBytesLeft() + state_->zip.avail_in;
  constexpr std::uint64_t kMost = std::numeric_limits<std::uint64_t>::max() - kHeldBack;
  return deflated > kMost / kMaxRatio ? kMost : deflated * kMaxRatio + kHeldBack;
}

void IZipByteStream::Finish() {
  unsigned char more = 0;
  if (ReadSome(&more, 1) != 0) throw StreamError("more data than was expected");
}

}  // namespace tessel::filesupport
