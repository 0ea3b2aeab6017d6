#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <utility>
#include <vector>

// Sparse Cholesky factorisation of symmetric positive-definite systems. Depends on nothing else in the
// library.
namespace TessikSDK::Cholesky {

/// One row of the lower triangle: (column, value) pairs with column <= row, ascending by column, so the
/// diagonal entry comes last.
using SparseRow = std::vector<std::pair<std::int32_t, double>>;
using SparseSymmetricMatrix = std::vector<SparseRow>;

/// The lower factor L of P M P^T = L L^T, held once in compressed columns: column j's strictly-lower entries
/// are rowIndex[columnStart[j] .. columnStart[j + 1]) (ascending) with the matching `value`s; L_jj is
/// diagonal[j]. permutation[r] is input row r's index in the permuted matrix.
struct CompressedFactor {
  std::vector<std::size_t> columnStart;  // n + 1 entries
  std::vector<std::int32_t> rowIndex;
  std::vector<double> value;
  std::vector<double> diagonal;
  std::vector<std::int32_t> permutation;
};

/// A factored matrix M = L L^T of a symmetrically permuted M. Immutable once made; the solves only read
/// it, so one factor may serve several threads at once.
class LLTMatrix {
 public:
  virtual ~LLTMatrix();
  /// Replaces b (input row order) by the solution x of M x = b. False, b unchanged, when its length is
  /// not size().
  virtual bool solve(std::vector<double>& b) const = 0;
  virtual std::int32_t size() const = 0;
  /// Solves M X = B for `columns` right-hand sides at once. `block` is B row-major on entry (size() rows of
  /// `columns` values, input row order, the right-hand sides of one row adjacent) and X on return. Each
  /// column's result equals solving it alone, bit for bit but for the sign of a zero: it sees the same
  /// operations in the same order. False, block unchanged, when `columns` is 0 or the block's size is
  /// not size() * columns. A wide block is split by columns over OpenMP's threads; since a column's result
  /// does not depend on its neighbours, it does not depend on the thread count either. Callers may run
  /// several solves at once.
  virtual bool solve(std::vector<double>& block, std::size_t columns) const = 0;
  /// The factor itself, for callers that need L rather than solutions.
  virtual const CompressedFactor& factor() const = 0;
};

/// Exact minimum-degree elimination order: repeatedly eliminates the row with the fewest neighbours in the
/// elimination graph (ties to the lowest index) and joins its neighbours into a clique. Returns each input
/// row's new index. Each row's last entry is taken as its diagonal; any other entry whose column is not
/// below the row (or is negative) adds no edge.
std::vector<std::int32_t> minimumDegreeOrder(const SparseSymmetricMatrix& matrix);

/// Up-looking factorisation of the matrix permuted by minimumDegreeOrder, L built straight into compressed
/// columns. Null when the matrix is not positive definite (a pivot at or below 0, or NaN) or a row lacks its
/// diagonal entry (the row is empty, or its last entry is not on the diagonal); null too when a row's columns
/// are not strictly ascending from 0 or above, since such a row has no single entry to read per column.
std::unique_ptr<LLTMatrix> factorLLT(const SparseSymmetricMatrix& matrix);

}  // namespace TessikSDK::Cholesky
