#include "host/batch/clip_search.h"

#include <sys/stat.h>

#include <algorithm>
#include <cctype>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <map>
#include <set>
#include <system_error>

#include "host/batch/record.h"
#include "host/batch/task_folder.h"
#include "host/media/file_pattern.h"

namespace calmframe::batch {
namespace {

namespace fs = std::filesystem;

// What cameras and programs write; a file of another kind can be named by itself.
bool IsClipExtension(std::string extension) {
  static const std::set<std::string> known = {
      ".3g2", ".3gp",  ".asf", ".avi", ".dv",  ".f4v", ".flv",  ".gif",  ".h264", ".hevc",
      ".m2t", ".m2ts", ".m2v", ".m4v", ".mkv", ".mov", ".mp4",  ".mpeg", ".mpg",  ".mts",
      ".mxf", ".nut",  ".ogv", ".qt",  ".ts",  ".vob", ".webm", ".wmv",  ".y4m"};
  std::transform(extension.begin(), extension.end(), extension.begin(),
                 [](unsigned char c) { return static_cast<char>(std::tolower(c)); });
  return known.count(extension) > 0;
}

std::vector<std::string> LinesOf(std::istream& list) {
  const std::string text{std::istreambuf_iterator<char>(list), {}};
  const char end = text.find('\0') == std::string::npos ? '\n' : '\0';
  std::vector<std::string> lines;
  for (std::size_t at = 0; at < text.size();) {
    const std::size_t stop = std::min(text.find(end, at), text.size());
    std::string line = text.substr(at, stop - at);
    if (end == '\n' && !line.empty() && line.back() == '\r') line.pop_back();
    if (!line.empty()) lines.push_back(std::move(line));
    at = stop + 1;
  }
  return lines;
}

class Search {
 public:
  explicit Search(bool recursive) : recursive_(recursive) {}

  void Take(const std::string& word) {
    std::error_code error;
    const fs::file_status status = fs::status(word, error);
    if (fs::is_directory(status)) return TakeFolder(word);
    if (fs::exists(status)) return Add(word, "");
    if (word.starts_with('@')) return TakeList(word.substr(1));
    if (word.find_first_of("*?[") != std::string::npos) return TakePattern(word);
    Refuse(word, std::make_error_code(std::errc::no_such_file_or_directory).message());
  }

  FoundClips found;

 private:
  void Refuse(const std::string& name, const std::string& trouble) {
    found.clips.push_back({name, "", trouble});
  }

  void Add(const std::string& name, const std::string& below) {
    std::error_code error;
    const fs::path place = fs::canonical(name, error);
    if (error) return Refuse(name, error.message());
    if (!fs::is_regular_file(place, error)) return Refuse(name, "is not a file on disk");
    if (!taken_.insert(place.string()).second) return;
    if (IsOutput(place)) {
      ++found.outputs;
    } else {
      found.clips.push_back({name, below, ""});
    }
  }

  void TakeFolder(const std::string& folder) {
    const std::size_t before = found.clips.size() + found.outputs + taken_.size();
    Walk(folder, folder);
    if (found.clips.size() + found.outputs + taken_.size() == before) {
      Refuse(folder, recursive_ ? "has no clips in it"
                                : "has no clips in it (--recursive looks into its folders too)");
    }
  }

  void Walk(const fs::path& folder, const fs::path& from) {
    std::vector<fs::path> entries;
    std::error_code error;
    for (fs::directory_iterator entry(folder, error), end; !error && entry != end;
         entry.increment(error)) {
      if (!entry->path().filename().native().starts_with('.')) entries.push_back(entry->path());
    }
    if (error) Refuse(folder.string(), error.message());
    std::sort(entries.begin(), entries.end());
    for (const fs::path& entry : entries) {
      std::error_code ignored;
      // A link to a folder may lead in a circle.
      if (fs::is_directory(fs::symlink_status(entry, ignored))) {
        if (recursive_) Walk(entry, from);
      } else if (IsClipExtension(entry.extension().string())) {
        const fs::path below = folder.lexically_relative(from);
        Add(entry.string(), below == "." ? "" : below.string());
      }
    }
  }

  void TakeList(const std::string& path) {
    std::ifstream list(path, std::ios::binary);
    if (!list) return Refuse("@" + path, std::strerror(errno));
    // What a list names is no list again, which could be in a circle.
    for (const std::string& line : LinesOf(list)) Take(line.starts_with('@') ? "./" + line : line);
  }

  void TakePattern(const std::string& pattern) {
    const std::vector<std::string> matches = media::FilesNamedLike(pattern);
    if (matches.empty()) return Refuse(pattern, "no file has such a name");
    for (const std::string& match : matches) {
      std::error_code error;
      if (fs::is_directory(match, error)) {
        TakeFolder(match);
      } else {
        Add(match, "");
      }
    }
  }

  // By the records of a batch whose folder is one of those that the file lies in. In folders that
  // all may write into anybody could keep records: those count that are of whoever owns the file.
  bool IsOutput(const fs::path& place) {
    struct stat file = {}, records = {};
    stat(place.c_str(), &file);
    for (fs::path folder = place.parent_path();; folder = folder.parent_path()) {
      const auto [known, is_new] = is_batch_.try_emplace(folder.string(), false);
      std::error_code error;
      if (is_new) known->second = fs::is_directory(folder / kRecordsFolder, error);
      if (known->second && stat((folder / kRecordsFolder).c_str(), &records) == 0 &&
          records.st_uid == file.st_uid) {
        const TaskFolder task(folder.string(), place.lexically_relative(folder).string());
        const std::optional<Record> record = ReadRecord(task.record());
        if (record && record->output_identity) return true;
      }
      if (folder == folder.parent_path()) return false;
    }
  }

  const bool recursive_;
  std::set<std::string> taken_;
  std::map<std::string, bool> is_batch_;
};

}  // namespace

FoundClips FindClips(const std::vector<std::string>& words, bool recursive) {
  Search search(recursive);
  for (const std::string& word : words) search.Take(word);
  return std::move(search.found);
}

}  // namespace calmframe::batch
