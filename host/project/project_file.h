#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#include "host/effects/effect.h"
#include "platform/tessel/guid.h"

namespace calmframe::host {

// The saved work of one shot: the layer that shows it, the effect on it, and what the effect
// remembers.
struct SavedShot {
  std::int32_t start_frame = 0, length = 0;  // of the layer; see LayerState
  SavedEffect effect;
  // JSON: what was chosen for the shot besides the controls, and what tracks a person deleted
  // beside those of a group; empty: neither. See stabilize's Choice and LeftOut.
  std::string choice;
};

// Saved work: a clip, and what was made of its shots.
struct Project {
  std::string clip_path;               // absolute, when the project was saved
  std::string clip_relative;           // to the project's folder; empty where there is no such way
  tessel::utility::Guid clip_content;  // ContentOf
  // What media::ClipReader found in it, that the next opening needs no search; may be empty, or
  // nothing that a reader believes.
  std::vector<std::uint8_t> clip_frames;
  std::int32_t width = 0, height = 0;  // of the clip's frames
  HX_Ratio pixel_aspect{1, 1};         // width : height of one of their pixels

  std::int64_t ticks_per_frame = 0;  // of the layers
  std::int32_t field_type = 0;

  // Where the stretch that is worked ends, in the clip's frames: behind the last shot, or further
  // on where a run was stopped before it had come there.
  std::int32_t end_frame = 0;

  // One behind the other, at least one: of a clip without cuts it is the whole of what is worked.
  std::vector<SavedShot> shots = std::vector<SavedShot>(1);
};

// One line that names the file and the cause.
class ProjectFailure : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// Of one flattened instance, and of the clip's frames; SQLite holds not much more in one row.
constexpr std::size_t kMaximumInstanceBytes = std::size_t{900} << 20;

// The project's paths are made from clip_path and the project's own place. Whatever ends the
// program or the machine meanwhile, the file is the last project or this one, whole. Several
// programs may save to one file; each waits for the other. Throws ProjectFailure; then the file is
// as it was. An instance of more than `most` bytes is refused.
void SaveProject(const std::string& path, const Project& project,
                 std::size_t most = kMaximumInstanceBytes);

// Saves one project to one file again and again while it is worked. What a save costs doesn't grow
// with the shots that are as they were.
class ProjectSaver {
 public:
  explicit ProjectSaver(std::string path, std::size_t most = kMaximumInstanceBytes)
      : path_(std::move(path)), most_(most) {}
  // As SaveProject. Of the shots that it has saved before only `changed`, counted from 0, is looked
  // at again; where it hasn't, or another one has saved to the file since, all are.
  void Save(const Project& project, std::size_t changed);

 private:
  // Checksums of what stands in the file.
  struct Standing {
    std::vector<tessel::utility::Guid> shots;
    tessel::utility::Guid frames, whole;
  };

  const std::string path_;
  const std::size_t most_;
  std::optional<Standing> standing_;
};

// A file of saved work that has none yet. Throws ProjectFailure.
void CreateWithoutWork(const std::string& path);

// Throws ProjectFailure: not there or not readable, no project, damaged, of a newer version, too
// large, which is found before it is read.
Project LoadProject(const std::string& path, std::size_t most = kMaximumInstanceBytes);

// Where the project's clip lies now: at its place relative to the project, at its old place, or
// beside the project. Of what `admits` refuses nothing is read, as if it were not there. Throws
// ProjectFailure when it is nowhere, or is another clip by now.
std::string FindClip(const std::string& path, const Project& project,
                     const std::function<bool(const std::string&)>& admits = {});

}  // namespace calmframe::host
