#include "examples/outside_renderer/drawing/gl_display.h"

#include <EGL/eglext.h>

#include <array>
#include <cstring>
#include <stdexcept>

namespace outside {
namespace {

template <class Function>
Function Find(const char* name) {
  return reinterpret_cast<Function>(eglGetProcAddress(name));
}

bool Has(const char* extension) {
  const char* all = eglQueryString(EGL_NO_DISPLAY, EGL_EXTENSIONS);
  return all && std::strstr(all, extension);
}

}  // namespace

// Graphics cards come first among the devices, the software driver last. Where devices can't be
// listed there may still be a driver without a window system.
GlDisplay::GlDisplay() {
  const auto display_of = Find<PFNEGLGETPLATFORMDISPLAYEXTPROC>("eglGetPlatformDisplayEXT");
  const auto devices_of = Find<PFNEGLQUERYDEVICESEXTPROC>("eglQueryDevicesEXT");
  if (display_of && devices_of && Has("EGL_EXT_device_enumeration") &&
      Has("EGL_EXT_platform_device")) {
    std::array<EGLDeviceEXT, 16> devices;
    EGLint count = 0;
    devices_of(static_cast<EGLint>(devices.size()), devices.data(), &count);
    for (EGLint i = 0; i < count; ++i) {
      if (Enter(
              display_of(EGL_PLATFORM_DEVICE_EXT, devices[static_cast<std::size_t>(i)], nullptr))) {
        return;
      }
    }
  }
  if (display_of && Has("EGL_MESA_platform_surfaceless") &&
      Enter(display_of(EGL_PLATFORM_SURFACELESS_MESA, EGL_DEFAULT_DISPLAY, nullptr))) {
    return;
  }
  if (!Enter(eglGetDisplay(EGL_DEFAULT_DISPLAY))) {
    throw std::runtime_error("no OpenGL ES 3 without a window on this machine");
  }
}

GlDisplay::~GlDisplay() {
  Leave();
}

bool GlDisplay::Enter(EGLDisplay display) {
  display_ = display;
  const EGLint wanted[] = {EGL_SURFACE_TYPE, EGL_PBUFFER_BIT, EGL_RENDERABLE_TYPE,
                           EGL_OPENGL_ES3_BIT_KHR, EGL_NONE};
  const EGLint version[] = {EGL_CONTEXT_CLIENT_VERSION, 3, EGL_NONE};
  const EGLint size[] = {EGL_WIDTH, 1, EGL_HEIGHT, 1, EGL_NONE};
  EGLConfig config = nullptr;
  EGLint configs = 0;
  if (display_ != EGL_NO_DISPLAY && eglInitialize(display_, nullptr, nullptr) &&
      eglBindAPI(EGL_OPENGL_ES_API) && eglChooseConfig(display_, wanted, &config, 1, &configs) &&
      configs == 1) {
    context_ = eglCreateContext(display_, config, EGL_NO_CONTEXT, version);
    surface_ = eglCreatePbufferSurface(display_, config, size);
    if (context_ != EGL_NO_CONTEXT && surface_ != EGL_NO_SURFACE &&
        eglMakeCurrent(display_, surface_, surface_, context_)) {
      return true;
    }
  }
  Leave();
  return false;
}

void GlDisplay::Leave() {
  if (display_ == EGL_NO_DISPLAY) return;
  eglMakeCurrent(display_, EGL_NO_SURFACE, EGL_NO_SURFACE, EGL_NO_CONTEXT);
  if (surface_ != EGL_NO_SURFACE) eglDestroySurface(display_, surface_);
  if (context_ != EGL_NO_CONTEXT) eglDestroyContext(display_, context_);
  eglTerminate(display_);
  eglReleaseThread();
  display_ = EGL_NO_DISPLAY;
  surface_ = EGL_NO_SURFACE;
  context_ = EGL_NO_CONTEXT;
}

}  // namespace outside
