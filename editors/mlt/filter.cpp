#include "editors/mlt/filter.h"

#include <atomic>
#include <condition_variable>
#include <filesystem>
#include <memory>
#include <mutex>
#include <new>
#include <optional>
#include <thread>
#include <utility>

#include "editors/mlt/clip_identity.h"
#include "editors/mlt/results_place.h"
#include "editors/mlt/steadier.h"

namespace calmframe::mlt {
namespace {

// What a filter has beside its properties. `analyze` and the results decide for each frame which
// pass it is of. Calls come from MLT's frame threads.
class FilterState {
 public:
  explicit FilterState(mlt_filter filter) : filter_(filter) {}
  ~FilterState() { stops_ = true; }
  FilterState(const FilterState&) = delete;
  FilterState& operator=(const FilterState&) = delete;

  int GetImage(mlt_frame frame, std::uint8_t** image, mlt_image_format* format, int* width,
               int* height, int writable);

 private:
  struct Place {
    std::int64_t source_frame;   // of the producer, at the profile's rate
    std::int64_t number, count;  // of what the filter lies on
  };

  mlt_properties properties() const { return MLT_FILTER_PROPERTIES(filter_); }
  std::string Text(const char* name) const {
    const char* const text = mlt_properties_get(properties(), name);
    return text ? text : "";
  }
  Place PlaceOf(mlt_frame frame) const;
  ClipFrames FramesOf(mlt_frame frame, const mlt_profile_s& profile) const;

  int Analyse(mlt_frame frame, std::uint8_t** image, mlt_image_format* format, int* width,
              int* height, int writable);
  int Steady(mlt_frame frame, std::uint8_t** image, mlt_image_format* format, int* width,
             int* height, int writable);
  // Null where there is nothing to steady with, and the picture stays.
  std::shared_ptr<Steadier> SteadierFor(mlt_frame frame, const mlt_profile_s& profile);
  // Gives back the thread before, which is through but for telling others.
  std::jthread SolveInBackground(const SteadyRequest& request, std::vector<PictureKind> kinds);

  // Into the log, once, and the property "error"; empty: all is well.
  void Tell(const std::string& line);

