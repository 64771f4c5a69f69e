#pragma once

#include <cstdint>
#include <string>

// How the fuzzer's input tells of a project: these bytes, then those of the saved instance.
namespace calmframe::host {

struct ProjectInput {
  std::uint8_t flags = 0;
  std::uint8_t frame = 0;        // of the layer, that is drawn
  std::uint8_t framing = 0;      // from 0
  std::uint8_t control = 0;      // of those that are declared, that has `value`
  std::int16_t start_frame = 0;  // of the layer
  std::int16_t length = 0;       // of the layer
  double value = 0;
};
static_assert(sizeof(ProjectInput) == 16);

enum : std::uint8_t {
  kToBeDeflated = 1,  // the payload, so that changes reach past the compression
  kOnePixel = 2,      // the clip
  kWidePixels = 4,    // the clip's
  kTicks = 8,         // so that what is to be made is begun
  kDirectly = 16,     // drawn
  kDeeply = 32,       // drawn, at 16 bits
};

inline std::string BytesOf(const ProjectInput& input, const std::string& instance) {
  return std::string(reinterpret_cast<const char*>(&input), sizeof input) + instance;
}

}  // namespace calmframe::host
