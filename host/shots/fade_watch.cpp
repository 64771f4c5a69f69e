#include "host/shots/fade_watch.h"

#include <algorithm>
#include <cmath>

#include "host/shots/cut_rule.h"

namespace calmframe::host {
namespace {

// Of the picture's contrast: below it is low, four times the least it is low no more. A fade in
// which no frame is plain has a sixth at least where either half takes five frames or more.
constexpr double kLow = 0.25;
// By how much the contrast grows from frame to frame, or in two of them, while a picture comes out.
constexpr double kRise = 1.03;
// Frames in which the picture can be seen, and is seen to fade.
constexpr double kFaint[2] = {0.3, 0.75};
// How far black and white may seem from themselves, in 255ths, as the picture's light changes.
constexpr double kBase = 24;
// Differences, see DigestMatch: of a picture to itself, faint; of two pictures.
constexpr double kItself = 0.25, kOther = 0.12;

// The whole picture that `frame` is a fainter one of, up to `most` frames before it, for `step` -1,
// or behind it.
std::int64_t WholeFrom(const FrameHistory& history, std::int64_t frame, std::int64_t step,
                       std::int64_t most) {
  const std::int64_t limit = frame + step * most;
  for (bool rises = true; rises;) {
    rises = false;
    for (int ahead = 1; ahead <= 2 && !rises; ++ahead) {
      const std::int64_t next = frame + ahead * step;
      rises = (limit - next) * step >= 0 &&
              history.contrast(next) > std::pow(kRise, ahead) * history.contrast(frame);
      if (rises) frame = next;
    }
  }
  return frame;
}

// Whether the frames from a picture to a plain one, `count` away and behind it or before it, show
// it fainter, where any are between: whoever pans over a wall has a plain picture too. They show
// it; or, where it moves too much for that, what they add to it is black in all of them, or white.
bool FadesFrom(const FrameHistory& history, std::int64_t picture, std::int64_t count) {
  const std::int64_t step = count < 0 ? -1 : 1;
  bool shown = true, first = true, to_black = true, to_white = true;
  for (std::int64_t f = picture + step; f != picture + count && history.Holds(f); f += step) {
    const double part = history.contrast(f) / history.contrast(picture);
    if (!(part > kFaint[0] && part < kFaint[1])) continue;
    if (first) shown = history.Difference(picture, f) < kItself;
    first = false;
    const double added = (history.mean(f) - part * history.mean(picture)) / (1 - part);
    to_black = to_black && added < kBase;
    to_white = to_white && added > 255 - kBase;
  }
  return shown || to_black || to_white;
}

}  // namespace

FadeWatch::FadeWatch(double frames_per_second)
    : second_(std::clamp<std::int64_t>(std::llround(frames_per_second), 10, 240)) {}

void FadeWatch::Begin(const FrameHistory& history, std::int64_t first) {
  const std::int64_t frame = history.end() - 1;
  const std::int64_t whole =
      WholeFrom(history, frame, -1, std::min(second_, frame - std::max(first, history.first())));
  if (!(history.contrast(whole) > 2 * kPlain &&
        history.contrast(frame) < kLow * history.contrast(whole))) {
    return;
  }
  state_ = State::low;
  least_ = 1e30;
  before_frame_ = whole;
  before_ = history.digest(before_frame_);
  before_contrast_ = history.contrast(before_frame_);
  before_fades_ = FadesFrom(history, before_frame_, frame - before_frame_);
}

std::optional<ShotBorder> FadeWatch::Next(const FrameHistory& history, std::int64_t first) {
  const std::int64_t frame = history.end() - 1;
  const double contrast = history.contrast(frame);
  std::optional<ShotBorder> border;
  if (state_ == State::rising && frame - rise_ >= second_ / 2) {
    border = Judge(history, history.end());
    state_ = State::clear;
  }
  if (state_ == State::rising && contrast < kLow * before_contrast_ && contrast < kPlain) {
    // Down again.
    border = Judge(history, history.end());
    state_ = State::clear;
  }
  // There was a cut to a picture of less contrast.
  if (state_ != State::clear && first > before_frame_) state_ = State::clear;
  if (state_ == State::clear) Begin(history, first);
  if (state_ != State::low) return border;

  if (contrast < least_) least_ = contrast;
  const double plain = std::max(kPlain, 1.2 * least_);
  if (contrast <= plain) {
    if (plain_last_ < before_frame_ || history.contrast(plain_last_) > plain) plain_first_ = frame;
    plain_last_ = frame;
  }
  if (contrast > std::max(kPlain, least_) / kLow) {
    state_ = State::rising;
    rise_ = frame;
  } else if (contrast > kPlain && frame - plain_last_ > second_) {
    state_ = State::clear;  // another picture, of little contrast
  }
  return border;
}

std::optional<ShotBorder> FadeWatch::Finish(const FrameHistory& history, std::int64_t end) {
  std::optional<ShotBorder> border;
  if (state_ == State::rising && rise_ < end) {
    border = Judge(history, end);
    state_ = State::clear;
  }
  return border;
}

std::optional<ShotBorder> FadeWatch::Judge(const FrameHistory& history, std::int64_t end) const {
  const std::int64_t behind = WholeFrom(history, rise_, 1, std::min(second_ / 2, end - 1 - rise_));
  const double less = std::min(before_contrast_, history.contrast(behind));
  if (!(least_ < kLow * less) || !before_fades_) return {};
  if (!FadesFrom(history, behind, plain_last_ - behind)) return {};
  // The same picture goes on behind a flash or a frame that was lost.
  std::int64_t faint = 0;
  for (std::int64_t f = before_frame_ + 1; f < behind; ++f) {
    if (history.contrast(f) < less / 2) ++faint;
  }
  const bool short_one = faint < second_ / 4;
  const double difference = MatchOf(before_, history.digest(behind)).difference;
  if (short_one && difference < kOther) return {};
  ShotBorder border;
  border.kind = ShotBorder::Kind::fade;
  border.first = before_frame_ + 1;
  border.last = std::max(border.first, behind - 1);
  border.frame = (plain_first_ + plain_last_ + 1) / 2;
  border.confidence = 1 - 0.5 * std::min(1.0, std::max(least_ / (kLow * less),
                                                       short_one ? kOther / difference : 0.0));
  return border;
}

}  // namespace calmframe::host
