#pragma once

#include <cstddef>
#include <vector>

// The LAPACK routines that the system uses, with LAPACK's own names, argument order and
// conventions: column-major, all arguments by pointer, info 0 on success (Anderson et al., LAPACK
// Users' Guide, 3rd ed., 1999). Each throws std::bad_alloc where the BLAS beneath has no memory.
namespace lapack {

// Stands around every call of BLAS.
//
// Matrices here are small, solves run beside renders that use every processor, and a result must
// not depend on the number of processors: so BLAS starts no threads of its own.
//
// OpenBLAS takes a buffer for each call that is under way, keeps it for later ones, and where there
// is no memory for it asks again for ever. So throws std::bad_alloc where there is none.
class BlasCall {
 public:
  BlasCall();
  ~BlasCall();
  BlasCall(const BlasCall&) = delete;
  BlasCall& operator=(const BlasCall&) = delete;
};

// Singular value decomposition A = U diag(s) V'. A is destroyed.
void dgesvd(const char* jobu, const char* jobvt, const int* m, const int* n, double* a,
            const int* lda, double* s, double* u, const int* ldu, double* vt, const int* ldvt,
            double* work, const int* lwork, int* info);

// Minimum-norm least squares by SVD; rcond < 0 takes machine precision for the rank. A is
// destroyed, b has ldb >= max(m, n) and receives the solution.
void dgelss(const int* m, const int* n, const int* nrhs, double* a, const int* lda, double* b,
            const int* ldb, double* s, const double* rcond, int* rank, double* work,
            const int* lwork, int* info);

// As dgelss, by divide and conquer, with an integer workspace.
void dgelsd(const int* m, const int* n, const int* nrhs, double* a, const int* lda, double* b,
            const int* ldb, double* s, const double* rcond, int* rank, double* work,
            const int* lwork, int* iwork, int* info);

// Cholesky factorization of a band matrix (n columns, kd off-diagonals) and the solve with it.
void dpbtrf(const char* uplo, const int* n, const int* kd, double* ab, const int* ldab, int* info);
void dpbtrs(const char* uplo, const int* n, const int* kd, const int* nrhs, const double* ab,
            const int* ldab, double* b, const int* ldb, int* info);

// Eigenvalues, ascending, and vectors (jobz 'V') of a symmetric matrix, by divide and conquer. A
// receives the vectors.
void dsyevd(const char* jobz, const char* uplo, const int* n, double* a, const int* lda, double* w,
            double* work, const int* lwork, int* iwork, const int* liwork, int* info);

// Cholesky factorization of a symmetric positive definite matrix and the solve with it, single
// precision.
void spotrf(const char* uplo, const int* n, float* a, const int* lda, int* info);
void spotrs(const char* uplo, const int* n, const int* nrhs, const float* a, const int* lda,
            float* b, const int* ldb, int* info);

}  // namespace lapack
