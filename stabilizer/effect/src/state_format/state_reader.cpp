#include "stabilizer/effect/src/state_format/state_reader.h"

#include <algorithm>
#include <boost/make_shared.hpp>
#include <limits>

#include "platform/tessel/debug.h"
#include "platform/tessel/serialization.h"
#include "stabilizer/effect/src/state_format/format.h"
#include "stabilizer/effect/src/state_format/job_json.h"
#include "stabilizer/effect/src/state_format/solve_sections.h"
#include "stabilizer/effect/src/state_format/stored_tracks.h"

namespace kelp::effect {

using namespace state_format;
using marrow::stabilization::CPWarper;
using tessel::filesupport::InputByteStream;
using tessel::filesupport::StreamError;

namespace {

constexpr char kTraceChannel[] = "StateBinaryConverter";
constexpr int kTraceLevel = 5;
// Units of a text: a path and some numbers. A parsed text takes many times its own size.
constexpr std::size_t kLongestText = 1 << 16;

class StateBinaryConverter {
 public:
  StateBinaryConverter(InputByteStream& in, std::uint32_t version, PayloadForm form,
                       const SourceShape& present)
      : in_(in), version_(version), form_(form), present_(present) {}

  SavedState Read() {
    ReadAnalysis();
    if (Has(kSolveResults)) ReadSolve();
    ReadTracks();
    if (Has(kCropWindow)) {
      Expect(Marker::Crop);
      bool has_crop = false;
      in_ >> has_crop;
      if (has_crop) solve_.crop = ReadCrop(in_, frames());
    }
    Expect(Marker::Pup);
    SettleFlags();
    state_.result = boost::make_shared<analysis::AnalysisResult>(std::move(result_));
    state_.solve_result = boost::make_shared<SolveResult>(std::move(solve_));
    return std::move(state_);
  }

 private:
  bool Has(std::uint32_t since) const { return version_ >= since; }
  std::int32_t frames() const { return result_.all_features.frame_count; }

  void Expect(Marker marker) {
    if (!Has(kMarkersAndSize)) return;
    std::int32_t found = 0;
    in_ >> found;
    if (found != static_cast<std::int32_t>(marker)) throw StreamError("a section's marker is none");
  }

  std::u16string ReadText() {
    std::u16string text;
    in_ >> text;
    if (text.size() > kLongestText) throw StreamError("text too long");
    return text;
  }

  void ReadSourceSize() {
    SourceShape& source = state_.source;
    source.width = present_.width;
    source.height = present_.height;
    if (!Has(kMarkersAndSize)) return;
    in_ >> source.width >> source.height >> source.par_num >> source.par_den;
  }

  void ReadCounts() {
    auto& table = result_.all_features;
    std::uint64_t slots = 0;
    in_ >> table.frame_count >> slots;
    constexpr auto kMost = std::uint64_t{std::numeric_limits<std::int32_t>::max()};
    if (table.frame_count < 0 || slots > kMost || (table.frame_count > 0 && slots == 0)) {
      throw StreamError("track table's counts are none");
    }
    table.feature_count = static_cast<std::int32_t>(slots);
    const SourceShape& source = state_.source;
    if (frames() > 0 &&
        (source.width < 1 || source.height < 1 || source.par_num < 1 || source.par_den < 1)) {
      throw StreamError("source without a size");
    }
  }

  void CheckSourceSize() {
    if (present_.one_by_one()) return;
    if (state_.source.SameSize(present_)) return;
    if (frames() == 0) {  // nothing depends on it yet
      state_.source.width = present_.width;
      state_.source.height = present_.height;
      return;
    }
    StateRefused refused(StateRefused::Reason::SourceSize, "of a source of another size");
    refused.stored = state_.source;
    throw refused;
  }

  void ReadAnalysis() {
    Expect(Marker::Stab);
    ReadSourceSize();
    ReadCounts();
    CheckSourceSize();
    result_.job_input = ParseJobInput(ReadText());
    if (Has(kTrackerIdentity)) in_ >> result_.tracker_identity;
    if (Has(kAnalysisTick)) in_ >> state_.analysis_tick;
    Expect(Marker::Guid);
    if (Has(kSourceIdentity)) in_ >> result_.source_identity;
    if (Has(kPendingFlag)) in_ >> state_.analysis_pending;
    if (Has(kNeedsSolveFlag)) in_ >> state_.needs_solve;
    if (Has(kDetailedFlag)) in_ >> state_.detailed;
    bool has_job = false;
    in_ >> has_job;
    if (has_job) state_.job = ParseJob(ReadText());
  }

