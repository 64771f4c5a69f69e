#pragma once

#include <cstddef>
#include <vector>

namespace calmframe::host {

// How long a row of `size` floats must be for SymmetricSum to read or write it.
std::size_t PaddedForSum(std::size_t size);

// The sums kernel[0] taps[r][i] + sum over k of kernel[k] (taps[r - k][i] + taps[r + k][i]), r
// being the kernel's last index, for i < size; to `sums`, and something behind it up to the
// padding. The taps are 2 r + 1 rows, each readable up to its padding; they may overlap each other.
void SymmetricSum(const float* const* taps, const std::vector<float>& kernel, std::size_t size,
                  float* sums);

}  // namespace calmframe::host
