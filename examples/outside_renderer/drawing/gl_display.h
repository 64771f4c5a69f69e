#pragma once

#include <EGL/egl.h>

namespace outside {

// An OpenGL ES 3 context without a window, current on the thread that made it until its
// destructor. Throws std::runtime_error, one line, where there is none.
class GlDisplay {
 public:
  GlDisplay();
  ~GlDisplay();
  GlDisplay(const GlDisplay&) = delete;
  GlDisplay& operator=(const GlDisplay&) = delete;

 private:
  bool Enter(EGLDisplay display);
  void Leave();

  EGLDisplay display_ = EGL_NO_DISPLAY;
  EGLSurface surface_ = EGL_NO_SURFACE;
  EGLContext context_ = EGL_NO_CONTEXT;
};

}  // namespace outside
