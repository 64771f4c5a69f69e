#pragma once

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "host/media/clip.h"
#include "host/stabilize/steady_clip.h"
#include "host/timeline/source.h"

namespace calmframe::studio {

// A picture that a page wants.
struct FrameRequest {
  std::int64_t frame = 0;              // of the whole clip
  bool before = false, after = false;  // both: below each other
  bool tracks = false;                 // in place of them: before, with its tracks
  int width = 0;                       // square pixels of each
};

// Why there is none.
enum class NoFrame {
  none,
  busy,    // the clip is being worked
  shot,    // another shot of it is open
  tracks,  // nobody has shown them yet
  gone     // it can't be made; the text tells why
};

// Draws frames on threads of its own, before and after, as JPEGs. A clip's owner tells what there
// is to draw; others ask.
class FrameDesk {
 public:
  // A JPEG, or why there is none. Called on a thread of the desk, or at once.
  using Reply = std::function<void(std::string jpeg, NoFrame why, const std::string& text)>;

  explicit FrameDesk(int threads);
  ~FrameDesk();
  FrameDesk(const FrameDesk&) = delete;
  FrameDesk& operator=(const FrameDesk&) = delete;

  // Where frames come from as they were shot; null: they can't be had. What is asked for before
  // waits.
  void SetSource(host::SourcePtr source, const media::ClipInfo& whole);
  // From now on the shot is drawn, as it stands, until Hide returns.
  void Show(host::SteadyClip& shot);
  // The same for tracks; what is shown besides stays.
  void ShowTracks(host::Effect& effect);
  // Waits for what is being drawn.
  void Hide();

  // Any thread. What is asked for last is drawn last; of too many the oldest are given up.
  void Ask(std::uint64_t id, const FrameRequest& request, Reply reply);
  // Nobody waits for it any more.
  void Forget(std::uint64_t id);

 private:
  struct Asked {
    std::uint64_t id = 0;
    FrameRequest request;
    Reply reply;
  };
  class Artist;

  void Run();
  void Draw(const Asked& asked, Artist& artist);

  std::mutex mutex_;  // guards all below but the threads
  std::condition_variable changed_;
  bool ended_ = false, has_opened_ = false;
  std::deque<Asked> asked_;
  host::SourcePtr source_;
  media::ClipInfo whole_;
  // What draws one side of a picture.
  struct Drawn {
    host::Effect* effect = nullptr;  // null: nothing is to be drawn
    std::vector<std::unique_ptr<host::Renderer>> idle;
  };
  Drawn steady_, tracks_;
  media::FrameRange range_;
  int users_ = 0;  // threads that draw
  std::vector<std::thread> threads_;
};

}  // namespace calmframe::studio
