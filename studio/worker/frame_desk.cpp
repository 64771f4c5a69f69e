#include "studio/worker/frame_desk.h"

#include <algorithm>
#include <cmath>
#include <exception>
#include <utility>

#include "host/media/jpeg.h"
#include "host/stabilize/drawing.h"
#include "host/timeline/picture.h"

namespace calmframe::studio {
namespace {

constexpr int kDepth = 8;
// About 90 on the scale that other programs have.
constexpr int kQuantizer = 3;
// Pages ask for a few ahead of the play head.
constexpr std::size_t kMostAsked = 64;
constexpr int kWidest = 8192;

media::PictureView PictureOf(const host::WorldBuffer& pixels) {
  return {pixels.row<HX_Pixel8>(0), pixels.world().row_bytes, pixels.world().width,
          pixels.world().height};
}

media::PictureView PictureOf(const host::Picture& picture) {
  return {picture.row<HX_Pixel8>(0), picture.row_bytes(), picture.width(), picture.height()};
}

}  // namespace

// What a thread draws with.
class FrameDesk::Artist {
 public:
  std::string Draw(const FrameRequest& request, host::Source* source, host::Renderer* renderer,
                   std::int64_t frame_of_shot, const media::ClipInfo& clip) {
    const double across = clip.width * static_cast<double>(clip.pixel_aspect.num) /
                          static_cast<double>(clip.pixel_aspect.den);
    const int width = std::clamp(request.width, 16, std::min(kWidest, std::max(16, clip.width)));
    const auto height = static_cast<int>(std::lround(width * clip.height / across));
    std::vector<media::PictureView> views;
    host::PicturePtr shot;
    host::SteadyFrame steady;
    if (request.before) {
      shot = source->Fetch(request.frame, host::PixelKind::argb8);
      if (!shot) throw std::runtime_error("the clip has no such frame");
      views.push_back(PictureOf(*shot));
    }
    if (request.after || request.tracks) {
      const int downsample = std::max(1, clip.width / width);
      steady = host::DrawFrame(*renderer, frame_of_shot, kDepth, clip.field_order, downsample);
      views.push_back(PictureOf(*steady.pixels));
    }
    return encoder_.Encode(views, width, height, kQuantizer);
  }

 private:
  media::JpegEncoder encoder_;
};

FrameDesk::FrameDesk(int threads) {
  for (int i = 0; i < threads; ++i) threads_.emplace_back([this] { Run(); });
}

FrameDesk::~FrameDesk() {
  {
    const std::lock_guard lock(mutex_);
    ended_ = true;
  }
  changed_.notify_all();
  for (std::thread& thread : threads_) thread.join();
}

void FrameDesk::SetSource(host::SourcePtr source, const media::ClipInfo& whole) {
  {
    const std::lock_guard lock(mutex_);
    source_ = std::move(source);
    whole_ = whole;
    has_opened_ = true;
  }
  changed_.notify_all();
}

void FrameDesk::Show(host::SteadyClip& shot) {
  constexpr int kThreadsAhead = 4;
  host::PrepareDrawing(shot, kDepth, kThreadsAhead, false);
  const std::lock_guard lock(mutex_);
  steady_.effect = &shot.drawn();
  range_ = shot.range();
}

void FrameDesk::ShowTracks(host::Effect& effect) {
  const std::lock_guard lock(mutex_);
  tracks_.effect = &effect;
}

void FrameDesk::Hide() {
  std::unique_lock lock(mutex_);
  steady_.effect = tracks_.effect = nullptr;
  changed_.wait(lock, [this] { return users_ == 0; });
  steady_.idle.clear();
  tracks_.idle.clear();
}

void FrameDesk::Ask(std::uint64_t id, const FrameRequest& request, Reply reply) {
  Reply given_up;
  {
    const std::lock_guard lock(mutex_);
    asked_.push_back({id, request, std::move(reply)});
    if (asked_.size() > kMostAsked) {
      given_up = std::move(asked_.front().reply);
      asked_.pop_front();
    }
  }
  changed_.notify_one();
  if (given_up) given_up({}, NoFrame::busy, "");
}

void FrameDesk::Forget(std::uint64_t id) {
  const std::lock_guard lock(mutex_);
  std::erase_if(asked_, [id](const Asked& asked) { return asked.id == id; });
}

void FrameDesk::Run() {
  Artist artist;
  std::unique_lock lock(mutex_);
  while (true) {
    changed_.wait(lock, [this] { return ended_ || (has_opened_ && !asked_.empty()); });
    if (ended_) return;
    const Asked asked = std::move(asked_.front());
    asked_.pop_front();
    lock.unlock();
    Draw(asked, artist);
    lock.lock();
  }
}

void FrameDesk::Draw(const Asked& asked, Artist& artist) {
  const FrameRequest& request = asked.request;
  std::unique_ptr<host::Renderer> renderer;
  std::unique_lock lock(mutex_);
  const host::SourcePtr source = source_;
  const media::ClipInfo whole = whole_;
  const auto frame = static_cast<std::size_t>(std::max<std::int64_t>(request.frame, 0));
  const bool renders = request.after || request.tracks;
  Drawn& drawn = request.tracks ? tracks_ : steady_;
  NoFrame why = NoFrame::none;
  if (!source) {
    why = NoFrame::busy;
  } else if (renders && !steady_.effect) {
    why = NoFrame::busy;
  } else if (renders && (frame < range_.first || frame >= range_.end)) {
    why = NoFrame::shot;
  } else if (renders && !drawn.effect) {
    why = NoFrame::tracks;
  }
  if (why != NoFrame::none) {
    lock.unlock();
    return asked.reply({}, why, "");
  }
  const std::int64_t frame_of_shot =
      request.frame - static_cast<std::int64_t>(renders ? range_.first : 0);
  host::Effect* const effect = drawn.effect;
  if (renders) {
    ++users_;
    if (!drawn.idle.empty()) {
      renderer = std::move(drawn.idle.back());
      drawn.idle.pop_back();
    }
  }
  lock.unlock();
  std::string jpeg, text;
  try {
    if (renders && !renderer) renderer = effect->MakeRenderer();
    jpeg = artist.Draw(request, source.get(), renderer.get(), frame_of_shot, whole);
  } catch (const std::exception& error) {
    why = NoFrame::gone;
    text = error.what();
  }
  if (renders) {
    lock.lock();
    if (drawn.effect) drawn.idle.push_back(std::move(renderer));
    lock.unlock();
    renderer.reset();  // while the effect still stands
    lock.lock();
    --users_;
    changed_.notify_all();
    lock.unlock();
  }
  asked.reply(std::move(jpeg), why, text);
}

}  // namespace calmframe::studio
