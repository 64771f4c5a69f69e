#include "platform/dss/dss.h"

#include <cholmod.h>

#include <cmath>
#include <cstring>
#include <new>

// CHOLMOD keeps matrices by columns. The upper triangle by rows is the lower triangle by columns of
// the same symmetric matrix, so the arrays are taken as they stand, less the one of their base.
struct DssSolver {
  cholmod_common common;
  cholmod_sparse* matrix = nullptr;
  cholmod_factor* factor = nullptr;
  bool factored = false;
  // Scratch of the solve, kept between calls.
  cholmod_dense* solution = nullptr;
  cholmod_dense* y = nullptr;
  cholmod_dense* e = nullptr;

  DssSolver() {
    cholmod_start(&common);
    common.print = 0;
    // The supernodal loops start a team of threads of their own for each thread that solves,
    // whatever OpenMP is told; the systems here are narrow bands that gain nothing from it.
    common.supernodal = CHOLMOD_SIMPLICIAL;
    common.final_ll = 1;  // never LDL': a negative pivot must be a failure
    common.quick_return_if_not_posdef = 1;
  }
  ~DssSolver() {
    cholmod_free_dense(&solution, &common);
    cholmod_free_dense(&y, &common);
    cholmod_free_dense(&e, &common);
    cholmod_free_factor(&factor, &common);
    cholmod_free_sparse(&matrix, &common);
    cholmod_finish(&common);
  }
};

namespace {

DssInt Status(const cholmod_common& common) {
  if (common.status == CHOLMOD_OUT_OF_MEMORY || common.status == CHOLMOD_TOO_LARGE) {
    return MKL_DSS_OUT_OF_MEMORY;
  }
  return common.status < CHOLMOD_OK ? MKL_DSS_FAILURE : MKL_DSS_SUCCESS;
}

// CHOLMOD's own test for a non-positive pivot lets NaN through.
bool DiagonalIsPositive(const cholmod_factor& factor) {
  const auto* starts = static_cast<const int*>(factor.p);  // a column begins with its diagonal
  const auto* x = static_cast<const double*>(factor.x);
  for (std::size_t column = 0; column < factor.n; ++column) {
    const double pivot = x[starts[column]];
    if (!(pivot > 0.0) || !std::isfinite(pivot)) return false;
  }
  return true;
}

}  // namespace

DssInt dss_create(DssHandle& handle, std::uint32_t) {
  handle = new (std::nothrow) DssSolver;
  return handle ? MKL_DSS_SUCCESS : MKL_DSS_OUT_OF_MEMORY;
}

DssInt dss_define_structure(DssHandle handle, std::uint32_t options, const DssInt* row_starts,
                            DssInt rows, DssInt columns_count, const DssInt* columns,
                            DssInt nonzeros) {
  if (!handle) return MKL_DSS_STATE_ERR;
  if (options != MKL_DSS_SYMMETRIC) return MKL_DSS_INVALID_OPTION;
  if (rows != columns_count || rows < 1 || row_starts[0] != 1 || row_starts[rows] - 1 != nonzeros) {
    return MKL_DSS_STRUCTURE_ERR;
  }
  cholmod_free_factor(&handle->factor, &handle->common);
  cholmod_free_sparse(&handle->matrix, &handle->common);
  handle->factored = false;
  handle->matrix = cholmod_allocate_sparse(
      static_cast<std::size_t>(rows), static_cast<std::size_t>(rows),
      static_cast<std::size_t>(nonzeros), 1, 1, -1, CHOLMOD_REAL, &handle->common);
  if (!handle->matrix) return MKL_DSS_OUT_OF_MEMORY;
  auto* starts = static_cast<int*>(handle->matrix->p);
  auto* indices = static_cast<int*>(handle->matrix->i);
  for (DssInt r = 0; r <= rows; ++r) starts[r] = row_starts[r] - 1;
  for (DssInt r = 0; r < rows; ++r) {
    if (starts[r + 1] <= starts[r] || columns[starts[r]] != r + 1) return MKL_DSS_STRUCTURE_ERR;
    for (int k = starts[r]; k < starts[r + 1]; ++k) {
      indices[k] = columns[k] - 1;
      if (indices[k] >= rows || (k > starts[r] && indices[k] <= indices[k - 1])) {
        return MKL_DSS_STRUCTURE_ERR;
      }
    }
  }
  return MKL_DSS_SUCCESS;
}

DssInt dss_reorder(DssHandle handle, std::uint32_t, const DssInt* permutation) {
  if (!handle || !handle->matrix) return MKL_DSS_STATE_ERR;
  if (permutation) return MKL_DSS_INVALID_OPTION;
  cholmod_free_factor(&handle->factor, &handle->common);
  handle->factored = false;
  handle->factor = cholmod_analyze(handle->matrix, &handle->common);
  return handle->factor ? MKL_DSS_SUCCESS : Status(handle->common);
}

DssInt dss_factor_real(DssHandle handle, std::uint32_t options, const double* values) {
  if (!handle || !handle->factor) return MKL_DSS_STATE_ERR;
  if (options != MKL_DSS_POSITIVE_DEFINITE) return MKL_DSS_INVALID_OPTION;
  const std::size_t nonzeros = handle->matrix->nzmax;
  std::memcpy(handle->matrix->x, values, nonzeros * sizeof(double));
  handle->factored = false;
  handle->common.status = CHOLMOD_OK;
  cholmod_factorize(handle->matrix, handle->factor, &handle->common);
  if (handle->common.status == CHOLMOD_NOT_POSDEF) return MKL_DSS_NOT_POSITIVE_DEFINITE;
  if (const DssInt status = Status(handle->common)) return status;
  if (!DiagonalIsPositive(*handle->factor)) return MKL_DSS_NOT_POSITIVE_DEFINITE;
  handle->factored = true;
  return MKL_DSS_SUCCESS;
}

DssInt dss_solve_real(DssHandle handle, std::uint32_t, const double* b, DssInt right_hand_sides,
                      double* x) {
  if (!handle || !handle->factored) return MKL_DSS_STATE_ERR;
  const std::size_t rows = handle->matrix->nrow;
  const std::size_t columns = static_cast<std::size_t>(right_hand_sides);
  cholmod_dense right = {};
  right.nrow = rows;
  right.ncol = columns;
  right.nzmax = rows * columns;
  right.d = rows;
  right.x = const_cast<double*>(b);
  right.xtype = CHOLMOD_REAL;
  right.dtype = CHOLMOD_DOUBLE;
  if (!cholmod_solve2(CHOLMOD_A, handle->factor, &right, nullptr, &handle->solution, nullptr,
                      &handle->y, &handle->e, &handle->common)) {
    return Status(handle->common);
  }
  std::memcpy(x, handle->solution->x, rows * columns * sizeof(double));
  return MKL_DSS_SUCCESS;
}

DssInt dss_delete(DssHandle& handle, std::uint32_t) {
  delete handle;
  handle = nullptr;
  return MKL_DSS_SUCCESS;
}
