#include <algorithm>
#include <bit>
#include <cstring>

#include "platform/tessel/filesupport.h"

namespace tessel::filesupport {
namespace {

static_assert(std::endian::native == std::endian::little, "values are written as they stand");

template <typename T>
OutputByteStream& WriteRaw(OutputByteStream& stream, const T& value) {
  stream.Write(&value, sizeof value);
  return stream;
}

template <typename T>
InputByteStream& ReadRaw(InputByteStream& stream, T& value) {
  stream.Read(&value, sizeof value);
  return stream;
}

std::uint8_t ReadByteUpTo(InputByteStream& stream, std::uint8_t max) {
  std::uint8_t byte = 0;
  stream.Read(&byte, 1);
  if (byte > max) throw StreamError("truth value out of range");
  return byte;
}

}  // namespace

void InputByteStream::Read(void* data, std::size_t size) {
  auto* to = static_cast<unsigned char*>(data);
  while (size > 0) {
    const std::size_t got = ReadSome(to, size);
    if (got == 0) throw StreamError("data ends early");
    to += got;
    size -= got;
  }
}

OutputByteStream& operator<<(OutputByteStream& stream, std::int32_t value) {
  return WriteRaw(stream, value);
}
OutputByteStream& operator<<(OutputByteStream& stream, std::uint32_t value) {
  return WriteRaw(stream, value);
}
OutputByteStream& operator<<(OutputByteStream& stream, std::int64_t value) {
  return WriteRaw(stream, value);
}
OutputByteStream& operator<<(OutputByteStream& stream, std::uint64_t value) {
  return WriteRaw(stream, value);
}
OutputByteStream& operator<<(OutputByteStream& stream, bool value) {
  return WriteRaw(stream, static_cast<std::uint8_t>(value));
}
OutputByteStream& operator<<(OutputByteStream& stream, boost::logic::tribool value) {
  const int byte = boost::logic::indeterminate(value) ? 2 : (value ? 1 : 0);
  return WriteRaw(stream, static_cast<std::uint8_t>(byte));
}
OutputByteStream& operator<<(OutputByteStream& stream, const std::u16string& text) {
  stream << static_cast<std::uint32_t>(text.size());
  stream.Write(text.data(), text.size() * sizeof(char16_t));
  return stream;
}
OutputByteStream& operator<<(OutputByteStream& stream, const utility::Guid& guid) {
  return WriteRaw(stream, guid.bytes());
}

InputByteStream& operator>>(InputByteStream& stream, std::int32_t& value) {
  return ReadRaw(stream, value);
}
InputByteStream& operator>>(InputByteStream& stream, std::uint32_t& value) {
  return ReadRaw(stream, value);
}
InputByteStream& operator>>(InputByteStream& stream, std::int64_t& value) {
  return ReadRaw(stream, value);
}
InputByteStream& operator>>(InputByteStream& stream, std::uint64_t& value) {
  return ReadRaw(stream, value);
}
InputByteStream& operator>>(InputByteStream& stream, bool& value) {
  value = ReadByteUpTo(stream, 1) == 1;
  return stream;
}
InputByteStream& operator>>(InputByteStream& stream, boost::logic::tribool& value) {
  const std::uint8_t byte = ReadByteUpTo(stream, 2);
  value = byte == 2 ? boost::logic::tribool(boost::logic::indeterminate)
                    : boost::logic::tribool(byte == 1);
  return stream;
}
InputByteStream& operator>>(InputByteStream& stream, std::u16string& text) {
  std::uint32_t left = 0;
  stream >> left;
  if (left > stream.MaxBytesLeft() / sizeof(char16_t)) throw StreamError("text ends early");
  // By pieces: a zip stream's bound may lie far above what it holds.
  constexpr std::uint32_t kPiece = 1 << 16;
  text.clear();
  while (left > 0) {
    const std::size_t begin = text.size(), count = std::min(left, kPiece);
    text.resize(begin + count);
    stream.Read(text.data() + begin, count * sizeof(char16_t));
    left -= static_cast<std::uint32_t>(count);
  }
  return stream;
}
InputByteStream& operator>>(InputByteStream& stream, utility::Guid& guid) {
  utility::Guid::Bytes bytes;
  ReadRaw(stream, bytes);
  guid = utility::Guid(bytes);
  return stream;
}

void OStringByteStream::Write(const void* data, std::size_t size) {
  bytes_.append(static_cast<const char*>(data), size);
}

IStringByteStream::IStringByteStream(const void* data, std::size_t size)
    : next_(static_cast<const unsigned char*>(data)), left_(size) {}

std::size_t IStringByteStream::ReadSome(void* data, std::size_t size) {
  const std::size_t count = std::min(size, left_);
  if (count > 0) std::memcpy(data, next_, count);
  next_ += count;
  left_ -= count;
  return count;
}

File::~File() {
  Close();
}

bool File::OpenForWriting(const std::string& path) {
  Close();
  file_ = std::fopen(path.c_str(), "wbe");
  return file_ != nullptr;
}

bool File::Write(const void* data, std::size_t size) {
  return file_ && std::fwrite(data, 1, size, file_) == size;
}

bool File::Close() {
  if (!file_) return true;
  const bool whole = std::ferror(file_) == 0;
  const bool closed = std::fclose(file_) == 0;
  file_ = nullptr;
  return whole && closed;
}

}  // namespace tessel::filesupport