  const mlt_filter filter_;
  std::atomic<bool> stops_{false};
  std::mutex telling_;
  std::mutex mutex_;  // guards all below
  std::condition_variable made_;
  std::shared_ptr<Analysis> analysis_;
  bool analysis_failed_ = false;
  std::shared_ptr<Steadier> steadier_;
  std::optional<SteadyRequest> making_, refused_;
  std::jthread solving_;  // last: it uses all of the above
};

FilterState::Place FilterState::PlaceOf(mlt_frame frame) const {
  return {mlt_frame_original_position(frame), mlt_filter_get_position(filter_, frame),
          mlt_filter_get_length2(filter_, frame)};
}

ClipFrames FilterState::FramesOf(mlt_frame frame, const mlt_profile_s& profile) const {
  ClipFrames frames;
  frames.identity = IdentityOf(mlt_frame_get_original_producer(frame));
  frames.width = profile.width;
  frames.height = profile.height;
  frames.aspect_num = profile.sample_aspect_num;
  frames.aspect_den = profile.sample_aspect_den;
  frames.rate_num = profile.frame_rate_num;
  frames.rate_den = profile.frame_rate_den;
  return frames;
}

void FilterState::Tell(const std::string& line) {
  const std::lock_guard lock(telling_);
  if (Text("error") == line) return;
  mlt_properties_set(properties(), "error", line.c_str());
  if (!line.empty()) mlt_log_error(MLT_FILTER_SERVICE(filter_), "%s\n", line.c_str());
}

PictureKind KindOf(mlt_frame frame, mlt_image_format format) {
  const mlt_properties properties = MLT_FRAME_PROPERTIES(frame);
  return {format, mlt_properties_get_int(properties, "colorspace"),
          mlt_properties_get_int(properties, "full_range") != 0};
}

// Not the planar 4:2:0 that a file may have: MLT's producer gives other pixels for it.
mlt_image_format FormatToAnalyse(mlt_frame frame) {
  const mlt_producer producer = mlt_frame_get_original_producer(frame);
  const char* const name =
      producer ? mlt_properties_get(MLT_PRODUCER_PROPERTIES(mlt_producer_cut_parent(producer)),
                                    "meta.media.0.codec.pix_fmt")
               : nullptr;
  const std::string stored = name ? name : "";
  return stored.starts_with("yuv") || stored.starts_with("nv") ? mlt_image_yuv422 : mlt_image_rgba;
}

// The frame's picture in a format that can be worked and at a size, scaled where nothing before
// has done so. 0, or MLT's code.
int GetSized(mlt_frame frame, mlt_image_format* format, int width, int height,
             std::uint8_t** image) {
  int w = width, h = height;
  // Of interlaced clips whole frames, in both passes.
  mlt_properties_set_int(MLT_FRAME_PROPERTIES(frame), "consumer.progressive", 1);
  if (const int code = mlt_frame_get_image(frame, image, format, &w, &h, 1)) return code;
  const mlt_image_format worked = WorkedFormat(*format);
  if (worked != *format && frame->convert_image) {
    if (const int code = frame->convert_image(frame, image, format, worked)) return code;
  }
  if (w == width && h == height) return 0;
  PoolImage scaled(*format, width, height);
  Scale(*format, w, h, *image, width, height, scaled.data());
  *image = scaled.GiveTo(frame);
  return 0;
}

int FilterState::GetImage(mlt_frame frame, std::uint8_t** image, mlt_image_format* format,
                          int* width, int* height, int writable) {
  const bool is_asked_for = *format != mlt_image_none;
  if (is_asked_for && (*width <= 0 || *height <= 0)) {  // a consumer that takes any size
    const mlt_profile profile = mlt_service_profile(MLT_FILTER_SERVICE(filter_));
    *width = profile->width;
    *height = profile->height;
  }
  if (is_asked_for && mlt_properties_get_int(properties(), "analyze") != 0) {
    return Analyse(frame, image, format, width, height, writable);
  }
  if (is_asked_for) {  // an analysis that nobody wants any more has left nothing
    const std::lock_guard lock(mutex_);
    analysis_.reset();
    analysis_failed_ = false;
  }
  if (is_asked_for && !Text("results").empty()) {
    return Steady(frame, image, format, width, height, writable);
  }
  return mlt_frame_get_image(frame, image, format, width, height, writable);
}

int FilterState::Analyse(mlt_frame frame, std::uint8_t** image, mlt_image_format* format,
                         int* width, int* height, int writable) {
  const mlt_profile profile = mlt_service_profile(MLT_FILTER_SERVICE(filter_));
  const Place place = PlaceOf(frame);
  std::shared_ptr<Analysis> analysis;
  int code = 0;
  try {
    mlt_image_format worked = FormatToAnalyse(frame);
    code = GetSized(frame, &worked, profile->width, profile->height, image);
    if (code) return code;
    {
      const std::lock_guard lock(mutex_);
      const bool begins_anew = analysis_ && !analysis_failed_ && analysis_->next() > 1;
      if (place.number == 0 && (!analysis_ || begins_anew) && !analysis_failed_) {
        analysis_ = std::make_shared<Analysis>(FramesOf(frame, *profile), KindOf(frame, worked),
                                               ReadAnalysisControls(properties()),
                                               place.source_frame, place.count);
      }
      if (!analysis_failed_) analysis = analysis_;
    }
    if (analysis) {
      const SessionImage picture(worked, profile->width, profile->height, *image);
      if (analysis->Push(place.source_frame, picture.image())) {
        ResultsPlace results{Text("filename"), analysis->first()};
        std::string path = results.path;
        if (path.empty()) {
          const std::string folder = ResultsFolder();
          std::filesystem::create_directories(folder);
          results.path =
              ResultsName(PathOf(mlt_frame_get_original_producer(frame)), FramesOf(frame, *profile),
                          ReadAnalysisControls(properties()), analysis->first(), place.count);
          path = folder + '/' + results.path;
        }
        analysis->Save(path);
        mlt_properties_set(properties(), "results", TextOf(results).c_str());
        mlt_properties_set_int(properties(), "analyze", 0);
        const std::lock_guard lock(mutex_);
        analysis_.reset();
        steadier_.reset();
        refused_.reset();
        Tell("");
      }
    }
    // As it was asked for, and as nothing had been done.
    if (*format != worked && frame->convert_image) {
      code = frame->convert_image(frame, image, &worked, *format);
    }
    *format = worked;
    if (*width != profile->width || *height != profile->height) {
      PoolImage scaled(worked, *width, *height);
      Scale(worked, profile->width, profile->height, *image, *width, *height, scaled.data());
      *image = scaled.GiveTo(frame);
    }
    return code;
  } catch (const std::exception& failure) {
    Tell(failure.what());
    const std::lock_guard lock(mutex_);
    analysis_failed_ = true;
  }
  return mlt_frame_get_image(frame, image, format, width, height, writable);
}

std::jthread FilterState::SolveInBackground(const SteadyRequest& request,
                                            std::vector<PictureKind> kinds) {
  return std::exchange(solving_, std::jthread([this, request, kinds = std::move(kinds)] {
                         std::shared_ptr<Steadier> made;
                         try {
                           made = std::make_shared<Steadier>(request, kinds, stops_);
                           Tell("");
                         } catch (const std::exception& failure) {
                           if (!stops_) Tell(failure.what());
                         }
                         {
                           const std::lock_guard lock(mutex_);
                           if (made) {
                             steadier_ = made;
                             refused_.reset();
                           } else {
                             refused_ = request;
                           }
                           making_.reset();
                           made_.notify_all();
                         }
                         // Whoever shows the clip asks for its frames anew.
                         if (made && !stops_) {
                           mlt_events_fire(properties(), "property-changed",
                                           mlt_event_data_from_string("results"));
                         }
                       }));
}

std::shared_ptr<Steadier> FilterState::SteadierFor(mlt_frame frame, const mlt_profile_s& profile) {
  SteadyRequest request;
  const ResultsPlace results = ResultsPlaceFrom(Text("results"));
  request.results = FindResults(results.path, PathOf(mlt_frame_get_original_producer(frame)));
  request.first = results.first;
  request.controls = ReadSolveControls(properties());
  request.identity = IdentityOf(mlt_frame_get_original_producer(frame));
  request.rate_num = profile.frame_rate_num;
  request.rate_den = profile.frame_rate_den;
  request.display_num = profile.display_aspect_num;
  request.display_den = profile.display_aspect_den;
  std::jthread ended;  // joined unlocked
  std::unique_lock lock(mutex_);
  // The first time the frame waits, for there is nothing else to show; later the one that stands
  // goes on while another is solved.
  while (true) {
    const bool is_same_work = steadier_ && steadier_->request().results == request.results &&
                              steadier_->request().identity == request.identity;
    if (steadier_ && steadier_->request() == request) return steadier_;
    if (refused_ == request) return is_same_work ? steadier_ : nullptr;
    if (!making_) {
      making_ = request;
      ended = SolveInBackground(request,
                                is_same_work ? steadier_->kinds() : std::vector<PictureKind>());
    }
    if (is_same_work) return steadier_;
    made_.wait(lock);
  }
}

int FilterState::Steady(mlt_frame frame, std::uint8_t** image, mlt_image_format* format, int* width,
                        int* height, int writable) {
  const mlt_profile profile = mlt_service_profile(MLT_FILTER_SERVICE(filter_));
  const Place place = PlaceOf(frame);
  try {
    const std::shared_ptr<Steadier> steadier = SteadierFor(frame, *profile);
    if (steadier && steadier->has(place.source_frame)) {
      const int asked_width = *width, asked_height = *height;
      const int w = steadier->width(), h = steadier->height();
      mlt_image_format worked = WorkedFormat(*format);
      if (const int code = GetSized(frame, &worked, w, h, image)) return code;
      PoolImage drawn(worked, w, h);
      const SessionImage from(worked, w, h, *image);
      SessionImage to(worked, w, h, drawn.data());
      steadier->Draw(place.source_frame, KindOf(frame, worked), from.image(), to.image());
      to.Finish();
      if (asked_width != w || asked_height != h) {
        PoolImage scaled(worked, asked_width, asked_height);
        Scale(worked, w, h, drawn.data(), asked_width, asked_height, scaled.data());
        *image = scaled.GiveTo(frame);
      } else {
        *image = drawn.GiveTo(frame);
      }
      *format = worked;
      return 0;
    }
    if (steadier) {
      Tell("source frame " + std::to_string(place.source_frame) +
           " was not analysed and stays as it was");
    }
  } catch (const std::exception& failure) {
    Tell(failure.what());
  }
  return mlt_frame_get_image(frame, image, format, width, height, writable);
}

int GetImage(mlt_frame frame, std::uint8_t** image, mlt_image_format* format, int* width,
             int* height, int writable) {
  const auto filter = static_cast<mlt_filter>(mlt_frame_pop_service(frame));
  return static_cast<FilterState*>(filter->child)
      ->GetImage(frame, image, format, width, height, writable);
}

mlt_frame Process(mlt_filter filter, mlt_frame frame) {
  mlt_frame_push_service(frame, filter);
  mlt_frame_push_get_image(frame, GetImage);
  return frame;
}

void Close(mlt_filter filter) {
  delete static_cast<FilterState*>(filter->child);
  filter->child = nullptr;
  filter->close = nullptr;
  filter->parent.close = nullptr;
  mlt_service_close(&filter->parent);
}

}  // namespace

mlt_filter MakeFilter() {
  const mlt_filter filter = mlt_filter_new();
  if (!filter) return nullptr;
  try {
    filter->child = new FilterState(filter);
  } catch (const std::bad_alloc&) {
    mlt_filter_close(filter);
    return nullptr;
  }
  filter->process = Process;
  filter->close = Close;
  return filter;
}

}  // namespace calmframe::mlt
