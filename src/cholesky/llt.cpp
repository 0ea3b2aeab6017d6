#include "cholesky/llt.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <utility>
#include <vector>

#include <omp.h>

namespace TessikSDK::Cholesky {

LLTMatrix::~LLTMatrix() = default;

namespace {

class LLTMatrixImpl final : public LLTMatrix {
 public:
  bool solve(std::vector<double>& b) const override { return solve(b, 1); }
  bool solve(std::vector<double>& block, std::size_t columns) const override;
  std::int32_t size() const override { return static_cast<std::int32_t>(factor_.diagonal.size()); }
  const CompressedFactor& factor() const override { return factor_; }

  CompressedFactor factor_;
  std::vector<std::size_t> supernodes_;  // first column of each supernode, then n
};

// Below this many right-hand sides per thread, a second thread streaming L costs more than it saves.
constexpr std::size_t kColumnsPerThread = 8;

// Caps a supernode's width so that its columns' part of the block stays in cache for a wide block.
constexpr std::size_t kMaxSupernode = 32;

// Columns f .. l of L form a supernode when each column's rows are the next column plus that column's
// rows: below the supernode's triangle they all share the rows of column l. The sweeps then read each of
// those rows' values once per supernode instead of once per column. Column j's entry for the supernode's
// q-th shared row sits at start[j] + (l - j) + q.
std::vector<std::size_t> findSupernodes(const CompressedFactor& factor) {
  const std::size_t n = factor.diagonal.size();
  const std::vector<std::size_t>& start = factor.columnStart;
  std::vector<std::size_t> first;
  for (std::size_t j = 0; j < n; ++j) {
    const bool continues = j > 0 && start[j] - start[j - 1] == start[j + 1] - start[j] + 1 &&
                           factor.rowIndex[start[j - 1]] == static_cast<std::int32_t>(j) &&
                           j - first.back() < kMaxSupernode;
    if (!continues) first.push_back(j);
  }
  first.push_back(n);
  return first;
}

// target[c] -= sum over k of sources[k][c] * weights[k], k ascending, for c < m. The columns go in
// chunks whose running values stay in registers while k runs, so each source row is read once per chunk
// and the target once in all; every value still sees its terms in the same order.
template <std::size_t W>
std::size_t subtractChunks(double* target,
                           const double* const* sources,
                           const double* weights,
                           std::size_t count,
                           std::size_t c,
                           std::size_t m) {
  for (; c + W <= m; c += W) {
    double acc[W];
    for (std::size_t t = 0; t < W; ++t) acc[t] = target[c + t];
    for (std::size_t k = 0; k < count; ++k) {
      const double* source = sources[k] + c;
      const double w = weights[k];
      for (std::size_t t = 0; t < W; ++t) acc[t] -= source[t] * w;
    }
    for (std::size_t t = 0; t < W; ++t) target[c + t] = acc[t];
  }
  return c;
}

void subtractProducts(
    double* target, const double* const* sources, const double* weights, std::size_t count, std::size_t m) {
  std::size_t c = subtractChunks<8>(target, sources, weights, count, 0, m);
  c = subtractChunks<4>(target, sources, weights, count, c, m);
  c = subtractChunks<2>(target, sources, weights, count, c, m);
  subtractChunks<1>(target, sources, weights, count, c, m);
}

// The supernode's columns (forward) or shared rows (backward) as row pointers into the block, and one
// shared row's values across the columns: scratch reused from supernode to supernode.
struct SweepScratch {
  std::vector<const double*> rows;
  std::vector<double> weights;
};

void forwardSweep(const CompressedFactor& factor,
                  const std::vector<std::size_t>& supernodes,
                  double* y,
                  std::size_t stride,
                  std::size_t m,
                  std::size_t firstRow,
                  SweepScratch& scratch) {
  const std::size_t* start = factor.columnStart.data();
  const std::int32_t* rows = factor.rowIndex.data();
  const double* values = factor.value.data();
  const double* diagonal = factor.diagonal.data();
  auto s = static_cast<std::size_t>(std::upper_bound(supernodes.begin(), supernodes.end(), firstRow) -
                                    supernodes.begin()) -
           1;
  for (; s + 1 < supernodes.size(); ++s) {
    const std::size_t f = supernodes[s], l = supernodes[s + 1] - 1;
    bool nonzero = false;
    for (std::size_t j = f; j <= l; ++j)
      for (std::size_t c = 0; c < m; ++c) nonzero |= y[j * stride + c] != 0.0;
    // A zero stretch stays zero and changes no later row; the heat sources' right-hand sides are mostly
    // zero.
    if (!nonzero) continue;
    scratch.rows.clear();
    for (std::size_t j = f; j <= l; ++j) {
      double* yj = y + j * stride;
      for (std::size_t c = 0; c < m; ++c) yj[c] /= diagonal[j];
      for (std::size_t i = j + 1; i <= l; ++i) {
        const double v = values[start[j] + (i - j - 1)];
        double* yi = y + i * stride;
        for (std::size_t c = 0; c < m; ++c) yi[c] -= yj[c] * v;
      }
      scratch.rows.push_back(yj);
    }
    // Row i's terms still arrive in ascending column order, as a plain column sweep would apply them.
    const std::size_t width = l + 1 - f;
    const std::size_t shared = start[l + 1] - start[l];
    scratch.weights.resize(width);
    for (std::size_t q = 0; q < shared; ++q) {
      for (std::size_t j = f; j <= l; ++j) scratch.weights[j - f] = values[start[j] + (l - j) + q];
      subtractProducts(y + static_cast<std::size_t>(rows[start[l] + q]) * stride, scratch.rows.data(),
                       scratch.weights.data(), width, m);
    }
  }
}

void backwardSweep(const CompressedFactor& factor,
                   const std::vector<std::size_t>& supernodes,
                   double* y,
                   std::size_t stride,
                   std::size_t m,
                   SweepScratch& scratch) {
  const std::size_t* start = factor.columnStart.data();
  const std::int32_t* rows = factor.rowIndex.data();
  const double* values = factor.value.data();
  const double* diagonal = factor.diagonal.data();
  for (std::size_t s = supernodes.size() - 1; s-- > 0;) {
    const std::size_t f = supernodes[s], l = supernodes[s + 1] - 1;
    // The shared rows are final already, so their terms go first; each column of L is contiguous there.
    const std::size_t shared = start[l + 1] - start[l];
    scratch.rows.resize(shared);
    for (std::size_t q = 0; q < shared; ++q)
      scratch.rows[q] = y + static_cast<std::size_t>(rows[start[l] + q]) * stride;
    for (std::size_t j = f; j <= l; ++j) {
      subtractProducts(y + j * stride, scratch.rows.data(), values + start[j] + (l - j), shared, m);
    }
    for (std::size_t j = l + 1; j-- > f;) {
      double* yj = y + j * stride;
      for (std::size_t i = j + 1; i <= l; ++i) {
        const double v = values[start[j] + (i - j - 1)];
        const double* yi = y + i * stride;
        for (std::size_t c = 0; c < m; ++c) yj[c] -= yi[c] * v;
      }
      for (std::size_t c = 0; c < m; ++c) yj[c] /= diagonal[j];
    }
  }
}

// Both sweeps stream L once for all right-hand sides: a row of the block is `columns` adjacent values, so
// each entry of L is one short vectorisable loop. Every value sees the same operations in the same order
// whatever the block's width, so a column's result does not depend on its neighbours.
bool LLTMatrixImpl::solve(std::vector<double>& block, std::size_t columns) const {
  const std::size_t n = factor_.diagonal.size();
  if (columns == 0 || block.size() / columns != n || block.size() % columns != 0) return false;
  const std::size_t m = columns;
  const std::vector<std::int32_t>& permutation = factor_.permutation;

  std::size_t first = n;  // the first permuted row holding a nonzero: all rows above it solve to zero
  for (std::size_t i = 0; i < n; ++i) {
    const double* row = block.data() + i * m;
    if (std::any_of(row, row + m, [](double v) { return v != 0.0; })) {
      first = std::min(first, static_cast<std::size_t>(permutation[i]));
    }
  }
  if (first == n) return true;  // zero in, zero out

  // The block is permuted in place, row by row along the permutation's cycles: a second block-sized
  // buffer would cost more to allocate and fault in than the sweeps over it.
  std::vector<char> moved(n, 0);
  std::vector<double> carry(m);
  double* y = block.data();
  for (std::size_t i = 0; i < n; ++i) {  // row i goes to permutation[i]
    if (moved[i]) continue;
    std::copy(y + i * m, y + (i + 1) * m, carry.begin());
    for (auto k = static_cast<std::size_t>(permutation[i]);; k = static_cast<std::size_t>(permutation[k])) {
      moved[k] = 1;
      if (k == i) break;
      std::swap_ranges(carry.begin(), carry.end(), y + k * m);
    }
    std::copy(carry.begin(), carry.end(), y + i * m);
  }

  // Wide blocks are split into groups of columns, one per thread, each swept over its own columns of the
  // shared rows: a column sees the same operations whichever group it is in, so the result does not
  // depend on the thread count.
  const int threads = omp_get_max_threads();
  const std::size_t groups = std::max<std::size_t>(
      1, std::min<std::size_t>(static_cast<std::size_t>(threads), m / kColumnsPerThread));
  const auto groupCount = static_cast<std::int64_t>(groups);
#pragma omp parallel for schedule(static, 1) num_threads(static_cast <int>(groups)) if (groups > 1)
  for (std::int64_t g = 0; g < groupCount; ++g) {
    const std::size_t begin = m * static_cast<std::size_t>(g) / groups;
    const std::size_t end = m * static_cast<std::size_t>(g + 1) / groups;
    SweepScratch scratch;
    forwardSweep(factor_, supernodes_, y + begin, m, end - begin, first, scratch);
    backwardSweep(factor_, supernodes_, y + begin, m, end - begin, scratch);
  }

  for (std::size_t i = 0; i < n; ++i) {  // row i comes back from permutation[i]
    if (!moved[i]) continue;
    std::copy(y + i * m, y + (i + 1) * m, carry.begin());
    std::size_t k = i;
    for (auto next = static_cast<std::size_t>(permutation[k]); next != i;
         k = next, next = static_cast<std::size_t>(permutation[k])) {
      std::copy(y + next * m, y + (next + 1) * m, y + k * m);
      moved[k] = 0;
    }
    std::copy(carry.begin(), carry.end(), y + k * m);
    moved[k] = 0;
  }
  return true;
}

// Columns strictly ascending inside [0, row], the last one on the diagonal: anything else would make the
// factorisation index outside its arrays or read an entry that is not there.
bool isWellFormed(const SparseSymmetricMatrix& matrix) {
  for (std::size_t r = 0; r < matrix.size(); ++r) {
    const SparseRow& row = matrix[r];
    if (row.empty() || row.back().first != static_cast<std::int32_t>(r) || row.front().first < 0) {
      return false;
    }
    for (std::size_t e = 1; e < row.size(); ++e) {
      if (row[e - 1].first >= row[e].first) return false;
    }
  }
  return true;
}

// The rows not yet eliminated, smallest (degree, row) first. An indexed 4-ary heap: each row has one
// entry, moved in place when its degree changes, so a pop never meets an outdated key.
class DegreeQueue {
 public:
  explicit DegreeQueue(const std::vector<std::size_t>& degrees)
      : key_(degrees.size()), heap_(degrees.size()), position_(degrees.size()) {
    for (std::size_t r = 0; r < degrees.size(); ++r) {
      key_[r] = keyOf(degrees[r], r);
      place(r, static_cast<std::int32_t>(r));
    }
    for (std::size_t i = heap_.size() / kArity + 1; i-- > 0;) siftDown(i);
  }

