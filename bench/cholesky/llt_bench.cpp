// Cost of the sparse Cholesky solver on the systems the heat-map binding builds: the cotangent Laplacian
// of a closed triangle mesh plus a positive diagonal (vertex area times a heat term), here on generated
// tori of about 10k, 50k and 100k vertices. Two references run on the same matrices: Eigen's SimplicialLLT
// with its default AMD ordering, and CHOLMOD's supernodal factor (BLAS-backed), once with AMD and once with
// the permutation minimumDegreeOrder gives, which separates the ordering's fill from the kernel's speed.
//
// BM_FactorLLT includes the ordering, since factorLLT computes it; BM_EigenCompute and BM_CholmodCompute
// are the matching analyze + factorize. The LLT and Eigen factors report their off-diagonal entry count
// as nnz_L, which separates the cost of the ordering's fill from the cost of the arithmetic.
//
// The single solves use one heat source's right-hand side, zero outside a band of vertices. The block
// solves take 30 such sources at once, the right-hand sides of a 30-bone bind, each heating its own band.

#include <algorithm>
#include <array>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <map>
#include <memory>
#include <utility>
#include <vector>

#include <Eigen/SparseCholesky>
#include <Eigen/SparseCore>
#include <benchmark/benchmark.h>
#include <suitesparse/cholmod.h>

#include "cholesky/llt.h"
#include "meshes/mesh_builders.h"

