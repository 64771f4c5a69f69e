#include "editors/mlt/clip_identity.h"

#include <zlib.h>

#include <algorithm>
#include <fstream>
#include <vector>

namespace calmframe::mlt {
namespace {

constexpr std::streamoff kRead = 64 << 10;  // of either end: sizes and indices stand there

std::string TextOf(mlt_properties properties, const char* name) {
  const char* const text = mlt_properties_get(properties, name);
  return text ? text : "";
}

// Empty for what can't be read.
std::string ContentOf(const std::string& path) {
  std::ifstream file(path, std::ios::binary);
  file.seekg(0, std::ios::end);
  const std::streamoff size = file.tellg();
  if (!file || size < 0) return "";
  std::vector<char> bytes(static_cast<std::size_t>(std::min(size, kRead)));
  std::string text = std::to_string(size);
  for (const std::streamoff start :
       {std::streamoff{0}, size - static_cast<std::streamoff>(bytes.size())}) {
    file.seekg(start);
    if (!file.read(bytes.data(), static_cast<std::streamsize>(bytes.size()))) return "";
    text += ' ';
    text += std::to_string(
        crc32(0, reinterpret_cast<const Bytef*>(bytes.data()), static_cast<uInt>(bytes.size())));
  }
  return text;
}

}  // namespace

std::string PathOf(mlt_producer producer) {
  if (!producer) return "";
  const mlt_properties properties = MLT_PRODUCER_PROPERTIES(mlt_producer_cut_parent(producer));
  for (const char* name :
       {"kdenlive:originalurl", "shotcut:originalResource", "warp_resource", "resource"}) {
    std::string path = TextOf(properties, name);
    if (!path.empty()) return path;
  }
  return "";
}

std::string IdentityOf(mlt_producer producer) {
  if (!producer) return "";
  const mlt_properties properties = MLT_PRODUCER_PROPERTIES(mlt_producer_cut_parent(producer));
  const std::string path = PathOf(producer);
  std::string identity = ContentOf(path);
  if (identity.empty()) identity = path;
  const double speed = mlt_properties_get_double(properties, "warp_speed");
  if (speed != 0) identity.append(" speed ").append(std::to_string(speed));
  // What plays at another speed gives its own producer a profile of another rate.
  const mlt_producer parent = mlt_producer_cut_parent(producer);
  if (const mlt_profile profile = mlt_service_profile(MLT_PRODUCER_SERVICE(parent))) {
    identity.append(" rate ").append(std::to_string(mlt_profile_fps(profile)));
  }
  // What a chain plays says of itself that it were a chain, where both come from a document; a
  // chain alone is its own child.
  if (mlt_service_identify(MLT_PRODUCER_SERVICE(parent)) == mlt_service_chain_type &&
      parent->child == parent) {
    const auto chain = reinterpret_cast<mlt_chain>(parent);
    for (int i = 0; i < mlt_chain_link_count(chain); ++i) {
      const mlt_properties link = MLT_LINK_PROPERTIES(mlt_chain_link(chain, i));
      for (const char* map : {"time_map", "speed_map", "map"}) {
        const std::string text = TextOf(link, map);
        if (!text.empty()) identity.append(" ").append(map).append(" ").append(text);
      }
    }
  }
  return identity;
}

}  // namespace calmframe::mlt
