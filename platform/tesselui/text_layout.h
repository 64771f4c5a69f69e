#pragma once

#include <pango/pangocairo.h>

#include <memory>
#include <mutex>
#include <string>

#include "platform/tesselui/font.h"

namespace tesselui {

// A text set in a font. Pango's fonts are shared by the whole process and not made for several
// threads: a layout holds the lock on them while it lives.
class TextLayout {
 public:
  TextLayout(const Font& font, const std::string& text);
  PangoLayout* get() const { return layout_.get(); }

 private:
  struct Unref {
    void operator()(void* object) const { g_object_unref(object); }
  };
  std::unique_lock<std::mutex> lock_;
  std::unique_ptr<PangoContext, Unref> context_;
  std::unique_ptr<PangoLayout, Unref> layout_;
};

}  // namespace tesselui