namespace {

using TessikSDK::Cholesky::factorLLT;
using TessikSDK::Cholesky::LLTMatrix;
using TessikSDK::Cholesky::minimumDegreeOrder;
using TessikSDK::Cholesky::SparseSymmetricMatrix;

using EigenMatrix = Eigen::SparseMatrix<double>;
using EigenLLT = Eigen::SimplicialLLT<EigenMatrix>;

// Heat terms are k / Dmin^2 with source distances around a tenth of the model size.
constexpr double kHeat = 100.0;
constexpr std::size_t kSources = 30;

struct Problem {
  SparseSymmetricMatrix rows;
  EigenMatrix eigen;
  std::vector<double> rhs;
  std::vector<double> sourceBlock;  // n x kSources, row-major: each source's right-hand side a column
};

using Vec3d = std::array<double, 3>;

Vec3d difference(const tessik::meshes::Vec3& a, const tessik::meshes::Vec3& b) {
  // Single-precision differences widened afterwards, as the heat solve takes them.
  return {static_cast<double>(a[0] - b[0]), static_cast<double>(a[1] - b[1]),
          static_cast<double>(a[2] - b[2])};
}

Vec3d cross(const Vec3d& u, const Vec3d& v) {
  return {u[1] * v[2] - u[2] * v[1], u[2] * v[0] - u[0] * v[2], u[0] * v[1] - u[1] * v[0]};
}

double norm(const Vec3d& v) { return std::sqrt(v[0] * v[0] + v[1] * v[1] + v[2] * v[2]); }

// Torus dimensions (around, across) for each benchmark argument, the approximate vertex count.
std::pair<int, int> torusSize(std::int64_t vertices) {
  if (vertices <= 10000) return {100, 100};
  if (vertices <= 50000) return {250, 200};
  return {400, 250};
}

Problem makeProblem(std::int64_t vertices) {
  const auto [segments, sides] = torusSize(vertices);
  const tessik::meshes::TriMesh mesh = tessik::meshes::torus({0, 0, 0}, 1.0f, 0.4f, segments, sides);
  const std::size_t n = mesh.positions.size();

  // Each triangle corner o adds cot(o) to the weight of the edge opposite it.
  std::vector<std::map<std::int32_t, double>> lower(n);
  std::vector<double> area(n, 0.0);
  for (const auto& t : mesh.triangles) {
    const Vec3d e1 = difference(mesh.positions[t[1]], mesh.positions[t[0]]);
    const Vec3d e2 = difference(mesh.positions[t[2]], mesh.positions[t[0]]);
    const double triangleArea = 0.5 * norm(cross(e1, e2));
    for (int corner = 0; corner < 3; ++corner) {
      const std::uint32_t o = t[corner], i = t[(corner + 1) % 3], k = t[(corner + 2) % 3];
      const Vec3d u = difference(mesh.positions[i], mesh.positions[o]);
      const Vec3d v = difference(mesh.positions[k], mesh.positions[o]);
      const double cot = (u[0] * v[0] + u[1] * v[1] + u[2] * v[2]) / norm(cross(u, v));
      lower[std::max(i, k)][static_cast<std::int32_t>(std::min(i, k))] += cot;
      area[o] += triangleArea;
    }
  }

  Problem problem;
  problem.rows.resize(n);
  std::vector<double> diagonal(n);
  for (std::size_t r = 0; r < n; ++r) diagonal[r] = area[r] * kHeat;
  for (std::size_t r = 0; r < n; ++r) {
    for (const auto& [c, w] : lower[r]) {
      problem.rows[r].emplace_back(c, -w);
      diagonal[r] += w;
      diagonal[static_cast<std::size_t>(c)] += w;
    }
  }
  std::vector<Eigen::Triplet<double>> triplets;
  for (std::size_t r = 0; r < n; ++r) {
    problem.rows[r].emplace_back(static_cast<std::int32_t>(r), diagonal[r]);
    for (const auto& [c, value] : problem.rows[r]) triplets.emplace_back(static_cast<int>(r), c, value);
  }
  problem.eigen.resize(static_cast<Eigen::Index>(n), static_cast<Eigen::Index>(n));
  problem.eigen.setFromTriplets(triplets.begin(), triplets.end());
  problem.eigen.makeCompressed();

  // One heat source's right-hand side: area times heat on a band of vertices, zero elsewhere.
  problem.rhs.assign(n, 0.0);
  for (std::size_t r = 0; r < n / 20; ++r) problem.rhs[r] = area[r] * kHeat;
  problem.sourceBlock.assign(n * kSources, 0.0);
  for (std::size_t s = 0; s < kSources; ++s) {
    for (std::size_t r = s * n / kSources; r < s * n / kSources + n / 20 && r < n; ++r) {
      problem.sourceBlock[r * kSources + s] = area[r] * kHeat;
    }
  }
  return problem;
}

const Problem& problemFor(std::int64_t vertices) {
  static std::map<std::int64_t, std::unique_ptr<Problem>> cache;
  std::unique_ptr<Problem>& slot = cache[vertices];
  if (!slot) slot = std::make_unique<Problem>(makeProblem(vertices));
  return *slot;
}

// Off-diagonal entries of the factor of `rows` under `permutation`, from the elimination tree: row i's
// pattern is every node reached walking up the tree from the columns of its entries.
double factorNonZeros(const SparseSymmetricMatrix& rows, const std::vector<std::int32_t>& permutation) {
  const std::size_t n = rows.size();
  std::vector<std::vector<std::int32_t>> permuted(n);
  for (std::size_t r = 0; r < n; ++r) {
    for (const auto& entry : rows[r]) {
      const std::int32_t a = permutation[r], b = permutation[static_cast<std::size_t>(entry.first)];
      if (a != b) permuted[static_cast<std::size_t>(std::max(a, b))].push_back(std::min(a, b));
    }
  }
  std::vector<std::int32_t> parent(n, -1), visited(n, -1);
  double count = 0;
  for (std::size_t i = 0; i < n; ++i) {
    visited[i] = static_cast<std::int32_t>(i);
    for (std::int32_t k : permuted[i]) {
      while (visited[static_cast<std::size_t>(k)] != static_cast<std::int32_t>(i)) {
        visited[static_cast<std::size_t>(k)] = static_cast<std::int32_t>(i);
        ++count;
        if (parent[static_cast<std::size_t>(k)] < 0)
          parent[static_cast<std::size_t>(k)] = static_cast<std::int32_t>(i);
        k = parent[static_cast<std::size_t>(k)];
      }
    }
  }
  return count;
}

void setCommonCounters(benchmark::State& state, const Problem& problem) {
  state.counters["vertices"] = static_cast<double>(problem.rows.size());
}

void BM_MinimumDegreeOrder(benchmark::State& state) {
  const Problem& problem = problemFor(state.range(0));
  for (auto _ : state) {
    const std::vector<std::int32_t> order = minimumDegreeOrder(problem.rows);
    benchmark::DoNotOptimize(order.data());
  }
  setCommonCounters(state, problem);
}

void BM_FactorLLT(benchmark::State& state) {
  const Problem& problem = problemFor(state.range(0));
  for (auto _ : state) {
    const std::unique_ptr<LLTMatrix> factor = factorLLT(problem.rows);
    if (!factor) state.SkipWithError("factorLLT rejected the matrix");
    benchmark::DoNotOptimize(factor.get());
  }
  setCommonCounters(state, problem);
  state.counters["nnz_L"] = factorNonZeros(problem.rows, minimumDegreeOrder(problem.rows));
}

void BM_Solve(benchmark::State& state) {
  const Problem& problem = problemFor(state.range(0));
  const std::unique_ptr<LLTMatrix> factor = factorLLT(problem.rows);
  if (!factor) {
    state.SkipWithError("factorLLT rejected the matrix");
    return;
  }
  for (auto _ : state) {
    std::vector<double> x = problem.rhs;
    const bool solved = factor->solve(x);
    benchmark::DoNotOptimize(solved);
    benchmark::DoNotOptimize(x.data());
  }
  setCommonCounters(state, problem);
}

void BM_EigenCompute(benchmark::State& state) {
  const Problem& problem = problemFor(state.range(0));
  double nonZeros = 0;
  for (auto _ : state) {
    EigenLLT llt;
    llt.compute(problem.eigen);
    if (llt.info() != Eigen::Success) state.SkipWithError("SimplicialLLT failed");
    nonZeros = static_cast<double>(llt.matrixL().nestedExpression().nonZeros());
    benchmark::DoNotOptimize(llt.info());
  }
  setCommonCounters(state, problem);
  state.counters["nnz_L"] = nonZeros - static_cast<double>(problem.rows.size());
}

void BM_EigenSolve(benchmark::State& state) {
  const Problem& problem = problemFor(state.range(0));
  const EigenLLT llt(problem.eigen);
  const Eigen::Map<const Eigen::VectorXd> rhs(problem.rhs.data(),
                                              static_cast<Eigen::Index>(problem.rhs.size()));
  for (auto _ : state) {
    const Eigen::VectorXd x = llt.solve(rhs);
    benchmark::DoNotOptimize(x.data());
  }
  setCommonCounters(state, problem);
}

void BM_BlockSolve30(benchmark::State& state) {
  const Problem& problem = problemFor(state.range(0));
  const std::unique_ptr<LLTMatrix> factor = factorLLT(problem.rows);
  if (!factor) {
    state.SkipWithError("factorLLT rejected the matrix");
    return;
  }
  std::vector<double> x(problem.sourceBlock.size());  // a caller's buffer, reused from bind to bind
  for (auto _ : state) {
    std::copy(problem.sourceBlock.begin(), problem.sourceBlock.end(), x.begin());
    const bool solved = factor->solve(x, kSources);
    benchmark::DoNotOptimize(solved);
    benchmark::DoNotOptimize(x.data());
  }
  setCommonCounters(state, problem);
}

void BM_EigenSolve30(benchmark::State& state) {
  const Problem& problem = problemFor(state.range(0));
  const EigenLLT llt(problem.eigen);
  const auto n = static_cast<Eigen::Index>(problem.rows.size());
  // Eigen takes the right-hand sides column-major; the transpose of the row-major block is exactly that.
  const Eigen::Map<const Eigen::MatrixXd> rhs(problem.sourceBlock.data(), static_cast<Eigen::Index>(kSources),
                                              n);
  const Eigen::MatrixXd b = rhs.transpose();
  for (auto _ : state) {
    const Eigen::MatrixXd x = llt.solve(b);
    benchmark::DoNotOptimize(x.data());
  }
  setCommonCounters(state, problem);
}

// One CHOLMOD workspace for the whole run; the matrix is handed over as the upper triangle by columns,
// which is exactly the lower triangle by rows that factorLLT takes.
class Cholmod {
 public:
  Cholmod() { cholmod_start(&common_); }
  ~Cholmod() { cholmod_finish(&common_); }
  Cholmod(const Cholmod&) = delete;
  Cholmod& operator=(const Cholmod&) = delete;

