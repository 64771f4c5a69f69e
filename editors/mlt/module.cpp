#include <framework/mlt.h>

#include <string>

#include "editors/mlt/filter.h"

// What MLT looks for in the module.
namespace {

void* Make(mlt_profile, mlt_service_type, const char*, void*) {
  return calmframe::mlt::MakeFilter();
}

mlt_properties Metadata(mlt_service_type, const char*, void*) {
  const char* const data = mlt_environment("MLT_DATA");
  return mlt_properties_parse_yaml(
      (std::string(data ? data : "") + "/calmframe/filter_calmframe.yml").c_str());
}

}  // namespace

extern "C" __attribute__((visibility("default"))) void mlt_register(mlt_repository repository) {
  mlt_repository_register(repository, mlt_service_filter_type, "calmframe",
                          reinterpret_cast<mlt_register_callback>(Make));
  mlt_repository_register_metadata(repository, mlt_service_filter_type, "calmframe", Metadata,
                                   nullptr);
}
