#pragma once

#include <filesystem>
#include <functional>
#include <string>

#include "fuzz/saved_work.h"
#include "fuzz/seeds.h"
#include "platform/hx/hx_controls.h"
#include "stabilizer/effect/src/state_format/format.h"
#include "tests/stabilizer/effect/state_format/samples.h"

namespace calmframe::fuzz {

inline SavedWork SampleWork() {
  // The samples' two frames are 7 and 8, of 24000 in 1001 seconds.
  return {.ticks_per_frame = HX_TICKS_PER_SECOND * 1001 / 24000,
          .value = 60,
          .control = HX_SMOOTHNESS.disk_id,
          .width = 64,
          .height = 36,
          .length = 9,
          .end_frame = 9};
}

inline std::string WorkInput(const SavedWork& work, const std::string& choice,
                             const std::string& sql, const std::string& instance) {
  return static_cast<char>(WorkKind::told) + BytesOf(work) + choice + '\0' + sql + '\0' + instance;
}

// As a choice was saved.
inline std::string ChoiceText() {
  std::string text = R"({"still":"auto","most_zoom":1.5,"zoom_speed":5.0,"given":{"20":50.0},)"
                     R"("candidates":[{"name":"as set","changes":{},"taken":true,"bends":true)"
                     R"(,"window":"follow")";
  for (const char* const figure :
       {"width_weight", "cost", "width_kept", "most_zoom", "most_black", "shake_before",
        "shake_after", "worst_shake", "worst_at", "tracks_before", "tracks_after", "wobble_before",
        "wobble_after"}) {
    text.append(",\"").append(figure).append("\":1.5");
  }
  return text + "}]}";
}

// add(name, input) for saved work of each sample, and for files whose tables are others.
inline void AddSavedWork(const std::function<void(const std::string&, const std::string&)>& add) {
  for (const auto& file : std::filesystem::directory_iterator(CALMFRAME_SAMPLES)) {
    const std::string name = file.path().filename();
    const kelp::effect::Sample sample = kelp::effect::ReadSample(name);
    const bool raw = sample.version >= kelp::effect::state_format::kRawPayloads;
    const std::string& payload = raw ? sample.plain : sample.deflated;
    const kelp::effect::InstanceHandleHeader header{sample.version, 1, raw, nullptr,
                                                    payload.size()};
    add(name, WorkInput(SampleWork(), "", "", host::Packed(fuzz::BytesOf(header) + payload)));
  }
  SavedWork two = SampleWork();
  two.shots = 1;
  two.end_frame = 18;
  add("two_shots", WorkInput(two, ChoiceText(), "", ""));
  int count = 0;
  for (const char* const sql :
       {"DROP TABLE frames; CREATE VIEW frames AS WITH RECURSIVE n (bytes) AS (SELECT 1 UNION ALL "
        "SELECT bytes + 1 FROM n) SELECT count(*) AS bytes FROM n",
        "ALTER TABLE shot ADD COLUMN more AS (zeroblob(length))",
        "UPDATE setting SET value = x'00' WHERE key = 'width'", "UPDATE shot SET length = 1e300",
        "DELETE FROM shot", "PRAGMA user_version = 4", "INSERT INTO parameter VALUES (1, 7, 'x')",
        "CREATE TABLE analysis (start_frame, number, bytes); DROP TABLE setting",
        "PRAGMA journal_mode = WAL"}) {
    add("sql_" + std::to_string(count++), WorkInput(SampleWork(), "", sql, ""));
  }
}

}  // namespace calmframe::fuzz
