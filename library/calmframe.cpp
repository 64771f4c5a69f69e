#include "library/calmframe.h"

#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <limits>
#include <map>
#include <memory>
#include <mutex>
#include <new>
#include <numeric>
#include <string>
#include <utility>

#include "host/project/project_file.h"
#include "library/clip_session.h"
#include "library/refusal.h"

// The border between C and the library: handles to sessions, exceptions to codes.
namespace calmframe::library {
namespace {

constexpr std::size_t kLine = 512;
thread_local char thread_line[kLine] = "";  // of calls that no session stands for

using SessionPtr = std::shared_ptr<ClipSession>;

// By handle. A call holds its session, so that one that is closed meanwhile ends well.
class Sessions {
 public:
  static Sessions& Get() {
    static Sessions& sessions = *new Sessions;  // outlives threads that call at the process's end
    return sessions;
  }
  calmframe_session Add(SessionPtr session) {
    const std::lock_guard lock(mutex_);
    const std::uintptr_t number = ++last_;
    sessions_.emplace(number, std::move(session));
    return reinterpret_cast<calmframe_session>(number);
  }
  SessionPtr Find(calmframe_session handle) {
    const std::lock_guard lock(mutex_);
    const auto found = sessions_.find(reinterpret_cast<std::uintptr_t>(handle));
    return found == sessions_.end() ? nullptr : found->second;
  }
  // Any one; null: there is none.
  SessionPtr TakeOne() {
    const std::lock_guard lock(mutex_);
    if (sessions_.empty()) return nullptr;
    return std::move(sessions_.extract(sessions_.begin()).mapped());
  }
  SessionPtr Take(calmframe_session handle) {
    const std::lock_guard lock(mutex_);
    auto node = sessions_.extract(reinterpret_cast<std::uintptr_t>(handle));
    return node ? std::move(node.mapped()) : nullptr;
  }

 private:
  std::mutex mutex_;
  std::uintptr_t last_ = 0;
  std::map<std::uintptr_t, SessionPtr> sessions_;
};

void ExpectPointer(const void* pointer, const char* name) {
  if (!pointer) throw Refusal(CALMFRAME_ERROR_ARGUMENT, std::string(name) + " is null");
}

void CloseAll() {
  if (FrameFeed::IsFetching()) return;
  while (const SessionPtr session = Sessions::Get().TakeOne()) session->Close();
}

calmframe_result NoSession() {
  std::snprintf(thread_line, kLine, "there is no such session, or it was closed");
  return CALMFRAME_ERROR_ARGUMENT;
}

// act(session), which gives a code or nothing.
template <class Act>
calmframe_result On(calmframe_session handle, const Act& act) noexcept {
  SessionPtr session;
  try {
    session = Sessions::Get().Find(handle);
    if (!session) return NoSession();
    if constexpr (std::is_void_v<decltype(act(*session))>) {
      act(*session);
      return CALMFRAME_OK;
    } else {
      return act(*session);
    }
  } catch (...) {
    char line[kLine];
    const calmframe_result code = TellException(line, sizeof line);
    if (session) session->KeepError(line);
    return code;
  }
}

void* CopyOf(const void* bytes, std::size_t size) {
  void* const copy = std::malloc(std::max<std::size_t>(size, 1));
  if (!copy) throw std::bad_alloc();
  std::memcpy(copy, bytes, size);
  return copy;
}

char* CopyOf(const std::string& text) {
  return static_cast<char*>(CopyOf(text.c_str(), text.size() + 1));
}

// A file for saved work on its way from or to bytes, which goes with the object.
class PassingFile {
 public:
  PassingFile() {
    std::string name = (std::filesystem::temp_directory_path() / "calmframe-XXXXXX").string();
    if (!mkdtemp(name.data())) {
      throw host::ProjectFailure(name + ": a temporary folder can't be made");
    }
    std::string path;
    try {
      path = name + "/saved";
    } catch (...) {
      rmdir(name.c_str());
      throw;
    }
    folder_ = std::move(name);
    path_ = std::move(path);
  }
  ~PassingFile() {  // takes no memory
    unlink(path_.c_str());
    rmdir(folder_.c_str());
  }
  PassingFile(const PassingFile&) = delete;
  PassingFile& operator=(const PassingFile&) = delete;

