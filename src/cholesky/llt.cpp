#include "cholesky/llt.h"

#include <algorithm>
#include <cmath>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <utility>
#include <vector>

namespace TessikSDK::Cholesky {

LLTMatrix::~LLTMatrix() = default;

namespace {

class LLTMatrixImpl final : public LLTMatrix {
 public:
  bool solve(std::vector<double>& b) const override;
  std::int32_t size() const override { return static_cast<std::int32_t>(factorRows.size()); }

  std::vector<SparseRow> factorRows;     // strictly-lower entries of row i, ascending column
  std::vector<SparseRow> factorColumns;  // the same entries by column, ascending row
  std::vector<double> diagonal;
  std::vector<std::int32_t> permutation;  // input row -> permuted row
};

bool LLTMatrixImpl::solve(std::vector<double>& b) const {
  const std::size_t n = factorRows.size();
  if (b.size() != n) return false;
  std::vector<double> y(n);
  for (std::size_t i = 0; i < n; ++i) y[static_cast<std::size_t>(permutation[i])] = b[i];
  for (std::size_t i = 0; i < n; ++i) {
    double value = y[i];
    for (const auto& [k, l] : factorRows[i]) value -= y[static_cast<std::size_t>(k)] * l;
    y[i] = value / diagonal[i];
  }
  for (std::size_t i = n; i-- > 0;) {
    double value = y[i];
    for (const auto& [j, l] : factorColumns[i]) value -= y[static_cast<std::size_t>(j)] * l;
    y[i] = value / diagonal[i];
  }
  for (std::size_t i = 0; i < n; ++i) b[i] = y[static_cast<std::size_t>(permutation[i])];
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
  auto factor = std::make_unique<LLTMatrixImpl>();
  factor->factorRows.resize(n);
  factor->diagonal.assign(n, 0.0);
  factor->permutation = minimumDegreeOrder(matrix);
  const std::vector<std::int32_t>& permutation = factor->permutation;

  // The permuted matrix in compressed rows: rowStart[i] .. rowStart[i + 1] holds row i.
  std::vector<std::size_t> rowStart(n + 1, 0);
  for (std::size_t r = 0; r < n; ++r) {
    for (const auto& entry : matrix[r]) {
      const std::int32_t a = permutation[r];
      const std::int32_t b = permutation[static_cast<std::size_t>(entry.first)];
      ++rowStart[static_cast<std::size_t>(std::max(a, b)) + 1];
    }
  }
  for (std::size_t i = 0; i < n; ++i) rowStart[i + 1] += rowStart[i];
  std::vector<std::pair<std::int32_t, double>> permuted(rowStart[n]);
  std::vector<std::size_t> fill(rowStart.begin(), rowStart.end() - 1);
  for (std::size_t r = 0; r < n; ++r) {
    for (const auto& [c, value] : matrix[r]) {
      const std::int32_t a = permutation[r];
      const std::int32_t b = permutation[static_cast<std::size_t>(c)];
      permuted[fill[static_cast<std::size_t>(std::max(a, b))]++] = {std::min(a, b), value};
    }
  }
  auto byColumn = [](const auto& x, const auto& y) { return x.first < y.first; };
  for (std::size_t i = 0; i < n; ++i) {
    std::sort(permuted.begin() + static_cast<std::ptrdiff_t>(rowStart[i]),
              permuted.begin() + static_cast<std::ptrdiff_t>(rowStart[i + 1]), byColumn);
  }

  // A row's pattern is the closure over the column lists of the columns it names, and that closure need
  // only follow each listed column's first entry, its parent: every other row q of the column holds the
  // parent too, because row q's own closure took in the whole column, parent included, when q was
  // factored. So the walks below find the same set while touching only its members. A counting pass over
  // them sizes every row and column list up front: none reallocates, and rows, then columns, are
  // allocated in order, which keeps each sweep of `solve` reading nearby memory.
  std::vector<std::int32_t> parent(n, -1);
  std::vector<std::size_t> visited(n, n);
  std::vector<std::size_t> rowCount(n, 0), columnCount(n, 0);
  for (std::size_t r = 0; r < n; ++r) {
    visited[r] = r;
    for (std::size_t e = rowStart[r]; e + 1 < rowStart[r + 1]; ++e) {
      for (auto k = static_cast<std::size_t>(permuted[e].first); visited[k] != r;
           k = static_cast<std::size_t>(parent[k])) {
        visited[k] = r;
        ++rowCount[r];
        ++columnCount[k];
        if (parent[k] < 0) parent[k] = static_cast<std::int32_t>(r);
      }
    }
  }
  factor->factorColumns.resize(n);
  for (std::size_t r = 0; r < n; ++r) factor->factorRows[r].reserve(rowCount[r]);
  for (std::size_t k = 0; k < n; ++k) factor->factorColumns[k].reserve(columnCount[k]);

  // factorColumns[k] is column k of the factor so far. Row r's own entries are accumulated in `work` and
  // appended only once final, so every pair in a column list during row r belongs to an earlier row.
  std::vector<double> invD(n, 0.0);
  std::vector<double> work(n, 0.0);
  std::vector<std::int32_t> pattern;
  for (std::size_t r = 0; r < n; ++r) {
    const std::size_t begin = rowStart[r];
    const std::size_t last = rowStart[r + 1] - 1;  // the diagonal, largest column after the sort

    // `visited` still holds the counting pass's marks, all below n; n + r marks this row afresh.
    pattern.clear();
    visited[r] = n + r;
    for (std::size_t e = begin; e < last; ++e) {
      for (auto k = static_cast<std::size_t>(permuted[e].first); visited[k] != n + r;
           k = static_cast<std::size_t>(parent[k])) {
        visited[k] = n + r;
        pattern.push_back(static_cast<std::int32_t>(k));
      }
    }
    std::sort(pattern.begin(), pattern.end());
    for (const std::int32_t k : pattern) work[static_cast<std::size_t>(k)] = 0.0;

    // Sparse forward solve of L x = (row r), each value kept divided by its column's diagonal: columns
    // are final when reached in ascending order, and each correction lands on a later column.
    for (std::size_t e = begin; e < last; ++e) {
      const auto c = static_cast<std::size_t>(permuted[e].first);
      work[c] = invD[c] * permuted[e].second;
    }
    for (const std::int32_t k : pattern) {
      const double x = work[static_cast<std::size_t>(k)];
      for (const auto& [q, l] : factor->factorColumns[static_cast<std::size_t>(k)]) {
        work[static_cast<std::size_t>(q)] -= l * x * invD[static_cast<std::size_t>(q)];
      }
    }

    double d = permuted[last].second;
    SparseRow& factorRow = factor->factorRows[r];
    for (const std::int32_t k : pattern) {
      const double x = work[static_cast<std::size_t>(k)];
      d = d - x * x;
      factorRow.emplace_back(k, x);
      factor->factorColumns[static_cast<std::size_t>(k)].emplace_back(static_cast<std::int32_t>(r), x);
    }
    // Written as a negated test so that a NaN pivot fails too.
    if (!(d > 0.0)) return nullptr;
    factor->diagonal[r] = std::sqrt(d);
    invD[r] = 1.0 / factor->diagonal[r];
  }
  return factor;
}

}  // namespace TessikSDK::Cholesky
