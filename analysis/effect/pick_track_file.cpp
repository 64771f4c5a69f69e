#include "analysis/effect/pick_track_file.h"

#include "analysis/src/track_file.h"
#include "platform/tessel/debug.h"
#include "platform/tesselui/save_dialog.h"

namespace kelp::analysis {

void PickFileAndSaveTracks(const AnalysisState* state) {
  const auto path = tesselui::SaveAs({"TRK Files (*.trk)", "trk", "trk", 4});
  if (!path) return;
  if (state == nullptr) {
    tessel::debug::ReportAssertion("AnalysisUtils", "kelp::analysis::PickFileAndSaveTracks",
                                   "state or analysis NULL, try re-analyzing first");
    return;
  }
  const marrow::tracking::AllFeatures& table = state->table();
  const auto cells = marrow::tracking::CellsOf(table);
  WriteTrackFile(*path, cells->data(), cells->size(), 0, table.frame_count,
                 static_cast<std::uint32_t>(table.feature_count));
}

}  // namespace kelp::analysis
