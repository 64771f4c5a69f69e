#pragma once

#include <cstdint>

// Direct solution of A x = b for sparse symmetric positive definite A, in the calls of the closed
// solver that the system was designed on: create, define the structure, reorder, then any number of
// factor and solve with that structure, delete. Every call returns 0 on success. A handle serves
// one thread at a time.

using DssHandle = struct DssSolver*;
using DssInt = std::int32_t;

inline constexpr DssInt MKL_DSS_SUCCESS = 0;
inline constexpr DssInt MKL_DSS_STATE_ERR = -3;
inline constexpr DssInt MKL_DSS_OUT_OF_MEMORY = -6;
inline constexpr DssInt MKL_DSS_INVALID_OPTION = -1;
inline constexpr DssInt MKL_DSS_STRUCTURE_ERR = -4;
inline constexpr DssInt MKL_DSS_NOT_POSITIVE_DEFINITE = -18;
inline constexpr DssInt MKL_DSS_FAILURE = -10;

inline constexpr std::uint32_t MKL_DSS_DEFAULTS =
    0xC0000033;  // message level info, termination level fatal
inline constexpr std::uint32_t MKL_DSS_SYMMETRIC = 0x20000040;
inline constexpr std::uint32_t MKL_DSS_POSITIVE_DEFINITE = 0x08000040;

DssInt dss_create(DssHandle& handle, std::uint32_t options);

// The upper triangle by rows, one-based: row_starts has rows + 1 entries, columns ascend within a
// row, and every diagonal entry is present (its value may be zero). The arrays are copied. rows
// must equal columns_count.
DssInt dss_define_structure(DssHandle handle, std::uint32_t options, const DssInt* row_starts,
                            DssInt rows, DssInt columns_count, const DssInt* columns,
                            DssInt nonzeros);

// Fill-reducing ordering and symbolic analysis. permutation is null: the ordering is the solver's
// own.
DssInt dss_reorder(DssHandle handle, std::uint32_t options, const DssInt* permutation);

// Numeric factorization of the values, in the order of columns. MKL_DSS_NOT_POSITIVE_DEFINITE when
// a pivot is not positive, NaN included.
DssInt dss_factor_real(DssHandle handle, std::uint32_t options, const double* values);

// Solves for right_hand_sides columns of length rows, one after the other; b and x may not overlap.
DssInt dss_solve_real(DssHandle handle, std::uint32_t options, const double* b,
                      DssInt right_hand_sides, double* x);

// Frees the handle and sets it to null.
DssInt dss_delete(DssHandle& handle, std::uint32_t options);
