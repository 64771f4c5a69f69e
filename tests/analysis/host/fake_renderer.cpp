#include "tests/analysis/host/fake_renderer.h"

#include <algorithm>
#include <cstdlib>
#include <sstream>

#include "tests/effect/fake_host.h"

namespace {

FakeRenderer* current = nullptr;

tessel::utility::Guid ToGuid(const HX_Guid& guid) {
  tessel::utility::Guid::Bytes bytes;
  std::copy_n(guid.bytes, bytes.size(), bytes.begin());
  return tessel::utility::Guid(bytes);
}

std::string Name(std::int64_t time, std::int64_t ticks, const HX_RenderParams& p) {
  std::ostringstream text;
  text << "frame " << time << " " << ticks << " " << p.width << " " << p.height << " " << p.par_num
       << " " << p.par_den << " " << p.field_type << " " << p.field_selection;
  return text.str();
}

}  // namespace

struct FakeRendererSuites {
  using Lock = std::unique_lock<std::mutex>;

  static HX_Err RenderAsync(HX_Node node, std::int64_t time, std::int64_t rate,
                            const HX_RenderParams* params, HX_RenderCallback callback, void* record,
                            std::int32_t* id) {
    Lock lock(current->mutex_);
    if (current->refuse_renders || node == 0) return 7001;
    FakeRenderer::Pending pending{
        ++current->last_id_, {time, rate, *params, {}}, callback, record, false};
    pending.request.frame =
        tessel::utility::Guid::FromText(Name(time, current->ticks_per_frame, *params));
    current->requests_.push_back(pending.request);
    ++current->unanswered_;
    if (current->callbacks == FakeRenderer::Callbacks::kEarly) {
      lock.unlock();
      current->Finish(pending);
    } else {
      current->pending_.push_back(pending);
      current->changed_.notify_all();
    }
    *id = pending.id;
    return HX_ERR_NONE;
  }
  static HX_Err MakeIdentifier(HX_Node, std::int64_t time, std::int64_t ticks, std::int32_t,
                               std::int32_t, std::int32_t, std::int32_t,
                               const HX_RenderParams* params, HX_String* text) {
    if (current->refuse_identifiers) return 7002;
    return strings_->MakeFromUTF8(Name(time, ticks, *params).c_str(), text);
  }
  static HX_Err Cancel(std::int32_t id) {
    Lock lock(current->mutex_);
    for (FakeRenderer::Pending& pending : current->pending_) {
      if (pending.id != id || pending.cancelled) continue;
      pending.cancelled = true;
      ++current->cancelled_;
    }
    return HX_ERR_NONE;
  }

  static HX_Err Lookup(const HX_Guid* identifier, HX_Frame* frame) {
    Lock lock(current->mutex_);
    const auto found = current->cache_.find(ToGuid(*identifier));
    *frame = 0;
    if (found == current->cache_.end()) return HX_ERR_NONE;
    *frame = ++current->last_frame_;
    current->handles_[*frame] = found->second;
    return HX_ERR_NONE;
  }
  static HX_Err Reference(const HX_Guid* identifier) {
    Lock lock(current->mutex_);
    ++current->references_[ToGuid(*identifier)];
    return HX_ERR_NONE;
  }
  static HX_Err Dereference(const HX_Guid* identifier) {
    Lock lock(current->mutex_);
    const auto found = current->references_.find(ToGuid(*identifier));
    if (found == current->references_.end()) {
      current->mistakes_.push_back("dereferenced once too often");
      return HX_ERR_NONE;
    }
    if (--found->second == 0) {
      current->cache_.erase(found->first);
      current->references_.erase(found);
    }
    return HX_ERR_NONE;
  }

  template <class T, class Read>
  static HX_Err Of(HX_Frame frame, T* to, const Read& read) {
    Lock lock(current->mutex_);
    const auto found = current->handles_.find(frame);
    if (found == current->handles_.end()) return HX_ERR_UNKNOWN;
    *to = read(*found->second);
    return HX_ERR_NONE;
  }
  static HX_Err GetPixels(HX_Frame frame, std::uint8_t** pixels) {
    return Of(frame, pixels, [](FakeRenderer::Frame& f) { return f.pixels.data(); });
  }
  static HX_Err GetRowBytes(HX_Frame frame, std::int32_t* bytes) {
    return Of(frame, bytes, [](FakeRenderer::Frame& f) { return f.width * 4 + 8; });
  }
  static HX_Err GetPixelFormat(HX_Frame frame, std::uint32_t* format) {
    return Of(frame, format, [](FakeRenderer::Frame&) {
      return HX_FORMAT_ARGB8 | (current->top_down ? HX_FORMAT_TOP_DOWN : 0);
    });
  }
  static HX_Err GetSize(HX_Frame frame, std::int32_t* width, std::int32_t* height) {
    Of(frame, width, [](FakeRenderer::Frame& f) { return f.width; });
    return Of(frame, height, [](FakeRenderer::Frame& f) { return f.height; });
  }
  static HX_Err Dispose(HX_Frame frame) {
    Lock lock(current->mutex_);
    if (current->handles_.erase(frame) == 0) current->mistakes_.push_back("disposed twice");
    return HX_ERR_NONE;
  }

  static inline const HX_StringSuite1* strings_ = nullptr;  // of the host
};

