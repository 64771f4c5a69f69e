#include "analysis/src/job_frame_source.h"

#include <algorithm>

namespace kelp::analysis {
namespace {

constexpr std::int32_t kRequestField = 0;  // the time alone names a field's frame

}  // namespace

RunFrames GetRunFrames(const JobInput& input) {
  RunFrames run;
  run.duration = RowDuration(input);
  run.first_frame = FloorSteps(input.StartTime, run.duration);
  const std::int64_t end = CeilSteps(input.StartTime + input.Duration, run.duration);
  run.frame_count = std::max<std::int64_t>(end - run.first_frame, 0);
  return run;
}

JobFrameSource::JobFrameSource(Job& job, std::int64_t first_row)
    : job_(job), run_(GetRunFrames(job.input())) {
  Prepare(mask_, first_row);
  Prepare(luma_, first_row);
  Prepare(color_, first_row);
}

JobFrameSource::~JobFrameSource() {
  try {
    ReleaseFrames();
  } catch (...) {  // the job keeps its failure
  }
}

void JobFrameSource::Prepare(Reader& reader, std::int64_t first_row) {
  job_.GetFrameSize(&reader.width, &reader.height);
  for (std::int64_t f = first_row; f < std::min(first_row + 2, run_.frame_count); ++f) {
    job_.RequestFrame(TimeOf(f), kRequestField);
  }
}

RationalTime JobFrameSource::TimeOf(std::int64_t frame) const {
  return job_.input().StartTime + run_.duration * frame;
}

std::int32_t JobFrameSource::FieldOf(std::int64_t frame) const {
  const std::int32_t field = job_.input().FieldType;
  if (!CountsFields(job_.input()) || (run_.first_frame + frame) % 2 == 0) return field;
  return 3 - field;
}

marrow::tracking::ArgbFrame JobFrameSource::Fetch(const Reader& reader, const RationalTime& time) {
  std::int32_t row_bytes = 0;
  bool flipped = false;
  std::uint32_t format = 0;
  const std::uint8_t* pixels = nullptr;
  job_.GetFrame(time, kRequestField, &row_bytes, &flipped, &format, &pixels);
  marrow::tracking::ArgbFrame argb{pixels, row_bytes, width(), height()};
  if (flipped) {
    argb.top_row = pixels + static_cast<std::ptrdiff_t>(row_bytes) * (reader.height - 1);
    argb.row_bytes = -argb.row_bytes;
  }
  return argb;
}

void JobFrameSource::LookBack(std::size_t frame, marrow::tracking::ImagePyramid& pyramid,
                              std::vector<float>& scratch) {
  if (job_.GetStatus().state >= JobState::Cancelled) throw TerminateException();
  const RationalTime time = TimeOf(static_cast<std::int64_t>(frame));
  job_.RequestFrame(time, kRequestField);
  images_.ColorPyramid(frame, Fetch(color_, time), pyramid, scratch);
  job_.ReleaseFrame(time, kRequestField);
}

template <class Convert>
void JobFrameSource::Load(Reader& reader, std::size_t frame_index, const Convert& convert) {
  if (job_.GetStatus().state >= JobState::Cancelled) throw TerminateException();
  const auto frame = static_cast<std::int64_t>(frame_index);
  if (frame >= job_.end_row()) throw EndOfRun();
  const RationalTime time = TimeOf(frame);
  if (reader.last_frame != frame) Release(reader);

  const marrow::tracking::ArgbFrame argb = Fetch(reader, time);
  reader.last_frame = frame;
  convert(argb);
  job_.SetTime(time);
  job_.SetField(FieldOf(frame));
  if (frame + 1 < run_.frame_count) job_.RequestFrame(TimeOf(frame + 1), kRequestField);
}

void JobFrameSource::Release(Reader& reader) {
  if (reader.last_frame < 0) return;
  const RationalTime time = TimeOf(reader.last_frame);
  reader.last_frame = -1;
  job_.ReleaseFrame(time, kRequestField);
}

void JobFrameSource::ReleaseFrames() {
  Release(color_);
  Release(luma_);
  Release(mask_);
}

void JobFrameSource::LoadLuma(std::size_t frame, std::uint8_t* destination) {
  Load(luma_, frame, [&](const auto& argb) { images_.Luma(frame, argb, destination); });
}

void JobFrameSource::LoadMask(std::size_t frame, std::uint8_t* destination) {
  Load(mask_, frame, [&](const auto& argb) { images_.Mask(frame, argb, destination); });
}

void JobFrameSource::LoadColor(std::size_t frame, float* destination) {
  Load(color_, frame, [&](const auto& argb) { ColorFromArgb(argb, destination); });
}

void JobFrameSource::LoadColorPyramid(std::size_t frame, marrow::tracking::ImagePyramid& pyramid,
                                      std::vector<float>& scratch) {
  Load(color_, frame,
       [&](const auto& argb) { images_.ColorPyramid(frame, argb, pyramid, scratch); });
}

}  // namespace kelp::analysis
