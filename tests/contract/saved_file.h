#pragma once

#include <cstdint>
#include <cstring>
#include <fstream>
#include <iterator>
#include <string>

#include "host/effects/effect.h"
#include "host/effects/renderer.h"

// What goes from one process of a test to another: a saved effect, and frames.
namespace calmframe::host {

inline void WriteFile(const std::string& path, const std::string& bytes) {
  std::ofstream(path, std::ios::binary) << bytes;
}

inline std::string ReadFile(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  return {std::istreambuf_iterator<char>(file), {}};
}

inline std::string BytesOf(const SavedEffect& saved) {
  const auto count = saved.values.size();
  std::string bytes(reinterpret_cast<const char*>(&count), sizeof count);
  for (const auto& [id, value] : saved.values) {
    bytes.append(reinterpret_cast<const char*>(&id), sizeof id);
    bytes.append(reinterpret_cast<const char*>(&value), sizeof value);
  }
  return bytes.append(saved.instance.begin(), saved.instance.end());
}

inline SavedEffect SavedFrom(const std::string& bytes, const std::string& match_name) {
  SavedEffect saved;
  saved.match_name = match_name;
  const char* at = bytes.data();
  const auto take = [&at](auto* value) {
    std::memcpy(value, at, sizeof *value);
    at += sizeof *value;
  };
  std::size_t count = 0;
  take(&count);
  for (; count > 0; --count) {
    std::int32_t id = 0;
    double value = 0;
    take(&id);
    take(&value);
    saved.values[id] = value;
  }
  saved.instance.assign(at, bytes.data() + bytes.size());
  return saved;
}

// Some frames in every depth, by both paths, with their places.
inline std::string FrameBytes(Renderer& renderer) {
  std::string bytes;
  for (const std::int64_t frame : {0, 5, 12, 23}) {
    for (const int depth : {8, 16, 32, -8, -16}) {
      const RenderedFrame rendered =
          depth > 0 ? renderer.Planned({frame, depth}) : renderer.Direct({frame, -depth});
      if (!rendered.pixels) return "no frame";
      const HX_World& world = rendered.pixels->world();
      const std::int32_t place[] = {world.width, world.height, world.origin_x, world.origin_y};
      bytes.append(reinterpret_cast<const char*>(place), sizeof place);
      const int pixel = depth == 32 ? 16 : depth == 16 || depth == -16 ? 8 : 4;
      for (int y = 0; y < world.height; ++y) {
        bytes.append(rendered.pixels->row<const char>(y),
                     static_cast<std::size_t>(world.width) * pixel);
      }
    }
  }
  return bytes;
}

}  // namespace calmframe::host
