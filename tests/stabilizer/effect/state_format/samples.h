#pragma once

#include <zlib.h>

#include <cstdint>
#include <cstring>
#include <fstream>
#include <iterator>
#include <stdexcept>
#include <string>

// Payloads of every version of the format, in samples/. They were put together byte by byte from
// the table in docs/state_format.md, without any of the code that reads and writes them, and are
// never made anew: what a version wrote can't change. Each is of two frames of 64 x 36, whose grid
// is 64 x 36 too, with three slots, the first at frame 7, and of an analysis with a job; the name
// tells the version, how the solve stands, and what is otherwise.
namespace kelp::effect {

struct Sample {
  std::uint32_t version;
  std::string deflated;  // as it lies in the file
  std::string plain;
};

// By uncompress() or compress().
template <class Transform>
std::string Zlib(const Transform& transform, const std::string& bytes) {
  std::string out(1 << 20, '\0');  // more than any of them needs
  uLongf size = out.size();
  if (transform(reinterpret_cast<Bytef*>(out.data()), &size,
                reinterpret_cast<const Bytef*>(bytes.data()), bytes.size()) != Z_OK) {
    throw std::runtime_error("sample is not whole");
  }
  out.resize(size);
  return out;
}
inline std::string Deflated(const std::string& bytes) {
  return Zlib(compress, bytes);
}

// "v16_solved".
inline Sample ReadSample(const std::string& name) {
  std::ifstream file(CALMFRAME_SAMPLES "/" + name, std::ios::binary);
  Sample sample{static_cast<std::uint32_t>(std::stoul(name.substr(1, 2))),
                {std::istreambuf_iterator<char>(file), {}},
                {}};
  sample.plain = Zlib(uncompress, sample.deflated);
  return sample;
}

// A number as it lies in a payload.
template <class Number>
std::string BytesOf(Number number) {
  std::string bytes(sizeof number, '\0');
  std::memcpy(bytes.data(), &number, sizeof number);
  return bytes;
}

}  // namespace kelp::effect
