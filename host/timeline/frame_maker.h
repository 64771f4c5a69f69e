#pragma once

#include <boost/shared_ptr.hpp>
#include <condition_variable>
#include <cstddef>
#include <cstdint>
#include <map>
#include <mutex>
#include <string>

#include "host/timeline/frame_cache.h"
#include "host/timeline/node_graph.h"

namespace calmframe::host {

// What a node delivers: a picture, at a size, in a depth.
struct FrameRequest {
  GraphNode node;
  PictureNumber picture;
  PixelKind kind = PixelKind::argb8;
  int width = 0, height = 0;
};

// Names the frame, and in its last four bytes whose it is, the lowest first: equal for equal
// requests and numbers, in every process.
tessel::utility::Guid IdentifierOf(const FrameRequest& request, std::uint32_t number);
std::uint32_t NumberOf(const tessel::utility::Guid& identifier);

// How a new frame lies in memory.
struct FrameLayout {
  std::ptrdiff_t padding = 0;  // bytes behind each row
  bool top_down = true;
};

// Makes the frames of the nodes and puts them into the cache. Any thread; two that want one frame
// at the same time get it from one making.
class FrameMaker {
 public:
  // `number`: of the identifiers of its frames.
  FrameMaker(FrameCache& cache, std::uint32_t number)
      : number_(number), cache_(cache), pool_(PicturePool::Make()) {}

  // Under which the frame stands in the cache.
  tessel::utility::Guid Identifier(const FrameRequest& request) const {
    return IdentifierOf(request, number_);
  }

  // From the cache, else made on this thread. Null where the media has no such frame, and on a
  // failure; std::bad_alloc without memory.
  PicturePtr Get(const FrameRequest& request, const FrameLayout& layout);

  boost::shared_ptr<Picture> Copy(const Picture& picture, const FrameLayout& layout);

  // The first failure's line; empty when there was none.
  std::string failure() const;

 private:
  struct Making {
    bool done = false, out_of_memory = false;
    PicturePtr picture;
  };
  PicturePtr Make(const FrameRequest& request, const FrameLayout& layout);
  void Keep(const char* line) noexcept;

  const std::uint32_t number_;
  FrameCache& cache_;
  const boost::shared_ptr<PicturePool> pool_;
  mutable std::mutex mutex_;
  std::condition_variable made_;
  std::map<tessel::utility::Guid, boost::shared_ptr<Making>> makings_;  // guarded by mutex_
  std::string failure_;                                                 // guarded by mutex_
};

}  // namespace calmframe::host
