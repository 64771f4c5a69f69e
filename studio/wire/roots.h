#pragma once

#include <nlohmann/json_fwd.hpp>
#include <stdexcept>
#include <string>
#include <vector>

namespace calmframe::studio {

// A path that may not be used, or isn't there; one line.
class PathRefused : public std::runtime_error {
 public:
  using std::runtime_error::runtime_error;
};

// The folders that a person opened to the studio, and nothing outside of them, whatever links say.
class Roots {
 public:
  // Throws PathRefused for what is no folder.
  explicit Roots(const std::vector<std::string>& folders);

  const std::vector<std::string>& folders() const { return folders_; }

  // What is there, links followed. Throws PathRefused.
  std::string Existing(const std::string& path) const;
  // The same of a clip, which may be pictures whose names have a number: then their folder is
  // there. Throws PathRefused.
  std::string ExistingClip(const std::string& path) const;
  // The only file of that name in the folders and those below them, links to folders not followed.
  // Throws PathRefused.
  std::string Find(const std::string& name) const;
  // A file to be written, in a folder that is there. Throws PathRefused.
  std::string ToWrite(const std::string& path) const;
  // {"path", "parent" (null above a root), "folders": [names], "files": [{"name", "bytes",
  // "project"}]}, of names that don't begin with a dot: folders, and files that may be clips or are
  // saved work. Without a path the first root. Throws PathRefused.
  nlohmann::json List(const std::string& path) const;

 private:
  bool Holds(const std::string& canonical) const;

  std::vector<std::string> folders_;  // canonical
};

}  // namespace calmframe::studio
