#include "host/stabilize/window/band_programme.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <utility>

namespace calmframe::host {
namespace {

constexpr int kMostSteps = 80;
constexpr double kGap = 1e-7;       // of a complementary pair, in the charges' unit
constexpr double kTowards = 0.995;  // of the way to the next bound that a step may go

// Symmetric positive definite, lower triangle by columns. Its own Cholesky factorization (Golub and
// Van Loan, Matrix Computations, 4th ed., 4.3.5): a BLAS takes more memory when it is loaded than
// all else that a program has before its first clip.
class BandMatrix {
 public:
  explicit BandMatrix(int n) : columns_(static_cast<std::size_t>(n)) {}

  void Clear(double diagonal) {
    for (Column& column : columns_) {
      column.fill(0.0);
      column[0] = diagonal;
    }
  }
  void AddSquare(const BandRow& row, const double* coefficients, double weight) {
    for (int j = 0; j < row.count; ++j) {
      const double factor = weight * coefficients[j];
      if (factor == 0) continue;
      Column& column = columns_[row.first + j];
      for (int i = j; i < row.count; ++i) column[i - j] += factor * coefficients[i];
    }
  }
  // Destroys the matrix. False where it is not positive definite in this precision.
  bool Factorize() {
    for (std::size_t j = 0; j < columns_.size(); ++j) {
      Column& column = columns_[j];
      if (!(column[0] > 0)) return false;
      const double root = std::sqrt(column[0]);
      column[0] = root;
      for (std::size_t i = 1; i < column.size(); ++i) column[i] /= root;
      const std::size_t below = Below(j);
      for (std::size_t k = 1; k <= below; ++k) {
        Column& other = columns_[j + k];
        for (std::size_t i = k; i < column.size(); ++i) other[i - k] -= column[k] * column[i];
      }
    }
    return true;
  }
  void SolveInPlace(std::vector<double>& b) const {
    for (std::size_t j = 0; j < columns_.size(); ++j) {
      b[j] /= columns_[j][0];
      for (std::size_t i = 1; i <= Below(j); ++i) b[j + i] -= columns_[j][i] * b[j];
    }
    for (std::size_t j = columns_.size(); j-- > 0;) {
      for (std::size_t i = 1; i <= Below(j); ++i) b[j] -= columns_[j][i] * b[j + i];
      b[j] /= columns_[j][0];
    }
  }

 private:
  using Column = std::array<double, BandRow::kMost>;
  std::size_t Below(std::size_t column) const {
    return std::min<std::size_t>(BandRow::kMost - 1, columns_.size() - 1 - column);
  }

  std::vector<Column> columns_;
};

// A bound: slack >= 0 and its multiplier >= 0, whose product goes to 0; both above 0 on the way.
struct Pair {
  double slack = 1, multiplier = 1;
  double slack_step = 0, multiplier_step = 0;
  double missing = 0;  // what the bound's equation lacks
  double product = 0;  // what the linearised product is to become

  double ratio() const { return multiplier / slack; }
  // The multiplier's step for a slack that steps by `missing` alone.
  double force() const { return product / slack - ratio() * missing; }
};

class InteriorPoint {
 public:
  InteriorPoint(const BandProgramme& programme, std::vector<double> start)
      : p_(programme),
        z_(std::move(start)),
        step_(z_.size()),
        above_(p_.charges.size()),
        below_(p_.charges.size()),
        size_(p_.charges.size()),
        size_step_(p_.charges.size()),
        bounds_(p_.limits.size()),
        matrix_(p_.unknowns) {
    for (std::size_t i = 0; i < size_.size(); ++i) {
      const double residual = Residual(i);
      size_[i] = std::abs(residual) + 1;
      above_[i].slack = size_[i] - residual;
      below_[i].slack = size_[i] + residual;
      above_[i].multiplier = below_[i].multiplier = p_.charges[i].weight / 2;
    }
    for (std::size_t j = 0; j < bounds_.size(); ++j) {
      bounds_[j].slack = std::max(p_.limits[j].limit - Dot(p_.limits[j].row, z_), 1.0);
    }
  }

  std::vector<double> Run() {
    for (int steps = 0; steps < kMostSteps; ++steps) {
      SetMissing();
      const double gap = Gap();
      if (gap < kGap && most_missing_ < kGap) break;
      if (!Factorize()) break;
      // The predictor goes for the optimum and finds out how far that is.
      SetProducts([](const Pair& pair) { return -pair.slack * pair.multiplier; });
      FindSteps();
      const double reach = Reach();
      const double predicted = GapAfter(reach);
      const double ratio = gap > 0 ? predicted / gap : 0;
      const double centre = ratio * ratio * ratio * gap;
      SetProducts([centre](const Pair& pair) {
        return centre - pair.slack * pair.multiplier - pair.slack_step * pair.multiplier_step;
      });
      FindSteps();
      Go(std::min(1.0, kTowards * Reach()));
    }
    return z_;
  }

 private:
  double Dot(const BandRow& row, const std::vector<double>& z) const {
    const double* const coefficients = p_.Of(row);
    double sum = 0;
    for (int i = 0; i < row.count; ++i) sum += coefficients[i] * z[row.first + i];
    return sum;
  }
  void AddTo(std::vector<double>& z, const BandRow& row, double factor) const {
    const double* const coefficients = p_.Of(row);
    for (int i = 0; i < row.count; ++i) z[row.first + i] += factor * coefficients[i];
  }
  double Residual(std::size_t i) const { return Dot(p_.charges[i].row, z_) - p_.charges[i].target; }

  template <class Visit>
  void ForPairs(const Visit& visit) {
    for (Pair& pair : above_) visit(pair);
    for (Pair& pair : below_) visit(pair);
    for (Pair& pair : bounds_) visit(pair);
  }

