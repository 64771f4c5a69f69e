#include "studio/wire/roots.h"

#include <algorithm>
#include <array>
#include <cctype>
#include <deque>
#include <filesystem>
#include <nlohmann/json.hpp>
#include <set>
#include <string_view>
#include <system_error>
#include <utility>

#include "host/media/clip_files.h"

namespace calmframe::studio {
namespace {

namespace fs = std::filesystem;

constexpr std::size_t kMostListed = 5000;
// Files, and folders below a root, that a name is looked for in: no longer than a person waits.
constexpr std::size_t kMostLooked = 50000;
constexpr int kDeepest = 8;
constexpr std::string_view kProject = ".calm";
// A name tells what a list offers; whatever is typed is tried.
constexpr std::array<std::string_view, 20> kClips = {
    ".mp4",  ".mov", ".mkv", ".avi", ".webm", ".m4v", ".mts", ".m2ts", ".ts",  ".mpg",
    ".mpeg", ".mxf", ".wmv", ".3gp", ".ogv",  ".flv", ".y4m", ".nut",  ".gif", ".dv"};

std::string EndingOf(const fs::path& path) {
  std::string ending = path.extension();
  for (char& letter : ending) {
    letter = static_cast<char>(std::tolower(static_cast<unsigned char>(letter)));
  }
  return ending;
}

}  // namespace

Roots::Roots(const std::vector<std::string>& folders) {
  for (const std::string& folder : folders) {
    std::error_code error;
    const fs::path canonical = fs::canonical(folder, error);
    if (error || !fs::is_directory(canonical, error)) {
      throw PathRefused(folder + ": is no folder");
    }
    folders_.push_back(canonical);
  }
}

bool Roots::Holds(const std::string& canonical) const {
  return std::any_of(folders_.begin(), folders_.end(), [&](const std::string& root) {
    return canonical == root || root == "/" ||
           (canonical.size() > root.size() && canonical.compare(0, root.size(), root) == 0 &&
            canonical[root.size()] == '/');
  });
}

std::string Roots::Existing(const std::string& path) const {
  // What is outside is told apart from what isn't there by nobody.
  const std::string refusal = path + ": isn't there, or outside of the folders that are open";
  std::error_code error;
  if (path.empty() || path[0] != '/' || path.find('\0') != std::string::npos) {
    throw PathRefused(refusal);
  }
  const fs::path canonical = fs::canonical(path, error);
  if (error || !Holds(canonical)) throw PathRefused(refusal);
  return canonical;
}

std::string Roots::ExistingClip(const std::string& path) const {
  if (path.find('\0') != std::string::npos || !media::IsSequence(path)) return Existing(path);
  const fs::path given(path);
  return fs::path(Existing(given.parent_path())) / given.filename();
}

std::string Roots::Find(const std::string& name) const {
  const std::string refusal = name + ": isn't in the folders that are open";
  if (name.empty() || name.find('/') != std::string::npos || name[0] == '.') {
    throw PathRefused(refusal);
  }
  std::set<std::string> found, seen;
  std::deque<std::pair<fs::path, int>> folders;
  for (const std::string& root : folders_) folders.emplace_back(root, 0);
  for (std::size_t looked = 0; !folders.empty() && looked < kMostLooked;) {
    const auto [folder, depth] = folders.front();
    folders.pop_front();
    if (!seen.insert(folder).second) continue;
    std::error_code error;
    for (fs::directory_iterator entry(folder, error), end; !error && entry != end;
         entry.increment(error)) {
      if (++looked > kMostLooked) break;
      const std::string is = entry->path().filename();
      if (is[0] == '.') continue;
      std::error_code ignored;
      if (entry->is_directory(ignored) && !entry->is_symlink(ignored)) {
        if (depth < kDeepest) folders.emplace_back(entry->path(), depth + 1);
      } else if (is == name) {
        const fs::path canonical = fs::canonical(entry->path(), ignored);
        if (!ignored && Holds(canonical)) found.insert(canonical);
      }
    }
  }
  if (found.empty()) throw PathRefused(refusal);
  if (found.size() > 1) {
    throw PathRefused(name + ": is there " + std::to_string(found.size()) +
                      " times; open the one that is meant by its path");
  }
  return *found.begin();
}

std::string Roots::ToWrite(const std::string& path) const {
  std::error_code error;
  const fs::path given(path);
  const fs::path name = given.filename();
  if (name.empty() || name == "." || name == "..") throw PathRefused(path + ": names no file");
  const fs::path place = fs::path(Existing(given.parent_path())) / name;
  if (fs::is_symlink(place, error)) return Existing(place);
  if (fs::exists(place, error) && !fs::is_regular_file(place, error)) {
    throw PathRefused(path + ": is no plain file");
  }
  return place;
}

nlohmann::json Roots::List(const std::string& path) const {
  const fs::path folder = path.empty() ? folders_.front() : Existing(path);
  nlohmann::json folders = nlohmann::json::array(), files = nlohmann::json::array();
  std::error_code error;
  std::vector<fs::directory_entry> entries;
  for (fs::directory_iterator entry(folder, error), end; !error && entry != end;
       entry.increment(error)) {
    if (entry->path().filename().string()[0] != '.') entries.push_back(*entry);
    if (entries.size() >= kMostListed) break;
  }
  if (error) throw PathRefused(folder.string() + ": cannot be read");
  std::sort(entries.begin(), entries.end());
  for (const fs::directory_entry& entry : entries) {
    const fs::path canonical = fs::canonical(entry.path(), error);
    if (error || !Holds(canonical)) continue;
    const std::string name = entry.path().filename();
    if (fs::is_directory(canonical, error)) {
      folders.push_back(name);
      continue;
    }
    const std::string ending = EndingOf(name);
    const bool is_project = ending == kProject;
    if (!is_project && std::find(kClips.begin(), kClips.end(), ending) == kClips.end()) continue;
    const auto bytes = fs::file_size(canonical, error);
    files.push_back({{"name", name}, {"bytes", error ? 0 : bytes}, {"project", is_project}});
  }
  nlohmann::json parent = nullptr;
  if (Holds(folder.parent_path())) parent = folder.parent_path().string();
  return {{"path", folder.string()},
          {"parent", std::move(parent)},
          {"folders", std::move(folders)},
          {"files", std::move(files)}};
}

}  // namespace calmframe::studio