  std::int32_t popMin() {
    const std::int32_t first = heap_.front();
    const std::int32_t last = heap_.back();
    heap_.pop_back();
    if (!heap_.empty()) {
      place(0, last);
      siftDown(0);
    }
    return first;
  }

  void update(std::int32_t row, std::size_t degree) {
    const auto r = static_cast<std::size_t>(row);
    const std::uint64_t old = key_[r];
    key_[r] = keyOf(degree, r);
    if (key_[r] < old) {
      siftUp(position_[r]);
    } else if (key_[r] > old) {
      siftDown(position_[r]);
    }
  }

 private:
  static constexpr std::size_t kArity = 4;  // shallower than binary, and the children share a cache line

  // Packed so that plain integer order is the pair order: fewest neighbours first, ties to the lowest row.
  static std::uint64_t keyOf(std::size_t degree, std::size_t row) {
    return (static_cast<std::uint64_t>(degree) << 32) | static_cast<std::uint64_t>(row);
  }

  void place(std::size_t slot, std::int32_t row) {
    heap_[slot] = row;
    position_[static_cast<std::size_t>(row)] = slot;
  }

  void siftUp(std::size_t slot) {
    const std::int32_t row = heap_[slot];
    const std::uint64_t key = key_[static_cast<std::size_t>(row)];
    while (slot > 0) {
      const std::size_t parent = (slot - 1) / kArity;
      if (key_[static_cast<std::size_t>(heap_[parent])] <= key) break;
      place(slot, heap_[parent]);
      slot = parent;
    }
    place(slot, row);
  }

