#include "host/plugin/property_record.h"

#include <algorithm>
#include <cstring>
#include <string_view>

#include "platform/hx/hx_properties.h"

namespace calmframe::host {
namespace {

std::uint32_t Little(std::string_view bytes) {
  std::uint32_t value = 0;
  for (std::size_t i = bytes.size(); i-- > 0;) {
    value = value << 8 | static_cast<unsigned char>(bytes[i]);
  }
  return value;
}

// The record's bytes from front to back.
class Bytes {
 public:
  explicit Bytes(std::string_view left) : left_(left) {}
  std::string_view Take(std::size_t size, const char* what) {
    if (size > left_.size()) throw PluginError(std::string("property record ends within ") + what);
    const std::string_view taken = left_.substr(0, size);
    left_.remove_prefix(size);
    return taken;
  }
  std::uint32_t Number(std::size_t size, const char* what) { return Little(Take(size, what)); }
  // The last value's padding may be left out.
  void Skip(std::size_t size) { left_.remove_prefix(std::min(size, left_.size())); }

 private:
  std::string_view left_;
};

std::string Quoted(std::string_view key) {
  return "property \"" + std::string(key) + "\"";
}

std::uint32_t Word(std::string_view key, std::string_view value, std::size_t size) {
  if (value.size() < size) throw PluginError(Quoted(key) + " is too short");
  return Little(value.substr(0, size));
}

std::string Pascal(std::string_view key, std::string_view value) {
  if (value.empty() || value.size() - 1 < static_cast<unsigned char>(value[0])) {
    throw PluginError(Quoted(key) + " is too short");
  }
  return std::string(value.substr(1, static_cast<unsigned char>(value[0])));
}

std::string ZeroEnded(std::string_view key, std::string_view value) {
  const std::size_t end = value.find('\0');
  if (end == std::string_view::npos) throw PluginError(Quoted(key) + " has no end");
  return std::string(value.substr(0, end));
}

void Read(std::string_view key, std::string_view value, PluginProperties& properties) {
  if (key == HX_KEY_NAME) {
    properties.name = Pascal(key, value);
  } else if (key == HX_KEY_CATEGORY) {
    properties.category = Pascal(key, value);
  } else if (key == HX_KEY_MATCH_NAME) {
    properties.match_name = Pascal(key, value);
  } else if (key == HX_KEY_ENTRY_64) {
    properties.entry = ZeroEnded(key, value);
  } else if (key == HX_KEY_HOST_PLUGIN_VERSION) {
    properties.host_plugin_version = Word(key, value, 4);
  } else if (key == HX_KEY_HOST_SPEC_VERSION) {
    properties.host_spec_version = Word(key, value, 4);
  } else if (key == HX_KEY_EFFECT_VERSION) {
    properties.effect_version = Word(key, value, 4);
  } else if (key == HX_KEY_EFFECT_INFO) {
    properties.effect_info = Word(key, value, 2);
  } else if (key == HX_KEY_OUT_FLAGS) {
    properties.out_flags = Word(key, value, 4);
  } else if (key == HX_KEY_OUT_FLAGS_2) {
    properties.out_flags_2 = Word(key, value, 4);
  } else if (key == HX_KEY_HOST_FLAGS) {
    properties.host_flags = Word(key, value, 4);
  }
}

}  // namespace

PluginProperties ReadPropertyRecord(const void* record, std::size_t size) {
  Bytes bytes({static_cast<const char*>(record), size});
  if (bytes.Number(2, "its header") != HX_PROPERTY_VERSION ||
      bytes.Number(4, "its header") != HX_PROPERTY_SECOND_VERSION) {
    throw PluginError("property record of another version");
  }
  PluginProperties properties;
  bool is_effect = false;
  for (std::uint32_t left = bytes.Number(4, "its header"); left > 0; --left) {
    if (bytes.Take(4, "a property") != HX_PROPERTY_VENDOR) {
      throw PluginError("property of another vendor");
    }
    const std::string_view key = bytes.Take(4, "a property");
    bytes.Take(4, "a property");  // index
    const std::uint32_t length = bytes.Number(4, "a property");
    const std::string_view value = bytes.Take(length, "a property");
    bytes.Skip((4 - length % 4) % 4);
    if (key == HX_KEY_KIND) {
      if (value != HX_KIND_EFFECT) throw PluginError("plug-in of another kind");
      is_effect = true;
    } else {
      Read(key, value, properties);
    }
  }
  if (!is_effect) throw PluginError("property record without a kind");
  if (properties.entry.empty()) throw PluginError("property record without an entry");
  if (properties.match_name.empty()) throw PluginError("property record without a match name");
  return properties;
}

}  // namespace calmframe::host
