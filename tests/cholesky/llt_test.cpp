#include "cholesky/llt.h"

#include <algorithm>
#include <cmath>
#include <cstdint>
#include <random>
#include <set>
#include <utility>
#include <vector>

#include <gtest/gtest.h>
#include <omp.h>

namespace {

using TessikSDK::Cholesky::CompressedFactor;
using TessikSDK::Cholesky::factorLLT;
using TessikSDK::Cholesky::minimumDegreeOrder;
using TessikSDK::Cholesky::SparseRow;
using TessikSDK::Cholesky::SparseSymmetricMatrix;

using Edge = std::pair<std::int32_t, std::int32_t>;  // (lower row, higher row)

double unit(std::mt19937& rng) { return static_cast<double>(rng()) / 4294967296.0; }

std::set<Edge> randomGraph(std::int32_t n, int edgeCount, std::mt19937& rng) {
  std::set<Edge> edges;
  for (int e = 0; e < edgeCount; ++e) {
    const auto a = static_cast<std::int32_t>(rng() % static_cast<std::uint32_t>(n));
    const auto b = static_cast<std::int32_t>(rng() % static_cast<std::uint32_t>(n));
    if (a != b) edges.insert({std::min(a, b), std::max(a, b)});
  }
  return edges;
}

// A triangulated w x h grid, the shape of the meshes the heat solve factorises.
std::set<Edge> gridGraph(std::int32_t w, std::int32_t h) {
  std::set<Edge> edges;
  for (std::int32_t y = 0; y < h; ++y) {
    for (std::int32_t x = 0; x < w; ++x) {
      const std::int32_t i = y * w + x;
      if (x + 1 < w) edges.insert({i, i + 1});
      if (y + 1 < h) edges.insert({i, i + w});
      if (x + 1 < w && y + 1 < h) edges.insert({i, i + w + 1});
    }
  }
  return edges;
}

// A weighted graph Laplacian plus a positive diagonal: positive definite whatever the graph.
SparseSymmetricMatrix laplacianPlusDiagonal(std::int32_t n, const std::set<Edge>& edges, std::mt19937& rng) {
  SparseSymmetricMatrix rows(static_cast<std::size_t>(n));
  std::vector<double> diagonal(static_cast<std::size_t>(n));
  for (double& d : diagonal) d = 0.01 + unit(rng);
  for (const auto& [a, b] : edges) {  // ascending (a, b), so each row's columns come out sorted
    const double w = 0.1 + 2.0 * unit(rng);
    rows[static_cast<std::size_t>(b)].emplace_back(a, -w);
    diagonal[static_cast<std::size_t>(a)] += w;
    diagonal[static_cast<std::size_t>(b)] += w;
  }
  for (std::int32_t r = 0; r < n; ++r) rows[static_cast<std::size_t>(r)].emplace_back(r, diagonal[r]);
  return rows;
}

// M x with M rebuilt whole from its lower triangle, so a factor that dropped the upper half shows.
std::vector<double> multiply(const SparseSymmetricMatrix& m, const std::vector<double>& x) {
  std::vector<double> y(x.size(), 0.0);
  for (std::size_t r = 0; r < m.size(); ++r) {
    for (const auto& [c, value] : m[r]) {
      const auto col = static_cast<std::size_t>(c);
      y[r] += value * x[col];
      if (col != r) y[col] += value * x[r];
    }
  }
  return y;
}

// The minimum-degree rule written as plainly as it reads: set adjacency, and a scan of every remaining row
// for the fewest neighbours, the first (lowest) row winning ties.
std::vector<std::int32_t> referenceOrder(const SparseSymmetricMatrix& m) {
  const std::size_t n = m.size();
  std::vector<std::set<std::int32_t>> adjacency(n);
  for (std::size_t r = 0; r < n; ++r) {
    for (std::size_t e = 0; e + 1 < m[r].size(); ++e) {
      adjacency[r].insert(m[r][e].first);
      adjacency[static_cast<std::size_t>(m[r][e].first)].insert(static_cast<std::int32_t>(r));
    }
  }
  std::vector<bool> done(n, false);
  std::vector<std::int32_t> result(n);
  for (std::size_t position = 0; position < n; ++position) {
    std::size_t best = n;
    for (std::size_t r = 0; r < n; ++r) {
      if (!done[r] && (best == n || adjacency[r].size() < adjacency[best].size())) best = r;
    }
    done[best] = true;
    result[best] = static_cast<std::int32_t>(position);
    const std::vector<std::int32_t> clique(adjacency[best].begin(), adjacency[best].end());
    for (std::int32_t u : clique) {
      adjacency[static_cast<std::size_t>(u)].erase(static_cast<std::int32_t>(best));
    }
    for (std::int32_t a : clique) {
      for (std::int32_t b : clique) {
        if (a != b) adjacency[static_cast<std::size_t>(a)].insert(b);
      }
    }
  }
  return result;
}

// Rows 1 and 2 go first at degree 1; then rows 0 and 3 tie at degree 1 and the lower index wins.
TEST(LLTSmallSystems, StarEliminatesLeavesThenLowestOfTie) {
  const SparseSymmetricMatrix star = {
      {{0, 4.0}}, {{0, 1.0}, {1, 4.0}}, {{0, 1.0}, {2, 4.0}}, {{0, 1.0}, {3, 4.0}}};
  EXPECT_EQ(minimumDegreeOrder(star), (std::vector<std::int32_t>{2, 0, 1, 3}));
}

TEST(LLTRejects, NonPositiveDefiniteMatrix) {
  EXPECT_EQ(factorLLT({{{0, 1.0}}, {{0, 2.0}, {1, 1.0}}}), nullptr);  // second pivot is 1 - 4
  EXPECT_EQ(factorLLT({{{0, 0.0}}}), nullptr);                        // a zero pivot counts as failure
}

TEST(LLTRejects, RowWithoutItsDiagonal) {
  EXPECT_EQ(factorLLT({{{0, 4.0}}, {}}), nullptr);
  EXPECT_EQ(factorLLT({{{0, 4.0}}, {{0, 1.0}}, {{2, 4.0}}}), nullptr);
}

// Columns out of order, repeated or negative leave no single entry to read per column.
TEST(LLTRejects, RowWithUnorderedColumns) {
  EXPECT_EQ(factorLLT({{{0, 4.0}}, {{1, 1.0}, {0, 1.0}, {1, 4.0}}}), nullptr);
  EXPECT_EQ(factorLLT({{{0, 4.0}}, {{0, 1.0}, {0, 1.0}, {1, 4.0}}}), nullptr);
  EXPECT_EQ(factorLLT({{{0, 4.0}}, {{-1, 1.0}, {1, 4.0}}}), nullptr);
}

TEST(LLTRejects, BlockOfWrongShapeIsLeftAlone) {
  const auto factor = factorLLT({{{0, 4.0}}, {{0, 2.0}, {1, 5.0}}});
  ASSERT_NE(factor, nullptr);
  const std::pair<std::vector<double>, std::size_t> cases[] = {
      {{6.0, 9.0}, 0}, {{6.0, 9.0, 1.0}, 2}, {{6.0, 9.0, 1.0, 2.0, 3.0, 4.0}, 2}, {{6.0, 9.0, 1.0}, 1}};
  for (const auto& [original, columns] : cases) {
    std::vector<double> block = original;
    EXPECT_FALSE(factor->solve(block, columns)) << columns;
    EXPECT_EQ(block, original) << columns;
  }
  std::vector<double> single = {6.0};
  EXPECT_FALSE(factor->solve(single)) << "a right-hand side of the wrong length";
  EXPECT_EQ(single, std::vector<double>{6.0});
}

struct RandomCase {
  const char* name;
  std::int32_t n;
  int edges;  // random edges drawn; 0 means a triangulated grid of n = 20 x (n / 20)
};

const RandomCase kRandomCases[] = {{"sparse", 300, 450}, {"denser", 200, 1200}, {"isolated_rows", 250, 60},
                                   {"grid", 400, 0},     {"tiny", 7, 12},       {"dense", 60, 1500}};

std::set<Edge> caseGraph(const RandomCase& c, std::mt19937& rng) {
  return c.edges == 0 ? gridGraph(20, c.n / 20) : randomGraph(c.n, c.edges, rng);
}

double relativeResidual(const SparseSymmetricMatrix& m,
                        const std::vector<double>& x,
                        const std::vector<double>& b) {
  const std::vector<double> mx = multiply(m, x);
  double residual = 0.0, norm = 0.0;
  for (std::size_t i = 0; i < b.size(); ++i) {
    residual += (mx[i] - b[i]) * (mx[i] - b[i]);
    norm += b[i] * b[i];
  }
  return std::sqrt(residual / norm);
}

// The textbook dense Cholesky of P M P^T, column by column, to hold the sparse factor against.
std::vector<std::vector<double>> denseFactor(const SparseSymmetricMatrix& m,
                                             const std::vector<std::int32_t>& p) {
  const std::size_t n = m.size();
  std::vector<std::vector<double>> a(n, std::vector<double>(n, 0.0));
  for (std::size_t r = 0; r < n; ++r) {
    for (const auto& [c, value] : m[r]) {
      const auto i = static_cast<std::size_t>(p[r]),
                 j = static_cast<std::size_t>(p[static_cast<std::size_t>(c)]);
      a[std::max(i, j)][std::min(i, j)] = value;
    }
  }
  for (std::size_t j = 0; j < n; ++j) {
    for (std::size_t k = 0; k < j; ++k) a[j][j] -= a[j][k] * a[j][k];
    a[j][j] = std::sqrt(a[j][j]);
    for (std::size_t i = j + 1; i < n; ++i) {
      for (std::size_t k = 0; k < j; ++k) a[i][j] -= a[i][k] * a[j][k];
      a[i][j] /= a[j][j];
    }
  }
  return a;
}

// Every entry of L, stored or not, against the dense factor: a dropped fill entry, a misplaced row or a
// wrong value all show. The tolerance is relative to L's largest entry.
TEST(LLTRandomSystems, FactorMatchesDenseReference) {
  std::mt19937 rng(99);
  for (const RandomCase& c : kRandomCases) {
    const SparseSymmetricMatrix m = laplacianPlusDiagonal(c.n, caseGraph(c, rng), rng);
    const auto factor = factorLLT(m);
    ASSERT_NE(factor, nullptr) << c.name;
    const CompressedFactor& l = factor->factor();
    ASSERT_EQ(l.permutation, minimumDegreeOrder(m)) << c.name;
    std::vector<std::vector<double>> sparse(m.size(), std::vector<double>(m.size(), 0.0));
    for (std::size_t j = 0; j < m.size(); ++j) {
      sparse[j][j] = l.diagonal[j];
      for (std::size_t e = l.columnStart[j]; e < l.columnStart[j + 1]; ++e) {
        const auto i = static_cast<std::size_t>(l.rowIndex[e]);
        ASSERT_GT(i, j) << c.name;
        if (e > l.columnStart[j]) {
          ASSERT_GT(l.rowIndex[e], l.rowIndex[e - 1]) << c.name;
        }
        sparse[i][j] = l.value[e];
      }
    }
    const std::vector<std::vector<double>> dense = denseFactor(m, l.permutation);
    double largest = 0.0, error = 0.0;
    for (std::size_t i = 0; i < m.size(); ++i) {
      for (std::size_t j = 0; j <= i; ++j) {
        largest = std::max(largest, std::abs(dense[i][j]));
        error = std::max(error, std::abs(sparse[i][j] - dense[i][j]));
      }
    }
    EXPECT_LE(error, 1e-12 * largest) << c.name;
  }
}

// Each column of a block is zero above its own permuted row, the shape of the heat sources' right-hand
// sides. Every column must match its single solve bit for bit and solve the system, and the block, wide
// enough to be split over threads, must come out the same for any thread count.
TEST(LLTRandomSystems, BlockSolveMatchesSingleSolvesWithLeadingZeros) {
  const int defaultThreads = omp_get_max_threads();
  std::mt19937 rng(5);
  for (const RandomCase& c : kRandomCases) {
    const SparseSymmetricMatrix m = laplacianPlusDiagonal(c.n, caseGraph(c, rng), rng);
    const auto factor = factorLLT(m);
    ASSERT_NE(factor, nullptr) << c.name;
    const std::vector<std::int32_t>& p = factor->factor().permutation;
    const std::size_t n = m.size(), columns = 20;
    std::vector<double> block(n * columns);
    for (std::size_t k = 0; k < columns; ++k) {
      // Thresholds 0, n/4, ... n: the first column has no leading zero, the last is zero throughout.
      const std::size_t zeroBelow = n * k / (columns - 1);
      for (std::size_t i = 0; i < n; ++i) {
        block[i * columns + k] = static_cast<std::size_t>(p[i]) >= zeroBelow ? unit(rng) - 0.5 : 0.0;
      }
    }
    std::vector<double> solved = block;
    omp_set_num_threads(1);
    ASSERT_TRUE(factor->solve(solved, columns));
    for (int threads : {2, 3, 4}) {
      std::vector<double> again = block;
      omp_set_num_threads(threads);
      ASSERT_TRUE(factor->solve(again, columns));
      EXPECT_EQ(again, solved) << c.name << " on " << threads << " threads";
    }
    omp_set_num_threads(defaultThreads);
    for (std::size_t k = 0; k < columns; ++k) {
      std::vector<double> b(n), x(n), fromBlock(n);
      for (std::size_t i = 0; i < n; ++i) {
        b[i] = x[i] = block[i * columns + k];
        fromBlock[i] = solved[i * columns + k];
      }
      ASSERT_TRUE(factor->solve(x));
      EXPECT_EQ(fromBlock, x) << c.name << " column " << k;
      if (k + 1 < columns) {
        EXPECT_LE(relativeResidual(m, x, b), 1e-9) << c.name << " column " << k;
      } else {
        EXPECT_EQ(x, std::vector<double>(n, 0.0)) << c.name;
      }
    }
  }
}

TEST(MinimumDegreeOrder, MatchesPlainReferenceOfTheRule) {
  std::mt19937 rng(7);
  for (int round = 0; round < 3; ++round) {
    for (const RandomCase& c : kRandomCases) {
      const SparseSymmetricMatrix m = laplacianPlusDiagonal(c.n, caseGraph(c, rng), rng);
      EXPECT_EQ(minimumDegreeOrder(m), referenceOrder(m)) << c.name << " round " << round;
    }
  }
}

}  // namespace