std::uint8_t FakeRenderer::Grey(std::int64_t time_ticks, int x, int y) {
  const auto u = static_cast<std::uint32_t>(x - time_ticks / 28224000 + 1000) / 3;
  std::uint32_t h = (u * 73856093u) ^ (static_cast<std::uint32_t>(y / 3) * 19349663u);
  h = (h ^ (h >> 13)) * 1274126177u;
  return static_cast<std::uint8_t>((h >> 16) & 255);
}

FakeRenderer::FakeRenderer(FakeHost& host) {
  current = this;
  using S = FakeRendererSuites;
  static const HX_VideoSegmentRenderSuite3 render = [] {
    HX_VideoSegmentRenderSuite3 table{};
    table.RenderAsync = S::RenderAsync;
    table.MakeIdentifier = S::MakeIdentifier;
    table.Cancel = S::Cancel;
    return table;
  }();
  static const HX_CutPixSuite1 cutpix = {S::GetPixels, S::GetRowBytes, S::GetPixelFormat,
                                         S::GetSize, S::Dispose};
  static const HX_CutPixCacheSuite5 cache = [] {
    HX_CutPixCacheSuite5 table{};
    table.Lookup = S::Lookup;
    table.Reference = S::Reference;
    table.Dereference = S::Dereference;
    return table;
  }();
  host.Offer(HX_VIDEO_SEGMENT_RENDER_SUITE, HX_VIDEO_SEGMENT_RENDER_SUITE_VERSION, &render);
  host.Offer(HX_CUTPIX_SUITE, HX_CUTPIX_SUITE_VERSION, &cutpix);
  host.Offer(HX_CUTPIX_CACHE_SUITE, HX_CUTPIX_CACHE_SUITE_VERSION, &cache);
  const void* strings = nullptr;
  if (host.in.basic->acquire(HX_STRING_SUITE, HX_STRING_SUITE_VERSION, &strings) != HX_ERR_NONE) {
    std::abort();
  }
  S::strings_ = static_cast<const HX_StringSuite1*>(strings);
  host.in.basic->release(HX_STRING_SUITE, HX_STRING_SUITE_VERSION);
  worker_ = std::thread([this] { Work(); });
}

FakeRenderer::~FakeRenderer() {
  Stop();
  current = nullptr;
}

void FakeRenderer::Stop() {
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    stops_ = true;
  }
  changed_.notify_all();
  if (worker_.joinable()) worker_.join();
}

void FakeRenderer::Work() {
  for (;;) {
    std::unique_lock<std::mutex> lock(mutex_);
    changed_.wait(
        lock, [this] { return stops_ || (callbacks == Callbacks::kLater && !pending_.empty()); });
    if (pending_.empty() || callbacks != Callbacks::kLater) return;
    const Pending pending = pending_.front();
    pending_.pop_front();
    lock.unlock();
    Finish(pending);
  }
}

void FakeRenderer::Finish(const Pending& pending) {
  HX_Frame handle = 0;
  if (!null_frames && !pending.cancelled) {
    const HX_RenderParams& p = pending.request.params;
    const int width = delivered_width > 0 ? delivered_width.load() : p.width;
    auto frame = std::make_shared<Frame>(Frame{{}, width, p.height});
    const std::size_t row_bytes = static_cast<std::size_t>(width) * 4 + 8;
    frame->pixels.assign(row_bytes * p.height, 0xEE);
    for (int y = 0; y < p.height; ++y) {
      const int row = top_down ? y : p.height - 1 - y;
      std::uint8_t* pixel = frame->pixels.data() + row_bytes * row;
      for (int x = 0; x < width; ++x, pixel += 4) {
        pixel[0] = 255;
        pixel[1] = pixel[2] = pixel[3] = Grey(pending.request.time_ticks, x, y);
      }
    }
    const std::lock_guard<std::mutex> lock(mutex_);
    if (references_.count(pending.request.frame)) cache_[pending.request.frame] = frame;
    handle = ++last_frame_;
    handles_[handle] = frame;
  }
  pending.callback(handle, pending.record);
  const std::lock_guard<std::mutex> lock(mutex_);
  --unanswered_;
}

std::vector<FakeRenderer::Request> FakeRenderer::requests() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return requests_;
}

void FakeRenderer::Resume() {
  const std::lock_guard<std::mutex> lock(mutex_);
  callbacks = Callbacks::kLater;
  changed_.notify_all();
}

int FakeRenderer::cancelled() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  return cancelled_;
}

void FakeRenderer::Deliver() {
  std::deque<Pending> held;
  {
    const std::lock_guard<std::mutex> lock(mutex_);
    held.swap(pending_);
  }
  for (const Pending& pending : held) Finish(pending);
}

void FakeRenderer::WaitForHeld(std::size_t count) {
  std::unique_lock<std::mutex> lock(mutex_);
  changed_.wait(lock, [&] { return pending_.size() >= count; });
}

std::string FakeRenderer::Leaks() const {
  const std::lock_guard<std::mutex> lock(mutex_);
  std::ostringstream text;
  if (!handles_.empty()) text << handles_.size() << " frames\n";
  for (const auto& [frame, count] : references_) {
    text << count << " references of " << frame.ToText() << "\n";
  }
  if (unanswered_ != 0) text << unanswered_ << " requests without callback\n";
  for (const std::string& mistake : mistakes_) text << mistake << "\n";
  return text.str();
}