  cholmod_common* common() { return &common_; }

  cholmod_sparse* matrix(const SparseSymmetricMatrix& rows) {
    std::size_t entries = 0;
    for (const auto& row : rows) entries += row.size();
    cholmod_sparse* a = cholmod_allocate_sparse(rows.size(), rows.size(), entries, /*sorted=*/1, /*packed=*/1,
                                                /*stype=*/1, CHOLMOD_REAL, &common_);
    auto* start = static_cast<int*>(a->p);
    auto* index = static_cast<int*>(a->i);
    auto* value = static_cast<double*>(a->x);
    std::size_t e = 0;
    for (std::size_t r = 0; r < rows.size(); ++r) {
      start[r] = static_cast<int>(e);
      for (const auto& [c, v] : rows[r]) {
        index[e] = c;
        value[e++] = v;
      }
    }
    start[rows.size()] = static_cast<int>(e);
    return a;
  }

  // Supernodal analyze + factorize, AMD's ordering or, when `order` is given, that permutation.
  cholmod_factor* factor(cholmod_sparse* a, const std::vector<std::int32_t>* order) {
    common_.supernodal = CHOLMOD_SUPERNODAL;
    common_.nmethods = 1;
    common_.method[0].ordering = order ? CHOLMOD_GIVEN : CHOLMOD_AMD;
    std::vector<int> perm;
    if (order) {  // CHOLMOD wants the old row at each new position, the inverse of ours
      perm.resize(order->size());
      for (std::size_t r = 0; r < order->size(); ++r)
        perm[static_cast<std::size_t>((*order)[r])] = static_cast<int>(r);
    }
    cholmod_factor* l =
        order ? cholmod_analyze_p(a, perm.data(), nullptr, 0, &common_) : cholmod_analyze(a, &common_);
    cholmod_factorize(a, l, &common_);
    return l;
  }

