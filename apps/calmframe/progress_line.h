#pragma once

#include <chrono>
#include <cstddef>
#include <nlohmann/json_fwd.hpp>
#include <set>
#include <string>
#include <utility>
#include <vector>

#include "host/stabilize/watcher.h"

namespace calmframe {

using host::Progress;

// Shows progress on the standard error: on a terminal one line that is written over, elsewhere a
// line at the start and the end of each stage; or, for programs, one JSON object a line.
class ProgressLine final : public host::Watcher {
 public:
  // json_end: as JSON, but no progress and no notes.
  enum class Form { none, line, json, json_end };
  explicit ProgressLine(Form form);
  ~ProgressLine() override;
  ProgressLine(const ProgressLine&) = delete;
  ProgressLine& operator=(const ProgressLine&) = delete;

  // What is told from now on is of this shot of a film, counted from 1; 0: of all.
  void OfShot(std::size_t number) { shot_ = number; }

  void Show(const Progress& progress) override;
  // In every form; said once, however often it comes.
  void Warn(const std::string& line) override;
  // See InterruptAsked.
  bool Stops() override;
  // One line about how things went.
  void Note(const std::string& line);
  // One of several things that came out, in its line or for programs its object; without progress
  // the line only if `matters`.
  void Item(const std::string& line, const nlohmann::ordered_json& object, bool matters);
  // What came out of it all: the line, or for programs the object, both with the seconds that each
  // stage took.
  void End(const std::string& line, nlohmann::ordered_json object);

 private:
  void Write(const std::string& text, bool last);
  void Tell(const char* key, const std::string& line);

  std::string Prefix() const;

  const Form form_;
  const bool terminal_;
  std::size_t shot_ = 0;
  std::string stage_;
  std::chrono::steady_clock::time_point stage_begin_;
  std::chrono::steady_clock::time_point last_shown_;
  bool line_open_ = false;
  std::set<std::string> warned_;
  std::vector<std::pair<std::string, double>> seconds_;  // of the stages that ended, in their order
};

// An object as a line for programs. A file's name may be no UTF-8; then what isn't is replaced.
std::string JsonLine(const nlohmann::ordered_json& json);

// One line of a stage, without a newline: "rendering   42 %  126/300 frames  18.3 frames/s  0:09
// left". What the effect says takes the place of the numbers that it tells.
std::string ProgressText(const Progress& progress, double elapsed_seconds);
// The same as a JSON object: "shot" of a film's, "stage", "elapsed" in seconds, "ended" at its end,
// and what is known of "share" (0 to 1), "done", "total", "unit", "says".
std::string ProgressJson(const Progress& progress, double elapsed_seconds, std::size_t shot = 0);

// From now on the first Ctrl-C (or SIGTERM, or the terminal's end) asks the running stage to end; a
// second one ends the program at once.
void CatchInterrupts();
bool InterruptAsked();

}  // namespace calmframe
