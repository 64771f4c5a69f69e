#include "platform/tessel/debug.h"

#include <atomic>
#include <boost/date_time/posix_time/posix_time.hpp>
#include <cstdarg>
#include <cstdio>
#include <cstdlib>
#include <map>
#include <mutex>
#include <new>
#include <sstream>
#include <thread>

namespace tessel::debug {
namespace {

constexpr char kLogOption[] = "ShowExperimentalEffectParameters";

class Database {
 public:
  Database() {
    const char* text = std::getenv("CALMFRAME_DEBUG");
    std::stringstream entries(text ? text : "");
    for (std::string entry; std::getline(entries, entry, ',');) {
      const std::size_t equals = entry.find('=');
      const bool has_value = equals != std::string::npos;
      values_[entry.substr(0, equals)] = has_value ? std::atoi(entry.c_str() + equals + 1) : 1;
    }
    Publish();
  }

  int Get(const std::string& name, int unless_set) {
    std::lock_guard<std::mutex> lock(mutex_);
    const auto found = values_.find(name);
    return found == values_.end() ? unless_set : found->second;
  }

  void Set(const std::string& name, int value) {
    std::lock_guard<std::mutex> lock(mutex_);
    values_[name] = value;
    change_count_.fetch_add(1, std::memory_order_relaxed);
    Publish();
  }

  // The log is asked from inner loops, where it must cost one load.
  bool log_enabled() const { return log_enabled_.load(std::memory_order_relaxed); }
  std::uint64_t change_count() const { return change_count_.load(std::memory_order_relaxed); }

 private:
  void Publish() { log_enabled_ = values_.count(kLogOption) && values_[kLogOption] != 0; }

  std::mutex mutex_;
  std::map<std::string, int> values_;  // guarded by mutex_
  std::atomic<bool> log_enabled_{false};
  std::atomic<std::uint64_t> change_count_{1};
};

Database& database() {
  static Database& instance = *new Database;  // threads may log while the process ends
  return instance;
}

std::mutex& sink_mutex() {
  static std::mutex& mutex = *new std::mutex;
  return mutex;
}

boost::function<void(const std::string&)>& sink() {
  static auto& function = *new boost::function<void(const std::string&)>;
  return function;
}

void Write(const std::string& text) {
  std::lock_guard<std::mutex> lock(sink_mutex());
  if (sink()) {
    sink()(text);
  } else {
    std::fwrite(text.data(), 1, text.size(), stderr);
  }
}

}  // namespace

bool DebugDatabase::GetBool(const std::string& name, bool unless_set) {
  return database().Get(name, unless_set) != 0;
}
void DebugDatabase::Set(const std::string& name, int value) {
  database().Set(name, value);
}

void SetSink(boost::function<void(const std::string&)> new_sink) {
  std::lock_guard<std::mutex> lock(sink_mutex());
  sink() = std::move(new_sink);
}

bool LogEnabled() {
  return database().log_enabled();
}

void Log(const char* format, ...) {
  if (!LogEnabled()) return;
  va_list arguments;
  va_start(arguments, format);
  va_list again;
  va_copy(again, arguments);
  const int length = std::vsnprintf(nullptr, 0, format, arguments);
  va_end(arguments);
  if (length > 0) {
    std::string text(static_cast<std::size_t>(length) + 1, '\0');
    std::vsnprintf(text.data(), text.size(), format, again);
    text.pop_back();
    Write(text);
  }
  va_end(again);
}

bool TraceEnabled(const std::string& channel, int level) {
  return database().Get("Trace." + channel, 0) >= level;
}

std::uint64_t TraceChangeCount() {
  return database().change_count();
}

void Trace(const std::string& channel, int level, const std::string& text) {
  if (!TraceEnabled(channel, level)) return;
  std::ostringstream line;
  line << '<' << std::this_thread::get_id() << "> <" << channel << "> <" << level << "> " << text
       << '\n';
  Write(line.str());
}

void ReportAssertion(const std::string& file, const std::string& function,
                     const std::string& text) {
  Write(file + ": " + function + ": " + text + "\n");
}

TimingEntry::TimingEntry(const std::string& channel, int level, const std::string& text)
    : enabled_(TraceEnabled(channel, level)), channel_(channel), level_(level), text_(text) {
  if (!enabled_) return;
  Trace(channel_, level_, "Begin - " + text_);
  begin_ = std::chrono::steady_clock::now();
}

TimingEntry::~TimingEntry() {
  if (!enabled_) return;
  const auto elapsed = std::chrono::steady_clock::now() - begin_;
  try {
    std::ostringstream line;
    line << "End - " << text_ << " ["
         << boost::posix_time::microseconds(
                std::chrono::duration_cast<std::chrono::microseconds>(elapsed).count())
         << " elapsed]";
    Trace(channel_, level_, line.str());
  } catch (const std::bad_alloc&) {
  }
}

}  // namespace tessel::debug
