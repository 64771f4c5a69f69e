#pragma once

#include <string>

#include "host/batch/clip_names.h"

namespace calmframe::batch {

// Below a batch's folder: what it knows of its clips.
constexpr char kRecordsFolder[] = ".calmframe";

// The files of one clip's task in there.
class TaskFolder {
 public:
  // `output`: to the batch's folder.
  TaskFolder(const std::string& batch_folder, const std::string& output)
      : path_(batch_folder + "/" + kRecordsFolder + "/" + TaskId(output)) {}

  const std::string& path() const { return path_; }
  std::string record() const { return path_ + "/record.json"; }
  std::string lock() const { return path_ + "/lock"; }
  // While it runs: an object with "share", 0 to 1, "stage", "machine" and "pid".
  std::string progress() const { return path_ + "/progress.json"; }
  // Pictures of before and after, as data URLs.
  std::string pictures() const { return path_ + "/pictures.json"; }
  // Where the output is written, of that extension, until the clip is known to be still the one
  // that it was. What it is called elsewhere may mean a sequence of pictures.
  std::string output(const std::string& extension) const { return path_ + "/output" + extension; }

 private:
  const std::string path_;
};

}  // namespace calmframe::batch
