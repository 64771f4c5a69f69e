#include "host/plugin/plugin_library.h"

#include <dlfcn.h>
#include <elf.h>
#include <link.h>

#include <cstddef>
#include <cstring>

#include "platform/hx/hx_properties.h"

namespace calmframe::host {
namespace {

// The size that the library's symbol table tells; 0 if the address is another symbol's.
std::size_t SizeOfSymbol(const void* address, const char* name) {
  Dl_info info{};
  ElfW(Sym)* symbol = nullptr;
  if (dladdr1(address, &info, reinterpret_cast<void**>(&symbol), RTLD_DL_SYMENT) == 0 || !symbol ||
      !info.dli_sname || std::strcmp(info.dli_sname, name) != 0) {
    return 0;
  }
  return symbol->st_size;
}

}  // namespace

void PluginLibrary::Close::operator()(void* library) const {
  dlclose(library);
}

PluginLibrary::PluginLibrary(const std::string& path) : path_(path) {
  library_.reset(dlopen(path.c_str(), RTLD_NOW | RTLD_LOCAL));
  if (!library_) {
    const char* cause = dlerror();
    throw PluginError(path + ": " + (cause ? cause : "can't be loaded"));
  }
  const void* record = dlsym(library_.get(), HX_PROPERTY_SYMBOL);
  if (!record) throw PluginError(path + ": not a plug-in, it has no property record");
  try {
    properties_ = ReadPropertyRecord(record, SizeOfSymbol(record, HX_PROPERTY_SYMBOL));
  } catch (const PluginError& error) {
    throw PluginError(path + ": " + error.what());
  }
  const auto find = [this](auto& pointer, const char* name) {
    pointer = reinterpret_cast<std::decay_t<decltype(pointer)>>(dlsym(library_.get(), name));
  };
  find(entry_, properties_.entry.c_str());
  if (!entry_) throw PluginError(path + ": no entry \"" + properties_.entry + "\"");
  find(exports_.allow_cuda_rendering, HX_EXPORT_ALLOW_CUDA_RENDERING);
  find(exports_.get_var_vector, HX_EXPORT_GET_VAR_VECTOR);
  find(exports_.get_crop_window, HX_EXPORT_GET_CROP_WINDOW);
  find(exports_.get_stabilizer_data, HX_EXPORT_GET_STABILIZER_DATA);
  exports_.fcd_table = dlsym(library_.get(), HX_EXPORT_FCD_TABLE);
}

PluginLibrary::PluginLibrary(HX_EffectMain linked_entry, const PluginProperties& record,
                             const PluginExports& linked_exports)
    : path_(record.match_name),
      properties_(record),
      entry_(linked_entry),
      exports_(linked_exports) {}

}  // namespace calmframe::host
