// A fuzzer's counters lie in what was loaded, so the plug-in stays when its last host goes.

#include <dlfcn.h>

#include <cstdlib>
#include <iostream>

extern "C" int LLVMFuzzerInitialize(int*, char***) {
  if (!dlopen(CALMFRAME_PLUGIN, RTLD_NOW | RTLD_NODELETE)) {
    std::cerr << dlerror() << '\n';
    std::exit(2);
  }
  setenv("CALMFRAME_PLUGIN", CALMFRAME_PLUGIN, 1);
  return 0;
}
