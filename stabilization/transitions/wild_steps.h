#pragma once

#include <cstdint>
#include <vector>

#include "stabilization/transitions/transition_smoother.h"

namespace marrow::stabilization {

// Makes the tracks' smoothness count less where they leave what the others do: a step from one
// frame to the next that ends r pixels off the similarity of that frame's steps, the one with the
// least sum of distances, weighs 1 up to r = sigma and less beyond, by Tukey's bisquare of the
// excess, (1 - ((r - sigma) / sigma)^2)^2, down to 0 from 2 sigma on. Where the median of r is
// larger it takes the place of sigma, so that half of the tracks hold each frame. Frames with fewer
// than kLeastSteps steps tell no wild one from the others and are left alone. A second difference
// has the weights of both its steps; data weights stay, as a sample by itself is nowhere wild.
// sigma: pixels, above 0.
void weigh_down_wild_steps(std::vector<smoothing_track>& tracks, std::int64_t frames, double sigma);

inline constexpr std::size_t kLeastSteps = 6;

}  // namespace marrow::stabilization
