#pragma once

#include <boost/function.hpp>
#include <chrono>
#include <cstdint>
#include <string>

// Debug options, the solve's log, trace channels and timing entries. Everything here may be called
// from any thread.
namespace tessel::debug {

// Options by name, off or 0 unless set. Besides Set, the environment sets them at first use:
// CALMFRAME_DEBUG="ShowExperimentalEffectParameters=1,Trace.Subspace Stabilizer=5" (an entry
// without "=" means 1).
class DebugDatabase {
 public:
  static bool GetBool(const std::string& name, bool unless_set = false);
  static void Set(const std::string& name, int value);
};

// Where text of the log and the trace goes; stderr at first. An empty function restores that.
void SetSink(boost::function<void(const std::string&)> sink);

// The solve's printf-style log: written only when the option "ShowExperimentalEffectParameters"
// holds. A line ends with its own newline; several calls may make one line.
bool LogEnabled();
#if defined(__GNUC__)
__attribute__((format(printf, 1, 2)))
#endif
void Log(const char* format, ...);

// A channel is enabled at a level when the option "Trace.<channel>" is at least that level.
bool TraceEnabled(const std::string& channel, int level);
// Moves whenever TraceEnabled may answer otherwise than before. One load.
std::uint64_t TraceChangeCount();
// Writes "<thread id> <channel> <level> text" and a newline if the channel is enabled at the level.
void Trace(const std::string& channel, int level, const std::string& text);

// What should never happen, and has: always written, "<file>: <function>: <text>" and a newline.
void ReportAssertion(const std::string& file, const std::string& function, const std::string& text);

// Traces "Begin - <text>" at construction and "End - <text> [<elapsed> elapsed]" at destruction.
class TimingEntry {
 public:
  TimingEntry(const std::string& channel, int level, const std::string& text);
  ~TimingEntry();
  TimingEntry(const TimingEntry&) = delete;
  TimingEntry& operator=(const TimingEntry&) = delete;

 private:
  const bool enabled_;
  const std::string channel_;
  const int level_;
  const std::string text_;
  std::chrono::steady_clock::time_point begin_;
};

}  // namespace tessel::debug
