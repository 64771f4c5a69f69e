#pragma once

#include <cstdint>
#include <vector>

#include "analysis/src/job.h"
#include "tracking/frame_images.h"
#include "tracking/frame_source.h"

namespace kelp::analysis {

// Where the rows of a run lie on the clip.
struct RunFrames {
  std::int64_t first_frame = 0;  // absolute index of row 0; fields count as frames
  std::int64_t frame_count = 0;  // 0 where the clip has no length
  RationalTime duration;         // of a row
};

RunFrames GetRunFrames(const JobInput& input);

// The frames of a job as the tracker wants them. Colour, luma and mask are fetched apart, each one
// frame ahead; the host renders a frame that several ask for once. Throws TerminateException from
// the first fetch after the job has left Running, and
// EndOfRun from a fetch at or behind the job's end row.
class JobFrameSource final : public marrow::tracking::FrameSource {
 public:
  // The job outlives it. Orders the first two frames from that row on.
  explicit JobFrameSource(Job& job, std::int64_t first_row = 0);
  // Drops what ReleaseFrames was not asked to release.
  ~JobFrameSource() override;

  std::size_t width() const override { return static_cast<std::size_t>(mask_.width); }
  std::size_t height() const override { return static_cast<std::size_t>(mask_.height); }
  std::size_t frame_count() const override { return static_cast<std::size_t>(run_.frame_count); }
  void LoadLuma(std::size_t frame, std::uint8_t* destination) override;
  void LoadMask(std::size_t frame, std::uint8_t* destination) override;
  void LoadColor(std::size_t frame, float* destination) override;
  marrow::tracking::ImagePyramid::first_level first_level() const override {
    return marrow::tracking::ImagePyramid::first_level::bytes;
  }
  void LoadColorPyramid(std::size_t frame, marrow::tracking::ImagePyramid& pyramid,
                        std::vector<float>& scratch) override;

  // Asks for that frame alone.
  void LookBack(std::size_t frame, marrow::tracking::ImagePyramid& pyramid,
                std::vector<float>& scratch) override;

  // Releases the frames that are still held: colour, luma, mask.
  void ReleaseFrames();

 private:
  struct Reader {
    std::int32_t width = 0, height = 0;
    std::int64_t last_frame = -1;  // not released yet; -1 is none
  };

  void Prepare(Reader& reader, std::int64_t first_row);
  marrow::tracking::ArgbFrame Fetch(const Reader& reader, const RationalTime& time);
  template <class Convert>
  void Load(Reader& reader, std::size_t frame, const Convert& convert);
  void Release(Reader& reader);
  RationalTime TimeOf(std::int64_t frame) const;
  std::int32_t FieldOf(std::int64_t frame) const;

  Job& job_;
  const RunFrames run_;
  Reader mask_, luma_, color_;
  marrow::tracking::FrameImages images_;
};

}  // namespace kelp::analysis
