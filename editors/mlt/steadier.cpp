#include "editors/mlt/steadier.h"

#include <stdexcept>

namespace calmframe::mlt {
namespace {

std::string RateText(std::int64_t num, std::int64_t den) {
  std::string text = std::to_string(num);
  if (den != 1) text.append("/").append(std::to_string(den));
  return text;
}

}  // namespace

Steadier::Steadier(const SteadyRequest& request, const std::vector<PictureKind>& kinds,
                   const std::atomic<bool>& stops)
    : request_(request), stops_(stops) {
  calmframe_saved saved;
  if (const calmframe_result result = calmframe_get_saved_file(request.results.c_str(), &saved);
      result != CALMFRAME_OK) {
    std::string line(512, '\0');
    line.resize(calmframe_error_text(nullptr, line.data(), line.size()));
    throw Error(result, line);
  }
  const auto is_same = [](std::int64_t num, std::int64_t den, std::int64_t n, std::int64_t d) {
    return num * d == den * n;
  };
  if (!is_same(saved.rate_num, saved.rate_den, request.rate_num, request.rate_den)) {
    throw std::runtime_error(request.results + ": is of " +
                             RateText(saved.rate_num, saved.rate_den) + " frames a second, not " +
                             RateText(request.rate_num, request.rate_den) + "; analyse anew");
  }
  // Half a per cent: sizes are whole, and even, numbers of pixels.
  const double shape = static_cast<double>(saved.width) * saved.aspect_num /
                       (static_cast<double>(saved.height) * saved.aspect_den);
  const double wanted = static_cast<double>(request.display_num) / request.display_den;
  if (!(shape / wanted < 1.005 && wanted / shape < 1.005)) {
    throw std::runtime_error(request.results + ": is of pictures of another shape; analyse anew");
  }
  frames_ = {.identity = request.identity,
             .width = saved.width,
             .height = saved.height,
             .aspect_num = saved.aspect_num,
             .aspect_den = saved.aspect_den,
             .rate_num = saved.rate_num,
             .rate_den = saved.rate_den};
  count_ = saved.frame_count;
  for (const PictureKind& kind : kinds) SessionFor(kind);
}

std::vector<PictureKind> Steadier::kinds() const {
  const std::lock_guard lock(making_);
  std::vector<PictureKind> kinds;
  for (const auto& [kind, session] : sessions_) kinds.push_back(kind);
  return kinds;
}

Session& Steadier::SessionFor(const PictureKind& kind) {
  const std::lock_guard lock(making_);
  if (const auto made = sessions_.find(kind); made != sessions_.end()) return *made->second;
  Options options = OptionsFor(frames_, kind);
  options.frame_count = count_;
  auto session = std::make_unique<Session>(options);
  session->Load(request_.results);
  for (const auto& [name, value] : request_.controls) session->Set(name, value);
  session->Start();
  constexpr int kLook = 50;  // milliseconds
  while (!session->Wait(kLook)) {
    if (stops_) session->Cancel();
  }
  return *sessions_.emplace(kind, std::move(session)).first->second;
}

void Steadier::Draw(std::int64_t source_frame, const PictureKind& kind, const calmframe_image& from,
                    const calmframe_image& to) {
  SessionFor(kind).Render(source_frame - request_.first, from, to);
}

}  // namespace calmframe::mlt
