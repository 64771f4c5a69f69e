// Whatever a document of an editor or a file of results says to the MLT filter: what it can't use
// is refused with a line, and of what it can use a frame is drawn.

#include <framework/mlt.h>

#include <atomic>
#include <cstdint>
#include <cstdlib>
#include <stdexcept>
#include <string>
#include <vector>

#include "editors/mlt/controls.h"
#include "editors/mlt/results_place.h"
#include "editors/mlt/steadier.h"
#include "fuzz/mlt_input.h"
#include "fuzz/saved_work.h"

namespace {

using namespace calmframe;
using namespace calmframe::mlt;

constexpr int kMostPixels = 1 << 16;

void Draw(Steadier& steadier, std::int64_t frame, const PictureKind& kind) {
  if (!steadier.has(frame) || steadier.width() * std::int64_t{steadier.height()} > kMostPixels) {
    return;
  }
  std::vector<std::uint8_t> from(4 * static_cast<std::size_t>(steadier.width()) *
                                 static_cast<std::size_t>(steadier.height()));
  std::vector<std::uint8_t> to(from.size());
  const SessionImage source(kind.format, steadier.width(), steadier.height(), from.data());
  SessionImage drawn(kind.format, steadier.width(), steadier.height(), to.data());
  steadier.Draw(frame, kind, source.image(), drawn.image());
  drawn.Finish();
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  fuzz::Input input(data, size);
  static const fuzz::ScratchFile file;
  unlink(file.path().c_str());
  const auto told = input.Take<fuzz::MltInput>();
  SteadyRequest request;
  request.identity = "clip";
  request.rate_num = told.rate_num;
  request.rate_den = told.rate_den;
  request.display_num = told.display_num;
  request.display_den = told.display_den;
  const mlt_properties properties = mlt_properties_new();
  for (std::string name; !(name = input.TakeText()).empty();) {
    mlt_properties_set(properties, name.c_str(), input.TakeText().c_str());
  }
  const char* const results = mlt_properties_get(properties, "results");
  const ResultsPlace place = ResultsPlaceFrom(results ? results : "");
  const ResultsPlace again = ResultsPlaceFrom(TextOf(place));
  if (place.first < 0 || again.path != place.path || again.first != place.first) std::abort();
  request.first = place.first;
  request.results = file.path();
  try {
    ReadAnalysisControls(properties);
    request.controls = ReadSolveControls(properties);
    if (fuzz::MakeSavedWork(input, file)) {
      PictureKind kind;
      if (told.is_packed) kind.format = mlt_image_yuv422;
      kind.full_range = told.is_full != 0;
      static const std::atomic<bool> stops = false;
      Steadier steadier(request, {kind}, stops);
      Draw(steadier, request.first + told.frame, kind);
    }
  } catch (const std::runtime_error&) {  // Error is one
  }
  mlt_properties_close(properties);
  return 0;
}