  void ReadSolve() {
    Expect(Marker::Solv);
    std::int32_t phase = 0;
    in_ >> phase >> solve_.solve_hash >> solve_.crop_hash;
    state_.phase = static_cast<SolvePhase>(phase);
    switch (state_.phase) {
      case SolvePhase::None:
      case SolvePhase::Solved:
      case SolvePhase::Failed:
      case SolvePhase::AnalysisFailed:
        break;
      default:
        throw StreamError("solve's phase is none");
    }
    Expect(Marker::Mesh);
    if (state_.phase == SolvePhase::Solved) {
      if (frames() == 0) throw StreamError("results without frames");
      ReadResults();
      return;
    }
    PassMapMarker();
    std::int32_t zeros[2];
    in_ >> zeros[0] >> zeros[1];
    if (zeros[0] != 0 || zeros[1] != 0) throw StreamError("a map without warps");
  }

  // The marker came with the map, ahead of the others.
  void PassMapMarker() {
    if (!Has(kFrameMap)) return;
    if (Has(kMarkersAndSize)) return Expect(Marker::MtoN);
    std::int32_t marker = 0;
    in_ >> marker;
  }

  // Of the frames in square pixels.
  boost::shared_ptr<CPWarper> MakeWarper() const {
    const SourceShape& source = present_.one_by_one() ? state_.source : present_;
    constexpr auto kWidest = std::uint32_t{std::numeric_limits<std::int32_t>::max()};
    return boost::make_shared<CPWarper>(
        frames(), static_cast<std::int32_t>(std::min(source.square_width(), kWidest)),
        static_cast<std::int32_t>(source.square_height()));
  }

  void ReadResults() {
    const GridSize grid = ReadGridSize(in_);
    const boost::shared_ptr<CPWarper> warper = MakeWarper();
    if (grid.cols != warper->gridCols() || grid.rows != warper->gridRows()) {
      throw StateRefused(StateRefused::Reason::Grid, "warps over another grid");
    }
    ReadWarps(in_, form_, *warper);
    if (Has(kFrameMap)) {
      PassMapMarker();
      warper->setFrameMap(ReadFrameMap(in_, frames()));
    }
    solve_.warper = warper;
    if (!Has(kCropWindow)) {
      // Wraps around: nothing but a difference is wanted.
      solve_.crop_hash =
          static_cast<std::int64_t>(static_cast<std::uint64_t>(solve_.crop_hash) + 1);
    }
  }

  void ReadTracks() {
    Expect(Marker::StrF);
    in_ >> result_.all_features.first_frame;
    ReadTrackTable(in_, Has(kFixedPointPositions), form_, result_.all_features);
  }

  void SettleFlags() {
    if (state_.phase == SolvePhase::Solved) {
      state_.needs_solve = false;
      tessel::debug::Trace(kTraceChannel, kTraceLevel,
                           "solveCompleteB = " + std::to_string(state_.needs_solve));
    } else if (state_.phase != SolvePhase::Failed) {
      state_.needs_solve = true;
    }
  }

  InputByteStream& in_;
  const std::uint32_t version_;
  const PayloadForm form_;
  const SourceShape present_;
  SavedState state_;
  analysis::AnalysisResult result_;
  SolveResult solve_;
};

}  // namespace

SavedState ReadState(const void* payload, std::size_t size, std::uint32_t version, std::uint8_t raw,
                     const SourceShape& present) try {
  tessel::filesupport::IStringByteStream bytes(payload, size);
  const PayloadForm form = FormOf(version, raw);
  if (form != PayloadForm::deflated) {
    SavedState state = StateBinaryConverter(bytes, version, form, present).Read();
    if (bytes.MaxBytesLeft() != 0) throw StreamError("more data than was expected");
    return state;
  }
  tessel::filesupport::IZipByteStream inflated(bytes);
  SavedState state = StateBinaryConverter(inflated, version, form, present).Read();
  inflated.Finish();
  return state;
} catch (const StreamError& error) {
  throw StateRefused(StateRefused::Reason::Damaged, error.what());
} catch (const tessel::serialization::Error& error) {
  throw StateRefused(StateRefused::Reason::Damaged, error.what());
}

}  // namespace kelp::effect
