#ifndef LIBRARY_CALMFRAME_HPP_
#define LIBRARY_CALMFRAME_HPP_

#include <calmframe.h>

#include <cstdint>
#include <functional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

// calmframe.h for C++17: codes become exceptions, and a session closes itself. What a function does
// is told there.
namespace calmframe {

class Error : public std::runtime_error {
 public:
  Error(calmframe_result result, const std::string& line)
      : std::runtime_error(line.empty() ? calmframe_result_name(result) : line), code(result) {}
  const calmframe_result code;
};

// With the members of calmframe_options as they are at first.
struct Options : calmframe_options {
  Options() : calmframe_options() { calmframe_options_init(this); }
  Options(int frame_width, int frame_height, std::int64_t frames) : Options() {
    width = frame_width;
    height = frame_height;
    frame_count = frames;
  }
};

// A frame of one plane.
inline calmframe_image Image(void* pixels, std::ptrdiff_t stride, int width, int height) {
  calmframe_image image{};
  image.width = width;
  image.height = height;
  image.plane[0] = pixels;
  image.stride[0] = stride;
  return image;
}

// Movable. Any thread; close, which waits for the others, one.
class Session {
 public:
  // Fetches a frame; what it throws ends the work with CALMFRAME_ERROR_SOURCE.
  using Fetch = std::function<void(std::int64_t frame, const calmframe_image& image)>;

  // The frames are pushed, or fetched as the options tell.
  explicit Session(const calmframe_options& options) { Open(options); }
  // The frames are fetched by this.
  Session(calmframe_options options, Fetch fetch) : fetch_(new Fetch(std::move(fetch))) {
    options.user = fetch_;
    options.fetch = [](void* user, std::int64_t frame, calmframe_image* image) -> std::int32_t {
      try {
        (*static_cast<Fetch*>(user))(frame, *image);
        return 0;
      } catch (...) {
        return 1;
      }
    };
    try {
      Open(options);
    } catch (...) {
      delete fetch_;
      throw;
    }
  }
  ~Session() { Close(); }
  Session(Session&& other) noexcept
      : handle_(std::exchange(other.handle_, nullptr)),
        fetch_(std::exchange(other.fetch_, nullptr)) {}
  Session& operator=(Session&& other) noexcept {
    std::swap(handle_, other.handle_);
    std::swap(fetch_, other.fetch_);
    return *this;
  }

  void Close() {
    if (handle_) calmframe_close(handle_);
    handle_ = nullptr;
    delete std::exchange(fetch_, nullptr);
  }
  calmframe_session handle() const { return handle_; }

  void Set(const std::string& name, const std::string& value) {
    Check(calmframe_set(handle_, name.c_str(), value.c_str()));
  }
  std::string Controls() const { return Text(calmframe_get_controls); }

  void Start() { Check(calmframe_start(handle_)); }
  void Push(std::int64_t frame, const calmframe_image& image) {
    Check(calmframe_push(handle_, frame, &image));
  }
  // False: there is no room.
  bool TryPush(std::int64_t frame, const calmframe_image& image) {
    return Check(calmframe_try_push(handle_, frame, &image)) == CALMFRAME_OK;
  }
  void Finish() { Check(calmframe_finish(handle_)); }
  // False: the time is up.
  bool Wait(std::int64_t milliseconds = -1) {
    return Check(calmframe_wait(handle_, milliseconds)) == CALMFRAME_OK;
  }
  // Starts and waits.
  void Solve() {
    Start();
    Wait();
  }
  void Cancel() { Check(calmframe_cancel(handle_)); }
  int state() const { return Get<std::int32_t>(calmframe_get_state); }
  calmframe_progress progress() const { return Get<calmframe_progress>(calmframe_get_progress); }

  std::vector<calmframe_shot> shots() const {
    std::vector<calmframe_shot> shots(Get<std::size_t>(calmframe_get_shot_count));
    for (std::size_t s = 0; s < shots.size(); ++s) {
      Check(calmframe_get_shot(handle_, s, &shots[s]));
    }
    return shots;
  }
  calmframe_outcome outcome() const { return Get<calmframe_outcome>(calmframe_get_outcome); }
  std::vector<calmframe_place> Path(std::int64_t first, std::int64_t count) const {
    std::vector<calmframe_place> places(static_cast<std::size_t>(count));
    Check(calmframe_get_path(handle_, first, count, places.data()));
    return places;
  }
  std::string Report() const { return Text(calmframe_get_report); }

  void Render(std::int64_t frame, const calmframe_image& source, const calmframe_image& out) {
    Check(calmframe_render(handle_, frame, &source, &out));
  }
  // Of a frame that is fetched.
  void Render(std::int64_t frame, const calmframe_image& out) {
    Check(calmframe_render(handle_, frame, nullptr, &out));
  }

  std::vector<unsigned char> Save() const {
    void* bytes = nullptr;
    std::size_t size = 0;
    Check(calmframe_save(handle_, &bytes, &size));
    const auto* const begin = static_cast<const unsigned char*>(bytes);
    std::vector<unsigned char> saved(begin, begin + size);
    calmframe_free(bytes);
    return saved;
  }
  void Save(const std::string& path) const { Check(calmframe_save_file(handle_, path.c_str())); }
  void Load(const std::vector<unsigned char>& bytes) {
    Check(calmframe_load(handle_, bytes.data(), bytes.size()));
  }
  void Load(const std::string& path) { Check(calmframe_load_file(handle_, path.c_str())); }

 private:
  static std::string LastLine(calmframe_session session) {
    std::string text(512, '\0');
    text.resize(calmframe_error_text(session, &text[0], text.size()));
    return text;
  }
  void Open(const calmframe_options& options) {
    const calmframe_result result = calmframe_open(&options, &handle_);
    if (result != CALMFRAME_OK) throw Error(result, LastLine(nullptr));
  }
  calmframe_result Check(calmframe_result result) const {
    if (result < 0) throw Error(result, LastLine(handle_));
    return result;
  }
  template <class Value>
  Value Get(calmframe_result (*get)(calmframe_session, Value*)) const {
    Value value{};
    Check(get(handle_, &value));
    return value;
  }
  std::string Text(calmframe_result (*get)(calmframe_session, char**)) const {
    char* const text = Get<char*>(get);
    std::string copy = text;
    calmframe_free(text);
    return copy;
  }

  calmframe_session handle_ = nullptr;
  Fetch* fetch_ = nullptr;  // at one address, which the session knows
};

}  // namespace calmframe

#endif