  void siftDown(std::size_t slot) {
    if (slot >= heap_.size()) return;
    const std::int32_t row = heap_[slot];
    const std::uint64_t key = key_[static_cast<std::size_t>(row)];
    for (;;) {
      const std::size_t first = kArity * slot + 1;
      if (first >= heap_.size()) break;
      const std::size_t end = std::min(first + kArity, heap_.size());
      std::size_t best = first;
      std::uint64_t bestKey = key_[static_cast<std::size_t>(heap_[first])];
      for (std::size_t child = first + 1; child < end; ++child) {
        const std::uint64_t childKey = key_[static_cast<std::size_t>(heap_[child])];
        if (childKey < bestKey) {
          best = child;
          bestKey = childKey;
        }
      }
      if (bestKey >= key) break;
      place(slot, heap_[best]);
      slot = best;
    }
    place(slot, row);
  }

  std::vector<std::uint64_t> key_;     // by row
  std::vector<std::int32_t> heap_;     // rows in heap order
  std::vector<std::size_t> position_;  // by row: its slot in heap_
};

void release(std::vector<std::int32_t>& list) { std::vector<std::int32_t>().swap(list); }

}  // namespace

// The elimination graph is held as a quotient graph: a remaining row u is joined to the rows in
// variables[u] (its own off-diagonal entries, less those now covered otherwise) and to every member of
// each clique members[e] it belongs to, e an eliminated row listed in elements[u]. That is the explicit
// graph the rule describes without ever writing a clique out edge by edge, and the degrees below are its
// true set sizes, so the order is the one the explicit graph gives.
//
// Eliminating v makes its neighbours one new clique; each clique v belonged to lies inside it and is
// absorbed, as is any other clique that the new one covers. A neighbour u's new degree is the clique size
// less one plus the rows u reaches outside it; `outside[e]`, the size of clique e less its rows inside the
// new one, gives that count at once for the common case of a single other clique.
std::vector<std::int32_t> minimumDegreeOrder(const SparseSymmetricMatrix& matrix) {
  const std::size_t n = matrix.size();
  std::vector<std::vector<std::int32_t>> variables(n), elements(n), members(n);
  for (std::size_t r = 0; r < n; ++r) {
    const SparseRow& row = matrix[r];
    for (std::size_t e = 0; e + 1 < row.size(); ++e) {
      const std::int32_t c = row[e].first;
      // Off the strict lower triangle there is no edge to add; a well-formed row has no such entry.
      if (c < 0 || static_cast<std::size_t>(c) >= r) continue;
      variables[r].push_back(c);
      variables[static_cast<std::size_t>(c)].push_back(static_cast<std::int32_t>(r));
    }
  }
  std::vector<std::size_t> degree(n);
  for (std::size_t r = 0; r < n; ++r) {
    std::vector<std::int32_t>& neighbours = variables[r];
    std::sort(neighbours.begin(), neighbours.end());
    neighbours.erase(std::unique(neighbours.begin(), neighbours.end()), neighbours.end());
    degree[r] = neighbours.size();
  }
  DegreeQueue queue(degree);

  // Stamps instead of flags, so that nothing needs clearing between steps: inClique[x] == step marks the
  // new clique, counted[x] == countTag the rows already counted for one neighbour, outsideStep[e] == step
  // an `outside` entry already started this step.
  std::vector<char> isElement(n, 0);
  std::vector<std::size_t> inClique(n, 0), counted(n, 0), outsideStep(n, 0), outside(n, 0);
  std::size_t countTag = 0;
  std::vector<std::int32_t> clique;
  std::vector<std::int32_t> result(n);
  for (std::size_t step = 1; step <= n; ++step) {
    const std::int32_t v = queue.popMin();
    const auto vRow = static_cast<std::size_t>(v);
    result[vRow] = static_cast<std::int32_t>(step - 1);

    clique.clear();
    inClique[vRow] = step;
    auto join = [&](std::int32_t x) {
      if (inClique[static_cast<std::size_t>(x)] != step) {
        inClique[static_cast<std::size_t>(x)] = step;
        clique.push_back(x);
      }
    };
    for (const std::int32_t x : variables[vRow]) join(x);
    for (const std::int32_t e : elements[vRow]) {
      const auto eRow = static_cast<std::size_t>(e);
      if (!isElement[eRow]) continue;
      for (const std::int32_t x : members[eRow]) join(x);
      isElement[eRow] = 0;
      release(members[eRow]);
    }
    release(variables[vRow]);
    release(elements[vRow]);

    for (const std::int32_t u : clique) {
      for (const std::int32_t e : elements[static_cast<std::size_t>(u)]) {
        const auto eRow = static_cast<std::size_t>(e);
        if (!isElement[eRow]) continue;
        if (outsideStep[eRow] != step) {
          outsideStep[eRow] = step;
          outside[eRow] = members[eRow].size();
        }
        --outside[eRow];
      }
    }

    for (const std::int32_t u : clique) {
      const auto uRow = static_cast<std::size_t>(u);
      std::vector<std::int32_t>& uElements = elements[uRow];
      std::size_t kept = 0;
      for (const std::int32_t e : uElements) {
        const auto eRow = static_cast<std::size_t>(e);
        if (!isElement[eRow]) continue;
        if (outside[eRow] == 0) {  // wholly inside the new clique: nothing of it is left to say
          isElement[eRow] = 0;
          release(members[eRow]);
          continue;
        }
        uElements[kept++] = e;
      }
      uElements.resize(kept);

      ++countTag;
      std::size_t external = 0;
      std::vector<std::int32_t>& uVariables = variables[uRow];
      kept = 0;
      for (const std::int32_t x : uVariables) {
        // v (stamped with the clique) is gone, and the new clique covers its own members: neither needs
        // listing any more.
        if (inClique[static_cast<std::size_t>(x)] == step) continue;
        uVariables[kept++] = x;
        counted[static_cast<std::size_t>(x)] = countTag;
        ++external;
      }
      uVariables.resize(kept);
      if (uElements.size() == 1 && uVariables.empty()) {
        external = outside[static_cast<std::size_t>(uElements.front())];
      } else {
        for (const std::int32_t e : uElements) {
          for (const std::int32_t x : members[static_cast<std::size_t>(e)]) {
            const auto xRow = static_cast<std::size_t>(x);
            if (inClique[xRow] != step && counted[xRow] != countTag) {
              counted[xRow] = countTag;
              ++external;
            }
          }
        }
      }
      uElements.push_back(v);
      queue.update(u, clique.size() - 1 + external);
    }

    if (!clique.empty()) {
      members[vRow] = clique;
      isElement[vRow] = 1;
    }
  }
  return result;
}

std::unique_ptr<LLTMatrix> factorLLT(const SparseSymmetricMatrix& matrix) {
  if (!isWellFormed(matrix)) return nullptr;
  const std::size_t n = matrix.size();
  auto result = std::make_unique<LLTMatrixImpl>();
  CompressedFactor& factor = result->factor_;
  factor.permutation = minimumDegreeOrder(matrix);
  const std::vector<std::int32_t>& permutation = factor.permutation;

  // The permuted matrix's strictly-lower rows, compressed: rowStart[i] .. rowStart[i + 1] holds row i, in
  // no particular order since the walks below only scatter them. Diagonals go apart.
  std::vector<std::size_t> rowStart(n + 1, 0);
  for (std::size_t r = 0; r < n; ++r) {
    for (std::size_t e = 0; e + 1 < matrix[r].size(); ++e) {
      const std::int32_t a = permutation[r];
      const std::int32_t b = permutation[static_cast<std::size_t>(matrix[r][e].first)];
      ++rowStart[static_cast<std::size_t>(std::max(a, b)) + 1];
    }
  }
  for (std::size_t i = 0; i < n; ++i) rowStart[i + 1] += rowStart[i];
  std::vector<std::int32_t> lowerColumn(rowStart[n]);
  std::vector<double> lowerValue(rowStart[n]);
  std::vector<double> pivot(n);
  {
    std::vector<std::size_t> fill(rowStart.begin(), rowStart.end() - 1);
    for (std::size_t r = 0; r < n; ++r) {
      const auto a = permutation[r];
      for (std::size_t e = 0; e + 1 < matrix[r].size(); ++e) {
        const auto b = permutation[static_cast<std::size_t>(matrix[r][e].first)];
        const std::size_t slot = fill[static_cast<std::size_t>(std::max(a, b))]++;
        lowerColumn[slot] = std::min(a, b);
        lowerValue[slot] = matrix[r][e].second;
      }
      pivot[static_cast<std::size_t>(a)] = matrix[r].back().second;
    }
  }

  // Symbolic pass. Row r's pattern is the union of the elimination-tree paths from its entries' columns
  // up towards r; each path stops at the first node this row already reached, so the walk costs one step
  // per entry of L. A column's first entry below the diagonal names its parent, which is how the tree grows
  // as rows are added. Counting each column here lets L be allocated once, in place.
  std::vector<std::int32_t> parent(n, -1);
  std::vector<std::size_t> mark(n, n);
  std::vector<std::size_t>& columnStart = factor.columnStart;
  columnStart.assign(n + 1, 0);
  for (std::size_t r = 0; r < n; ++r) {
    mark[r] = r;
    for (std::size_t e = rowStart[r]; e < rowStart[r + 1]; ++e) {
      for (auto k = static_cast<std::size_t>(lowerColumn[e]); mark[k] != r;
           k = static_cast<std::size_t>(parent[k])) {
        mark[k] = r;
        ++columnStart[k + 1];
        if (parent[k] < 0) parent[k] = static_cast<std::int32_t>(r);
      }
    }
  }
  for (std::size_t k = 0; k < n; ++k) columnStart[k + 1] += columnStart[k];
  factor.rowIndex.resize(columnStart[n]);
  factor.value.resize(columnStart[n]);
  factor.diagonal.assign(n, 0.0);

  // Numeric pass: row r of L solves L[0..r) x = (row r of the permuted matrix), a sparse triangular solve
  // over the pattern. The pattern is visited child before parent (each path is pushed reversed onto the
  // back of `order`, then read from the back), which is all the solve needs: a column's value is final once
  // every descendant in the pattern has been applied, and no sort is needed. Columns fill in row order, so
  // their entries come out ascending.
  std::vector<std::size_t> next(columnStart.begin(), columnStart.end() - 1);
  std::vector<double> work(n, 0.0);
  std::vector<std::int32_t> order(n), path(n);
  std::int32_t* rowIndex = factor.rowIndex.data();
  double* value = factor.value.data();
  const double* diagonal = factor.diagonal.data();
  for (std::size_t r = 0; r < n; ++r) {
    std::size_t top = n;  // order[top .. n) is the pattern, children first
    mark[r] = n + r;      // every earlier mark is below n + r
    for (std::size_t e = rowStart[r]; e < rowStart[r + 1]; ++e) {
      auto k = static_cast<std::size_t>(lowerColumn[e]);
      work[k] = lowerValue[e];
      std::size_t length = 0;
      for (; mark[k] != n + r; k = static_cast<std::size_t>(parent[k])) {
        mark[k] = n + r;
        path[length++] = static_cast<std::int32_t>(k);
      }
      while (length > 0) order[--top] = path[--length];
    }
    double d = pivot[r];
    for (std::size_t t = top; t < n; ++t) {
      const auto k = static_cast<std::size_t>(order[t]);
      const double x = work[k] / diagonal[k];
      work[k] = 0.0;
      const std::size_t end = next[k];
      for (std::size_t p = columnStart[k]; p < end; ++p)
        work[static_cast<std::size_t>(rowIndex[p])] -= value[p] * x;
      d -= x * x;
      rowIndex[end] = static_cast<std::int32_t>(r);
      value[end] = x;
      next[k] = end + 1;
    }
    // Written as a negated test so that a NaN pivot fails too.
    if (!(d > 0.0)) return nullptr;
    factor.diagonal[r] = std::sqrt(d);
  }
  result->supernodes_ = findSupernodes(factor);
  return result;
}

}  // namespace TessikSDK::Cholesky
