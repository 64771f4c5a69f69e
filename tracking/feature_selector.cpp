#include "tracking/feature_selector.h"

#include <hwy/cache_control.h>

#include <algorithm>
#include <cmath>
#include <utility>

#include "platform/memory/large_pages.h"

namespace marrow::tracking {
namespace {

// Lengths in a damaged record may be anything; beyond this they mean "more than any image".
constexpr std::uint64_t kLongest = std::uint64_t{1} << 30;

// The image without a strip of `inset` pixels along each edge.
PixelRegion Inset(std::size_t width, std::size_t height, std::uint64_t inset_x,
                  std::uint64_t inset_y) {
  PixelRegion region{inset_x, inset_y, 0, 0};
  if (width > inset_x) region.x1 = width - inset_x;
  if (height > inset_y) region.y1 = height - inset_y;
  return region;
}

std::uint64_t AtLeastZero(std::uint64_t from, std::uint64_t taken) {
  return from > taken ? from - taken : 0;
}

}  // namespace

FeatureSelector::FeatureSelector(const SelectorParams& params) : params_(params) {
  params_.half_winx = std::min(params_.half_winx, kLongest);
  params_.half_winy = std::min(params_.half_winy, kLongest);
  params_.border = std::min(params_.border, kLongest);
}

void FeatureSelector::Configure(std::size_t width, std::size_t height) {
  width_ = width;
  height_ = height;
  // A longer distance covers the whole image from any pixel just as well.
  spacing_ = std::min<std::uint64_t>(params_.spacing, width + height);
  half_chords_.resize(spacing_ + 1);
  for (std::size_t dy = 0; dy <= spacing_; ++dy) {
    const double squared = static_cast<double>(spacing_ * spacing_ - dy * dy);
    half_chords_[dy] = static_cast<std::uint32_t>(std::sqrt(squared));
  }
  memory::ResizeOnLargePages(luma_, width * height);
  memory::ResizeOnLargePages(mask_, width * height);
  covered_stride_ = (width + 63) / 64;
  covered_.resize(covered_stride_ * height);

  // Gradients are taken on the image inset by the border less the window and 2 pixels of margin;
  // scores where the window, and one pixel more, fits into that.
  const std::uint64_t gradient_x = AtLeastZero(params_.border, params_.half_winx + 2);
  const std::uint64_t gradient_y = AtLeastZero(params_.border, params_.half_winy + 2);
  scoring_region_ =
      Inset(width, height, gradient_x + params_.half_winx + 1, gradient_y + params_.half_winy + 1);
  smoother_.reset();
  gradient_sums_.reset();
  if (scoring_region_.empty()) return;

  gradient_sums_ = std::make_unique<GradientSums>(params_.half_winx, params_.half_winy, width);
  score_rows_.resize(3 * FoldedStride(RowFolding{width}.positions() + 2));
  maxima_.reserve(width);
  std::vector<float> kernel = {1.0f};
  if (params_.presmoothing && params_.presmooth_factor > 0.0f) {
    const std::uint64_t longer = std::max(params_.half_winx, params_.half_winy);
    const double sigma = std::min(static_cast<double>(2 * longer + 1) * params_.presmooth_factor,
                                  static_cast<double>(std::max(width, height)));
    kernel = IntegratedGaussian(sigma);
  }
  const std::uint64_t radius = kernel.size() / 2;
  smoothing_region_ =
      Inset(width, height, AtLeastZero(gradient_x, radius), AtLeastZero(gradient_y, radius));
  smoother_ =
      std::make_unique<SeparableSmoother>(std::move(kernel), width, gradient_sums_->kept_rows());
}

void FeatureSelector::ComputeCandidates() {
  candidates.clear();
  const PixelRegion& region = scoring_region_;
  if (region.empty()) return;
  // A score's neighbours all lie in the scoring region, whose outermost pixels are never
  // candidates. Three rows of scores are kept, so each is still in the cache when it is compared.
  const float area = static_cast<float>((2 * params_.half_winx + 1) * (2 * params_.half_winy + 1));
  const float floor = params_.min_eig * area;  // what is under it is dropped, whatever is best
  const float highest_cap = params_.max_eig * area;
  const PixelRegion& smooth = smoothing_region_;
  smoother_->Start(luma_.data(), width_, smooth);
  const RowFolding& folding = smoother_->folding();
  gradient_sums_->Start([this](std::size_t y) { return smoother_->Row(y); }, folding.columns,
                        region.y0 - smooth.y0, region.y1 - region.y0);
  const std::size_t positions = folding.positions();
  const auto score_row = [&](std::size_t y) {
    return score_rows_.data() + y % 3 * (score_rows_.size() / 3) + RowFolding::kSegments;
  };
  float best = -100000.0f;
  std::size_t checked = 0;
  // Masks are looked at a row late: until then the cache has them.
  const auto check_masks = [&] {
    const auto masked = [this](const Candidate& c) { return mask_[c.pixel] == 0; };
    candidates.erase(std::remove_if(candidates.begin() + static_cast<std::ptrdiff_t>(checked),
                                    candidates.end(), masked),
                     candidates.end());
    for (; checked < candidates.size(); ++checked) best = std::max(best, candidates[checked].score);
  };
  for (std::size_t y = region.y0; y < region.y1; ++y) {
    gradient_sums_->NextScores(params_.eig_ratio_threshold, score_row(y));
    FillHalo(score_row(y), positions, 1, 0.0f, 0.0f);
    if (y < region.y0 + 2) continue;
    check_masks();
    // The best can only rise, and with it the limit.
    const float least =
        best < 0.0f ? floor : std::max(floor, params_.threshold * std::min(best, highest_cap));
    maxima_.clear();
    FindMaxima(score_row(y - 2), score_row(y - 1), score_row(y), folding, region.x0 - smooth.x0,
               region.x1 - smooth.x0 - 1, least, maxima_);
    for (const score_maximum& m : maxima_) {
      const std::size_t pixel = (y - 1) * width_ + smooth.x0 + m.column;
      hwy::Prefetch(&mask_[pixel]);
      candidates.push_back({static_cast<std::uint32_t>(pixel), m.score});
    }
  }
  check_masks();
  if (best < 0.0f) {
    candidates.clear();
    return;
  }

  const float cap = std::min(best, highest_cap);
  const float limit = std::max(params_.threshold * cap, floor);
  std::erase_if(candidates, [limit](const Candidate& c) { return c.score < limit; });
  std::sort(candidates.begin(), candidates.end(), [](const Candidate& a, const Candidate& b) {
    return a.score != b.score ? a.score > b.score : a.pixel < b.pixel;
  });
}

void FeatureSelector::SelectFirst() {
  SelectAvoiding(nullptr, 0);
}

void FeatureSelector::SelectAvoiding(const tracking_feature<float>* live_features,
                                     std::size_t count, std::size_t limit) {
  limit = static_cast<std::size_t>(std::min<std::uint64_t>(limit, params_.max_count));
  selected.clear();
  if (limit == 0) return;
  std::fill(covered_.begin(), covered_.end(), 0);
  for (std::size_t s = 0; s < count; ++s) {
    const auto& cell = live_features[s];
    if (cell.status >= 0) CoverDiscAroundFeature(cell.x, cell.y);
  }
  Select(limit);
}

void FeatureSelector::Select(std::size_t limit) {
  for (const Candidate& candidate : candidates) {
    const std::size_t column = candidate.pixel % width_;
    const std::size_t row = candidate.pixel / width_;
    if (covered_[row * covered_stride_ + column / 64] >> column % 64 & 1) continue;
    selected.push_back({static_cast<float>(column), static_cast<float>(row), candidate.score});
    if (selected.size() == limit) return;
    CoverDiscAroundCandidate(static_cast<std::int64_t>(column), static_cast<std::int64_t>(row));
  }
}

void FeatureSelector::CoverDiscAroundFeature(float x, float y) {
  if (!std::isfinite(x) || !std::isfinite(y)) return;
  const float radius = static_cast<float>(spacing_);
  // Clamped before the cast: a tracked position may lie anywhere.
  const float first_row = std::max(std::ceil(y - radius), 0.0f);
  const float last_row = std::min(std::floor(y + radius), static_cast<float>(height_) - 1.0f);
  if (!(first_row <= last_row)) return;
  for (auto row = static_cast<std::int64_t>(first_row); row <= static_cast<std::int64_t>(last_row);
       ++row) {
    const float dy = static_cast<float>(row) - y;
    const float chord = std::sqrt(std::max(radius * radius - dy * dy, 0.0f));
    const float first = std::max(std::ceil(x - chord), 0.0f);
    const float last = std::min(std::floor(x + chord), static_cast<float>(width_) - 1.0f);
    if (!(first <= last)) continue;
    CoverSpan(row, static_cast<std::int64_t>(first), static_cast<std::int64_t>(last));
  }
}

void FeatureSelector::CoverDiscAroundCandidate(std::int64_t column, std::int64_t row) {
  const auto radius = static_cast<std::int64_t>(spacing_);
  const std::int64_t first_row = std::max<std::int64_t>(row - radius, 0);
  const std::int64_t last_row = std::min(row + radius, static_cast<std::int64_t>(height_) - 1);
  for (std::int64_t y = first_row; y <= last_row; ++y) {
    const std::int64_t dy = y - row;
    const auto chord =
        static_cast<std::int64_t>(half_chords_[static_cast<std::size_t>(std::abs(dy))]);
    CoverSpan(y, std::max<std::int64_t>(column - chord, 0),
              std::min(column + chord, static_cast<std::int64_t>(width_) - 1));
  }
}

// Columns first to last, both included.
void FeatureSelector::CoverSpan(std::int64_t row, std::int64_t first, std::int64_t last) {
  std::uint64_t* words = covered_.data() + static_cast<std::size_t>(row) * covered_stride_;
  const std::int64_t last_word = last / 64;
  std::uint64_t bits = ~std::uint64_t{0} << first % 64;
  for (std::int64_t word = first / 64; word < last_word; ++word) {
    words[word] |= bits;
    bits = ~std::uint64_t{0};
  }
  words[last_word] |= bits & ~std::uint64_t{0} >> (63 - last % 64);
}

}  // namespace marrow::tracking
