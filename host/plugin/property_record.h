#pragma once

#include <cstddef>
#include <cstdint>
#include <stdexcept>
#include <string>

namespace calmframe::host {

// Why a library can't be used as a plug-in, in one line.
class PluginError : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// What a plug-in tells of itself before it is called. Texts UTF-8; words that the record lacks are
// 0.
struct PluginProperties {
  std::string name, category;  // keyed literals; see tessel::config::Localizer
  std::string match_name;      // the effect's identity in projects
  std::string entry;           // symbol
  std::uint32_t host_plugin_version = 0, host_spec_version = 0;
  std::uint32_t effect_version = 0, effect_info = 0;
  std::uint32_t out_flags = 0, out_flags_2 = 0;  // need not be those that the plug-in sets
  std::uint32_t host_flags = 0;
};

// Reads a property record (platform/hx/hx_properties.h) of `size` bytes, with padded or unpadded
// length words. Throws PluginError for one of another version, vendor or kind, for one cut short,
// and where the kind, the entry or the match name is missing.
PluginProperties ReadPropertyRecord(const void* record, std::size_t size);

}  // namespace calmframe::host
