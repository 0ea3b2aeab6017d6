#include "arrays.h"

#include <cmath>
#include <limits>
#include <sstream>

namespace tessik::python {

namespace {

char kindOf(const py::array& array) { return array.dtype().kind(); }

std::string dtypeName(const py::array& array) { return py::str(array.dtype()).cast<std::string>(); }

void requireReal(const py::array& array, const std::string& name) {
  const char kind = kindOf(array);
  if (kind != 'f' && kind != 'i' && kind != 'u') {
    fail(name, "must hold real numbers (an integer or floating point dtype), got dtype " + dtypeName(array));
  }
}

template <typename T>
void requireFiniteImpl(const T* data, std::size_t rows, std::size_t rowSize, const std::string& name) {
  for (std::size_t r = 0; r < rows; ++r) {
    for (std::size_t c = 0; c < rowSize; ++c) {
      if (!std::isfinite(data[r * rowSize + c])) {
        fail(name + "[" + std::to_string(r) + "]", "holds a non-finite value (NaN or infinity)");
      }
    }
  }
}

}  // namespace

void fail(const std::string& name, const std::string& problem) {
  throw py::value_error(name + " " + problem);
}

std::string shapeText(const py::array& array) {
  std::ostringstream text;
  text << '(';
  for (py::ssize_t d = 0; d < array.ndim(); ++d) text << (d > 0 ? ", " : "") << array.shape(d);
  if (array.ndim() == 1) text << ',';
  text << ')';
  return text.str();
}

py::array asArray(py::handle object, const std::string& name) {
  if (object.is_none()) fail(name, "is required, got None");
  try {
    return py::module_::import("numpy").attr("asarray")(object);
  } catch (py::error_already_set& e) {
    // Ragged nested lists and objects without an array form; anything else (MemoryError) passes.
    if (!e.matches(PyExc_ValueError) && !e.matches(PyExc_TypeError)) throw;
    fail(name, std::string("cannot be read as a numpy array: ") + e.what());
  }
}

FloatArray realAsFloat(const py::array& array, const std::string& name) {
  requireReal(array, name);
  return py::array_t<float, py::array::c_style | py::array::forcecast>::ensure(array);
}

DoubleArray realAsDouble(const py::array& array, const std::string& name) {
  requireReal(array, name);
  return py::array_t<double, py::array::c_style | py::array::forcecast>::ensure(array);
}

Int64Array integerAsInt64(const py::array& array, const std::string& name) {
  const char kind = kindOf(array);
  if (kind != 'i' && kind != 'u') fail(name, "must be an integer array, got dtype " + dtypeName(array));
  if (kind == 'u' && array.itemsize() == 8 && array.size() > 0 &&
      py::module_::import("numpy").attr("max")(array).cast<std::uint64_t>() >
          static_cast<std::uint64_t>(std::numeric_limits<std::int64_t>::max())) {
    fail(name, "holds values beyond the int64 range");
  }
  return py::array_t<std::int64_t, py::array::c_style | py::array::forcecast>::ensure(array);
}

void requireShape(const py::array& array,
                  const std::string& name,
                  const std::vector<py::ssize_t>& dims,
                  const char* pattern) {
  bool ok = array.ndim() == static_cast<py::ssize_t>(dims.size());
  for (std::size_t d = 0; ok && d < dims.size(); ++d) {
    ok = dims[d] < 0 || array.shape(static_cast<py::ssize_t>(d)) == dims[d];
  }
  if (!ok) fail(name, std::string("must have shape ") + pattern + ", got " + shapeText(array));
}

void requireFinite(const float* data, std::size_t rows, std::size_t rowSize, const std::string& name) {
  requireFiniteImpl(data, rows, rowSize, name);
}

void requireFinite(const double* data, std::size_t rows, std::size_t rowSize, const std::string& name) {
  requireFiniteImpl(data, rows, rowSize, name);
}

DoubleArray affineMatrices(py::handle object,
                           const std::string& name,
                           const std::vector<py::ssize_t>& dims,
                           const char* pattern) {
  const py::array raw = asArray(object, name);
  requireShape(raw, name, dims, pattern);
  const DoubleArray matrices = realAsDouble(raw, name);
  const auto n = static_cast<std::size_t>(matrices.size() / 16);
  requireFinite(matrices.data(), n, 16, name);
  for (std::size_t i = 0; i < n; ++i) {
    const double* m = matrices.data() + 16 * i;
    // A matrix written for row vectors has its translation in the last row; catching that here beats
    // a silently wrong pose.
    const double expected[4] = {0, 0, 0, 1};
    for (int c = 0; c < 4; ++c) {
      if (std::abs(m[12 + c] - expected[c]) > 1e-6) {
        std::ostringstream row;
        row << '[' << m[12] << ", " << m[13] << ", " << m[14] << ", " << m[15] << ']';
        fail(dims.size() == 3 ? name + "[" + std::to_string(i) + "]" : name,
             "must be an affine 4x4 matrix with last row [0, 0, 0, 1] (column-vector convention, "
             "translation in M[:3, 3]), got last row " +
                 row.str());
      }
    }
  }
  return matrices;
}

}  // namespace tessik::python