 private:
  cholmod_common common_;
};

Cholmod& cholmod() {
  static Cholmod session;
  return session;
}

void BM_CholmodCompute(benchmark::State& state, bool givenOrder) {
  const Problem& problem = problemFor(state.range(0));
  cholmod_sparse* a = cholmod().matrix(problem.rows);
  const std::vector<std::int32_t> order =
      givenOrder ? minimumDegreeOrder(problem.rows) : std::vector<std::int32_t>();
  double nonZeros = 0;
  for (auto _ : state) {
    cholmod_factor* l = cholmod().factor(a, givenOrder ? &order : nullptr);
    if (cholmod().common()->status != CHOLMOD_OK) state.SkipWithError("CHOLMOD failed");
    nonZeros = cholmod().common()->lnz;
    cholmod_free_factor(&l, cholmod().common());
  }
  cholmod_free_sparse(&a, cholmod().common());
  setCommonCounters(state, problem);
  state.counters["nnz_L"] = nonZeros - static_cast<double>(problem.rows.size());
}

void BM_CholmodSolve30(benchmark::State& state) {
  const Problem& problem = problemFor(state.range(0));
  const std::size_t n = problem.rows.size();
  cholmod_sparse* a = cholmod().matrix(problem.rows);
  cholmod_factor* l = cholmod().factor(a, nullptr);
  cholmod_dense* b = cholmod_allocate_dense(n, kSources, n, CHOLMOD_REAL, cholmod().common());
  auto* values = static_cast<double*>(b->x);
  for (std::size_t r = 0; r < n; ++r) {
    for (std::size_t s = 0; s < kSources; ++s) values[s * n + r] = problem.sourceBlock[r * kSources + s];
  }
  for (auto _ : state) {
    cholmod_dense* x = cholmod_solve(CHOLMOD_A, l, b, cholmod().common());
    benchmark::DoNotOptimize(x->x);
    cholmod_free_dense(&x, cholmod().common());
  }
  cholmod_free_dense(&b, cholmod().common());
  cholmod_free_factor(&l, cholmod().common());
  cholmod_free_sparse(&a, cholmod().common());
  setCommonCounters(state, problem);
}

void sizes(benchmark::internal::Benchmark* b) {
  b->Arg(10000)->Arg(50000)->Arg(100000)->Unit(benchmark::kMillisecond);
}

BENCHMARK(BM_MinimumDegreeOrder)->Apply(sizes);
BENCHMARK(BM_FactorLLT)->Apply(sizes);
BENCHMARK(BM_EigenCompute)->Apply(sizes);
BENCHMARK_CAPTURE(BM_CholmodCompute, amd, false)->Apply(sizes);
BENCHMARK_CAPTURE(BM_CholmodCompute, same_order, true)->Apply(sizes);
BENCHMARK(BM_Solve)->Apply(sizes);
BENCHMARK(BM_EigenSolve)->Apply(sizes);
BENCHMARK(BM_BlockSolve30)->Apply(sizes);
BENCHMARK(BM_EigenSolve30)->Apply(sizes);
BENCHMARK(BM_CholmodSolve30)->Apply(sizes);

}  // namespace

BENCHMARK_MAIN();