  void SetMissing() {
    most_missing_ = 0;
    // Gradient of the Lagrangian, to be taken off.
    gradient_.assign(z_.size(), 0.0);
    for (std::size_t k = 0; k < z_.size(); ++k) gradient_[k] = -p_.linear[k] - p_.tether * z_[k];
    unbalanced_.resize(size_.size());
    for (std::size_t i = 0; i < size_.size(); ++i) {
      const double residual = Residual(i);
      above_[i].missing = -(residual - size_[i] + above_[i].slack);
      below_[i].missing = -(-residual - size_[i] + below_[i].slack);
      unbalanced_[i] = p_.charges[i].weight - above_[i].multiplier - below_[i].multiplier;
      AddTo(gradient_, p_.charges[i].row, below_[i].multiplier - above_[i].multiplier);
    }
    for (std::size_t j = 0; j < bounds_.size(); ++j) {
      bounds_[j].missing = p_.limits[j].limit - Dot(p_.limits[j].row, z_) - bounds_[j].slack;
      most_missing_ = std::max(most_missing_, std::abs(bounds_[j].missing));
      AddTo(gradient_, p_.limits[j].row, -bounds_[j].multiplier);
    }
  }

  double Gap() {
    double sum = 0;
    ForPairs([&](const Pair& pair) { sum += pair.slack * pair.multiplier; });
    return sum / PairCount();
  }
  double GapAfter(double reach) {
    double sum = 0;
    ForPairs([&](const Pair& pair) {
      sum +=
          (pair.slack + reach * pair.slack_step) * (pair.multiplier + reach * pair.multiplier_step);
    });
    return sum / PairCount();
  }
  double PairCount() const {
    return std::max(1.0, static_cast<double>(2 * above_.size() + bounds_.size()));
  }

  bool Factorize() {
    matrix_.Clear(p_.tether);
    for (std::size_t i = 0; i < size_.size(); ++i) {
      const double up = above_[i].ratio(), down = below_[i].ratio();
      const BandRow& row = p_.charges[i].row;
      matrix_.AddSquare(row, p_.Of(row), 4 * up * down / (up + down));
    }
    for (std::size_t j = 0; j < bounds_.size(); ++j) {
      const BandRow& row = p_.limits[j].row;
      matrix_.AddSquare(row, p_.Of(row), bounds_[j].ratio());
    }
    return matrix_.Factorize();
  }

  template <class Product>
  void SetProducts(const Product& product) {
    ForPairs([&](Pair& pair) { pair.product = product(pair); });
  }

  // Newton's step: the sizes and all pairs are eliminated, which leaves the band system in z.
  void FindSteps() {
    step_ = gradient_;
    for (std::size_t i = 0; i < size_.size(); ++i) {
      const double up = above_[i].ratio(), down = below_[i].ratio();
      const double both = above_[i].force() + below_[i].force() - unbalanced_[i];
      AddTo(step_, p_.charges[i].row,
            -(above_[i].force() - below_[i].force() - (up - down) / (up + down) * both));
    }
    for (std::size_t j = 0; j < bounds_.size(); ++j) {
      AddTo(step_, p_.limits[j].row, -bounds_[j].force());
    }
    matrix_.SolveInPlace(step_);
    for (std::size_t i = 0; i < size_.size(); ++i) {
      Pair& above = above_[i];
      Pair& below = below_[i];
      const double up = above.ratio(), down = below.ratio();
      const double moved = Dot(p_.charges[i].row, step_);
      const double both = above.force() + below.force() - unbalanced_[i];
      size_step_[i] = (both + (up - down) * moved) / (up + down);
      above.slack_step = above.missing - moved + size_step_[i];
      below.slack_step = below.missing + moved + size_step_[i];
      above.multiplier_step = (above.product - above.multiplier * above.slack_step) / above.slack;
      below.multiplier_step = (below.product - below.multiplier * below.slack_step) / below.slack;
    }
    for (std::size_t j = 0; j < bounds_.size(); ++j) {
      Pair& bound = bounds_[j];
      bound.slack_step = bound.missing - Dot(p_.limits[j].row, step_);
      bound.multiplier_step = (bound.product - bound.multiplier * bound.slack_step) / bound.slack;
    }
  }

  // How far the steps can be gone, 1: to their ends.
  double Reach() {
    double reach = 1;
    ForPairs([&](const Pair& pair) {
      if (pair.slack_step < 0) reach = std::min(reach, -pair.slack / pair.slack_step);
      if (pair.multiplier_step < 0) {
        reach = std::min(reach, -pair.multiplier / pair.multiplier_step);
      }
    });
    return reach;
  }

  void Go(double reach) {
    for (std::size_t k = 0; k < z_.size(); ++k) z_[k] += reach * step_[k];
    for (std::size_t i = 0; i < size_.size(); ++i) size_[i] += reach * size_step_[i];
    ForPairs([&](Pair& pair) {
      pair.slack += reach * pair.slack_step;
      pair.multiplier += reach * pair.multiplier_step;
    });
  }

  const BandProgramme& p_;
  std::vector<double> z_, step_;
  std::vector<Pair> above_, below_;  // of each charge: its size less the residual, and plus it
  std::vector<double> size_, size_step_, unbalanced_;
  std::vector<Pair> bounds_;
  std::vector<double> gradient_;
  double most_missing_ = 0;
  BandMatrix matrix_;
};

}  // namespace

std::vector<double> Solve(const BandProgramme& programme, std::vector<double> start) {
  return InteriorPoint(programme, std::move(start)).Run();
}

}  // namespace calmframe::host
