#include "platform/lapack/lapack.h"

#include <atomic>
#include <cstdlib>
#include <new>

extern "C" {
void dgesvd_(const char*, const char*, const int*, const int*, double*, const int*, double*,
             double*, const int*, double*, const int*, double*, const int*, int*, std::size_t,
             std::size_t);
void dgelss_(const int*, const int*, const int*, double*, const int*, double*, const int*, double*,
             const double*, int*, double*, const int*, int*);
void dgelsd_(const int*, const int*, const int*, double*, const int*, double*, const int*, double*,
             const double*, int*, double*, const int*, int*, int*);
void dpbtrf_(const char*, const int*, const int*, double*, const int*, int*, std::size_t);
void dpbtrs_(const char*, const int*, const int*, const int*, const double*, const int*, double*,
             const int*, int*, std::size_t);
void dsyevd_(const char*, const char*, const int*, double*, const int*, double*, double*,
             const int*, int*, const int*, int*, std::size_t, std::size_t);
void spotrf_(const char*, const int*, float*, const int*, int*, std::size_t);
void spotrs_(const char*, const int*, const int*, const float*, const int*, float*, const int*,
             int*, std::size_t);
void openblas_set_num_threads(int);
}

namespace lapack {

namespace {

constexpr std::size_t kBufferBytes = (std::size_t{32} << 22) + 4096;  // of OpenBLAS on this machine

std::atomic<int> under_way = 0;
std::atomic<int> had = 0;  // buffers that OpenBLAS has

}  // namespace

BlasCall::BlasCall() {
  static const bool once = [] {
    openblas_set_num_threads(1);
    return true;
  }();
  (void)once;
  const int now = ++under_way;
  int before = had;
  if (now <= before) return;
  void* const buffer = std::malloc(kBufferBytes);
  std::free(buffer);
  if (!buffer) {
    --under_way;
    throw std::bad_alloc();
  }
  while (now > before && !had.compare_exchange_weak(before, now)) {
  }
}

BlasCall::~BlasCall() {
  --under_way;
}

void dgesvd(const char* jobu, const char* jobvt, const int* m, const int* n, double* a,
            const int* lda, double* s, double* u, const int* ldu, double* vt, const int* ldvt,
            double* work, const int* lwork, int* info) {
  const BlasCall call;
  dgesvd_(jobu, jobvt, m, n, a, lda, s, u, ldu, vt, ldvt, work, lwork, info, 1, 1);
}

void dgelss(const int* m, const int* n, const int* nrhs, double* a, const int* lda, double* b,
            const int* ldb, double* s, const double* rcond, int* rank, double* work,
            const int* lwork, int* info) {
  const BlasCall call;
  dgelss_(m, n, nrhs, a, lda, b, ldb, s, rcond, rank, work, lwork, info);
}

void dgelsd(const int* m, const int* n, const int* nrhs, double* a, const int* lda, double* b,
            const int* ldb, double* s, const double* rcond, int* rank, double* work,
            const int* lwork, int* iwork, int* info) {
  const BlasCall call;
  dgelsd_(m, n, nrhs, a, lda, b, ldb, s, rcond, rank, work, lwork, iwork, info);
}

void dpbtrf(const char* uplo, const int* n, const int* kd, double* ab, const int* ldab, int* info) {
  const BlasCall call;
  dpbtrf_(uplo, n, kd, ab, ldab, info, 1);
}

void dpbtrs(const char* uplo, const int* n, const int* kd, const int* nrhs, const double* ab,
            const int* ldab, double* b, const int* ldb, int* info) {
  const BlasCall call;
  dpbtrs_(uplo, n, kd, nrhs, ab, ldab, b, ldb, info, 1);
}

void dsyevd(const char* jobz, const char* uplo, const int* n, double* a, const int* lda, double* w,
            double* work, const int* lwork, int* iwork, const int* liwork, int* info) {
  const BlasCall call;
  dsyevd_(jobz, uplo, n, a, lda, w, work, lwork, iwork, liwork, info, 1, 1);
}

void spotrf(const char* uplo, const int* n, float* a, const int* lda, int* info) {
  const BlasCall call;
  spotrf_(uplo, n, a, lda, info, 1);
}

void spotrs(const char* uplo, const int* n, const int* nrhs, const float* a, const int* lda,
            float* b, const int* ldb, int* info) {
  const BlasCall call;
  spotrs_(uplo, n, nrhs, a, lda, b, ldb, info, 1);
}

}  // namespace lapack
