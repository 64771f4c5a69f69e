#pragma once

#include <condition_variable>
#include <cstdint>
#include <deque>
#include <map>
#include <mutex>
#include <string>

#include "host/timeline/source.h"
#include "library/frame_format.h"

namespace calmframe::library {

// The caller's frames as a source of the host: pushed in order, fetched from the caller, or handed
// in with the render that needs them. Any thread.
class FrameFeed final : public host::Source {
 public:
  // `clip`: how many frames there are at most, and what they are. `fetch` null: they are pushed.
  FrameFeed(const FrameFormat& format, const media::ClipInfo& clip,
            const tessel::utility::Guid& content, calmframe_fetch fetch, void* user);

  const host::SourceInfo& info() const override { return info_; }
  // While the clip is worked a frame that is pushed is waited for; one that can't be had is a
  // std::runtime_error then, and null while frames are drawn, with a line in Missing.
  host::PicturePtr Fetch(std::int64_t frame, host::PixelKind kind) override;
  // Where the frames end, once that is told.
  std::int64_t EndOfShot(std::int64_t frame) const override;

  bool is_pushed() const { return !fetch_; }
  // Whether this thread is inside the caller's function.
  static bool IsFetching();

  // -- While the clip is worked --
  enum class Pushed { taken, no_room, stopped };
  // The frame must be the next one. Throws Refusal for a call out of its order, std::bad_alloc.
  Pushed Push(std::int64_t frame, const calmframe_image& image, bool waits);
  // There are no more frames. Throws Refusal where none was pushed.
  void Finish();
  // All frames are known not to be needed again but for drawing: so many there are.
  void FinishAt(std::int64_t count);
  // Whether that frame comes; waits until it is known. False, too, once stopped.
  bool Comes(std::int64_t frame);
  // How many frames there are; the most there can be, until that is told.
  std::int64_t count() const;
  std::int64_t pushed() const;
  // Whether the last frame was pushed, or told.
  bool is_whole() const;

  // Frames are wanted for an analysis from here on, or for drawing alone.
  void BeginWork();
  void EndWork();
  // Whoever waits goes on without a frame, until the next BeginWork.
  void Stop();

  // -- While frames are drawn --
  struct Lent {
    const calmframe_image* image;
    int readers;  // threads that are at it
  };
  // A frame that the caller hands in, for as long as it lives.
  class HandedIn {
   public:
    HandedIn(FrameFeed& feed, std::int64_t frame, const calmframe_image* image);  // null: none
    ~HandedIn();
    HandedIn(const HandedIn&) = delete;
    HandedIn& operator=(const HandedIn&) = delete;

   private:
    FrameFeed& feed_;
    const calmframe_image* const image_;
    std::multimap<std::int64_t, Lent>::iterator place_;
  };
  // Why a frame that a render asked for was not there, once; empty: none was missing. `frame` below
  // 0: any.
  std::string Missing(std::int64_t frame);

  void ToImage(const host::WorldBuffer& pixels, const calmframe_image& image) {
    conversion_.FromPixels(pixels, image);
  }

 private:
  struct Kept {
    std::int64_t frame;
    host::PicturePtr picture;
  };

  host::PicturePtr FetchPushed(std::int64_t frame, host::PixelKind kind);
  host::PicturePtr FetchAsked(std::int64_t frame, host::PixelKind kind);
  host::PicturePtr Ask(std::int64_t frame, host::PixelKind kind);
  host::PicturePtr FetchHandedIn(std::int64_t frame, host::PixelKind kind);
  // Null, or an exception; see Fetch.
  host::PicturePtr Miss(std::int64_t frame, const std::string& line);
  host::PicturePtr Convert(const calmframe_image& image, host::PixelKind kind);
  host::PicturePtr FindKept(std::int64_t frame, host::PixelKind kind) const;
  void Keep(std::int64_t frame, const host::PicturePtr& picture);

  const FrameFormat format_;
  host::SourceInfo info_;
  const calmframe_fetch fetch_;
  void* const user_;
  const boost::shared_ptr<host::PicturePool> pool_;
  FrameConversion conversion_;

  std::mutex asking_;             // held while the caller's function runs
  FrameFormat::Buffer buffer_;    // guarded by asking_
  std::int64_t asked_last_ = -1;  // guarded by asking_

  mutable std::mutex mutex_;  // guards all below
  std::condition_variable changed_;
  bool works_ = false, stopped_ = false;
  std::int64_t end_;                      // kNoEnd until it is told
  std::int64_t pushed_ = 0, wanted_ = 0;  // frames that were pushed; behind the last one asked for
  std::deque<Kept> kept_;                 // the oldest first
  std::multimap<std::int64_t, Lent> lent_;
  std::map<std::int64_t, std::string> missing_;
};

}  // namespace calmframe::library