  const std::string& path() const { return path_; }
  std::string Read() const {
    std::ifstream file(path_, std::ios::binary);
    std::string bytes{std::istreambuf_iterator<char>(file), {}};
    if (!file) throw host::ProjectFailure("the saved work can't be read");
    return bytes;
  }
  void Write(const void* bytes, std::size_t size) const {
    std::ofstream file(path_, std::ios::binary);
    file.write(static_cast<const char*>(bytes), static_cast<std::streamsize>(size));
    if (!file.flush()) throw host::ProjectFailure("there is no room for a temporary file");
  }

 private:
  std::string folder_, path_;
};

}  // namespace

void CloseAtEnd() noexcept {
  std::atexit(CloseAll);
}

}  // namespace calmframe::library

using namespace calmframe::library;

const char* calmframe_version(void) {
  return CALMFRAME_VERSION;
}

const char* calmframe_result_name(calmframe_result result) {
#define CALMFRAME_NAME(code) \
  case code:                 \
    return #code
  switch (result) {
    CALMFRAME_NAME(CALMFRAME_OK);
    CALMFRAME_NAME(CALMFRAME_AGAIN);
    CALMFRAME_NAME(CALMFRAME_ERROR_ARGUMENT);
    CALMFRAME_NAME(CALMFRAME_ERROR_STATE);
    CALMFRAME_NAME(CALMFRAME_ERROR_BUSY);
    CALMFRAME_NAME(CALMFRAME_ERROR_MEMORY);
    CALMFRAME_NAME(CALMFRAME_ERROR_PLUGIN);
    CALMFRAME_NAME(CALMFRAME_ERROR_SOURCE);
    CALMFRAME_NAME(CALMFRAME_ERROR_SOLVE);
    CALMFRAME_NAME(CALMFRAME_ERROR_CANCELLED);
    CALMFRAME_NAME(CALMFRAME_ERROR_FILE);
    CALMFRAME_NAME(CALMFRAME_ERROR_INTERNAL);
    default:
      return "?";
  }
#undef CALMFRAME_NAME
}

void calmframe_options_init(calmframe_options* options) {
  if (!options) return;
  *options = {};
  options->struct_size = sizeof *options;
  options->depth = 8;
  options->matrix = 2;
  options->chroma_location = 1;
  options->aspect_num = options->aspect_den = 1;
  options->rate_num = 25;
  options->rate_den = 1;
}

calmframe_result calmframe_open(const calmframe_options* options, calmframe_session* session) {
  if (session) *session = nullptr;
  try {
    ExpectPointer(options, "options");
    ExpectPointer(session, "session");
    if (options->struct_size != sizeof *options) {
      throw Refusal(CALMFRAME_ERROR_ARGUMENT, "options were not set by calmframe_options_init");
    }
    *session = Sessions::Get().Add(std::make_shared<ClipSession>(SessionRequest(*options)));
    CloseAtEnd();
    return CALMFRAME_OK;
  } catch (...) {
    return TellException(thread_line, kLine);
  }
}

calmframe_result calmframe_close(calmframe_session session) {
  if (FrameFeed::IsFetching()) {
    return On(session, [](ClipSession&) {
      throw Refusal(CALMFRAME_ERROR_STATE, "a session can't be closed while it fetches a frame");
    });
  }
  try {
    const SessionPtr taken = Sessions::Get().Take(session);
    if (!taken) return NoSession();
    taken->Close();
    return CALMFRAME_OK;
  } catch (...) {
    return TellException(thread_line, kLine);
  }
}

calmframe_result calmframe_set(calmframe_session session, const char* name, const char* value) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(name, "name");
    ExpectPointer(value, "value");
    s.Set(name, value);
  });
}

calmframe_result calmframe_get_controls(calmframe_session session, char** json) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(json, "json");
    *json = CopyOf(s.ControlsJson());
  });
}

calmframe_result calmframe_start(calmframe_session session) {
  return On(session, [](ClipSession& s) { s.Start(); });
}

calmframe_result calmframe_push(calmframe_session session, int64_t frame,
                                const calmframe_image* image) {
  return On(session, [&](ClipSession& s) { return s.Push(frame, image, true); });
}

calmframe_result calmframe_try_push(calmframe_session session, int64_t frame,
                                    const calmframe_image* image) {
  return On(session, [&](ClipSession& s) { return s.Push(frame, image, false); });
}

