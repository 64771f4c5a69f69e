#pragma once

#include <boost/logic/tribool.hpp>
#include <cstddef>
#include <cstdint>
#include <cstdio>
#include <memory>
#include <stdexcept>
#include <string>

#include "platform/tessel/guid.h"

// Byte streams and files. One thread at a time uses an object.
namespace tessel::filesupport {

// Data ends early, is damaged, or can't be what is read.
class StreamError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

class OutputByteStream {
 public:
  virtual ~OutputByteStream() = default;
  virtual void Write(const void* data, std::size_t size) = 0;
};

class InputByteStream {
 public:
  virtual ~InputByteStream() = default;
  // Up to `size` bytes, at least one unless the stream has ended or `size` is 0; how many.
  virtual std::size_t ReadSome(void* data, std::size_t size) = 0;
  // No more bytes than this are left: a bound for counts before memory is taken for them.
  virtual std::uint64_t MaxBytesLeft() const = 0;

  void Read(void* data, std::size_t size);
};

// All little-endian. A bool is one byte, 0 or 1; a tribool one byte, 2 for undetermined; a text a
// u32 count of UTF-16 units and the units; a Guid its 16 bytes.
OutputByteStream& operator<<(OutputByteStream& stream, std::int32_t value);
OutputByteStream& operator<<(OutputByteStream& stream, std::uint32_t value);
OutputByteStream& operator<<(OutputByteStream& stream, std::int64_t value);
OutputByteStream& operator<<(OutputByteStream& stream, std::uint64_t value);
OutputByteStream& operator<<(OutputByteStream& stream, bool value);
OutputByteStream& operator<<(OutputByteStream& stream, boost::logic::tribool value);
OutputByteStream& operator<<(OutputByteStream& stream, const std::u16string& text);
OutputByteStream& operator<<(OutputByteStream& stream, const utility::Guid& guid);
template <typename T>  // no pointer as a bool
OutputByteStream& operator<<(OutputByteStream& stream, T* pointer) = delete;

InputByteStream& operator>>(InputByteStream& stream, std::int32_t& value);
InputByteStream& operator>>(InputByteStream& stream, std::uint32_t& value);
InputByteStream& operator>>(InputByteStream& stream, std::int64_t& value);
InputByteStream& operator>>(InputByteStream& stream, std::uint64_t& value);
InputByteStream& operator>>(InputByteStream& stream, bool& value);
InputByteStream& operator>>(InputByteStream& stream, boost::logic::tribool& value);
InputByteStream& operator>>(InputByteStream& stream, std::u16string& text);
InputByteStream& operator>>(InputByteStream& stream, utility::Guid& guid);

class OStringByteStream final : public OutputByteStream {
 public:
  void Write(const void* data, std::size_t size) override;
  const std::string& bytes() const { return bytes_; }
  std::string Take() { return std::move(bytes_); }

 private:
  std::string bytes_;
};

class IStringByteStream final : public InputByteStream {
 public:
  // The bytes are borrowed.
  IStringByteStream(const void* data, std::size_t size);
  std::size_t ReadSome(void* data, std::size_t size) override;
  std::uint64_t MaxBytesLeft() const override { return left_; }

 private:
  const unsigned char* next_;
  std::size_t left_;
};

// Deflates into `out`, which it borrows, in zlib's format.
class OZipByteStream final : public OutputByteStream {
 public:
  explicit OZipByteStream(OutputByteStream& out);
  ~OZipByteStream() override;  // without Close the output stays cut
  void Write(const void* data, std::size_t size) override;
  // Writes what is left; nothing may be written afterwards.
  void Close();

 private:
  struct State;
  std::unique_ptr<State> state_;
};

// Inflates from `in`, which it borrows. It may take bytes of `in` from behind the zlib data.
class IZipByteStream final : public InputByteStream {
 public:
  explicit IZipByteStream(InputByteStream& in);
  ~IZipByteStream() override;
  std::size_t ReadSome(void* data, std::size_t size) override;
  std::uint64_t MaxBytesLeft() const override;
  // Throws StreamError unless all was read and the data was whole, by its check value.
  void Finish();

 private:
  struct State;
  std::unique_ptr<State> state_;
};

// A file written in binary.
class File {
 public:
  File() = default;
  ~File();
  File(const File&) = delete;
  File& operator=(const File&) = delete;

  // Makes or empties the file at the UTF-8 path; others may read and write it meanwhile.
  bool OpenForWriting(const std::string& path);
  // False once anything could not be written.
  bool Write(const void* data, std::size_t size);
  // False if not all got to the file. A closed file counts as closed well.
  bool Close();

 private:
  std::FILE* file_ = nullptr;
};

}  // namespace tessel::filesupport
