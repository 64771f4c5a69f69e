#pragma once

#include <string>
#include <vector>

namespace calmframe::media {

// Pictures that get their names only when all of them are whole: written into a folder of their own
// beside their place, which is removed at the end.
class OutputPictures {
 public:
  // pattern: with one %d or %04d in its last part, which counts from 1 to `count`. Throws Failure
  // (output): one of them exists and overwrite is off, or is one of `sources`; their folder can't
  // be written. A last folder that isn't there is made if `makes_folder`.
  OutputPictures(const std::string& pattern, const std::vector<std::string>& sources,
                 std::size_t count, bool overwrite, bool makes_folder);
  ~OutputPictures();
  OutputPictures(const OutputPictures&) = delete;
  OutputPictures& operator=(const OutputPictures&) = delete;

  // The pattern that they are written by.
  const std::string& temporary() const { return temporary_; }
  // Gives them their names. Throws Failure (output).
  void Commit();

 private:
  const std::string pattern_;
  const std::size_t count_;
  std::string folder_, temporary_;
  bool made_folder_ = false;
};

}  // namespace calmframe::media