calmframe_result calmframe_finish(calmframe_session session) {
  return On(session, [](ClipSession& s) { s.Finish(); });
}

calmframe_result calmframe_wait(calmframe_session session, int64_t milliseconds) {
  return On(session, [&](ClipSession& s) { return s.Wait(milliseconds); });
}

calmframe_result calmframe_cancel(calmframe_session session) {
  return On(session, [](ClipSession& s) { s.Cancel(); });
}

calmframe_result calmframe_get_state(calmframe_session session, int32_t* state) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(state, "state");
    *state = s.state();
  });
}

calmframe_result calmframe_get_progress(calmframe_session session, calmframe_progress* progress) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(progress, "progress");
    *progress = s.progress();
  });
}

size_t calmframe_error_text(calmframe_session session, char* text, size_t size) {
  try {
    if (const SessionPtr found = Sessions::Get().Find(session)) return found->ErrorText(text, size);
  } catch (...) {
  }
  if (text && size > 0) std::snprintf(text, size, "%s", thread_line);
  return std::strlen(thread_line);
}

calmframe_result calmframe_get_shot_count(calmframe_session session, size_t* count) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(count, "count");
    *count = s.ShotCount();
  });
}

calmframe_result calmframe_get_shot(calmframe_session session, size_t number,
                                    calmframe_shot* shot) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(shot, "shot");
    *shot = s.Shot(number);
  });
}

calmframe_result calmframe_get_outcome(calmframe_session session, calmframe_outcome* outcome) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(outcome, "outcome");
    *outcome = s.Outcome();
  });
}

calmframe_result calmframe_get_path(calmframe_session session, int64_t first, int64_t count,
                                    calmframe_place* places) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(places, "places");
    s.Path(first, count, places);
  });
}

calmframe_result calmframe_get_report(calmframe_session session, char** json) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(json, "json");
    *json = CopyOf(s.ReportJson());
  });
}

calmframe_result calmframe_render(calmframe_session session, int64_t frame,
                                  const calmframe_image* source, const calmframe_image* out) {
  return On(session, [&](ClipSession& s) { s.Render(frame, source, out); });
}

calmframe_result calmframe_get_saved_file(const char* path, calmframe_saved* saved) {
  try {
    ExpectPointer(path, "path");
    ExpectPointer(saved, "saved");
    const calmframe::host::Project project = calmframe::host::LoadProject(path);
    const std::int64_t divisor = std::gcd(HX_TICKS_PER_SECOND, project.ticks_per_frame);
    // Of numbers beyond these no session can be opened.
    const auto number = [path](std::int64_t value) {
      if (value <= std::numeric_limits<std::int32_t>::max())
        return static_cast<std::int32_t>(value);
      throw calmframe::host::ProjectFailure(std::string(path) + ": is of no frames that go here");
    };
    *saved = {.width = project.width,
              .height = project.height,
              .aspect_num = project.pixel_aspect.num,
              .aspect_den = number(project.pixel_aspect.den),
              .rate_num = number(HX_TICKS_PER_SECOND / divisor),
              .rate_den = number(project.ticks_per_frame / divisor),
              .frame_count = project.end_frame};
    return CALMFRAME_OK;
  } catch (...) {
    return TellException(thread_line, kLine);
  }
}

calmframe_result calmframe_save_file(calmframe_session session, const char* path) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(path, "path");
    calmframe::host::SaveProject(path, s.Save());
  });
}

calmframe_result calmframe_save(calmframe_session session, void** bytes, size_t* size) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(bytes, "bytes");
    ExpectPointer(size, "size");
    const PassingFile file;
    calmframe::host::SaveProject(file.path(), s.Save());
    const std::string saved = file.Read();
    *bytes = CopyOf(saved.data(), saved.size());
    *size = saved.size();
  });
}

calmframe_result calmframe_load_file(calmframe_session session, const char* path) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(path, "path");
    s.Load(calmframe::host::LoadProject(path));
  });
}

calmframe_result calmframe_load(calmframe_session session, const void* bytes, size_t size) {
  return On(session, [&](ClipSession& s) {
    ExpectPointer(bytes, "bytes");
    const PassingFile file;
    file.Write(bytes, size);
    s.Load(calmframe::host::LoadProject(file.path()));
  });
}

void calmframe_free(void* memory) {
  std::free(memory);
}
