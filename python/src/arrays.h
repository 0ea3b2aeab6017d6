#pragma once

#include <array>
#include <cstdint>
#include <string>
#include <vector>

#include <pybind11/numpy.h>
#include <pybind11/pybind11.h>

// Reading numpy inputs: every check raises ValueError with a message that names the argument, so a
// caller with several arrays in flight sees at once which one is wrong and why.
namespace tessik::python {

namespace py = pybind11;

using FloatArray = py::array_t<float, py::array::c_style>;
using DoubleArray = py::array_t<double, py::array::c_style>;
using Int64Array = py::array_t<std::int64_t, py::array::c_style>;

// Raises ValueError with "<name> <problem>".
[[noreturn]] void fail(const std::string& name, const std::string& problem);

// The shape as "(2, 3)".
std::string shapeText(const py::array& array);

// Like numpy.asarray, but a sequence numpy cannot read becomes a ValueError naming `name`.
py::array asArray(py::handle object, const std::string& name);

// Requires integer or floating point elements and converts them; "real" rejects bool, complex, text and
// objects, where numpy would convert silently or not at all.
FloatArray realAsFloat(const py::array& array, const std::string& name);
DoubleArray realAsDouble(const py::array& array, const std::string& name);
// Requires integer elements; unsigned values past int64 are refused rather than wrapped.
Int64Array integerAsInt64(const py::array& array, const std::string& name);

// `dims` lists the expected extents, -1 for any; `pattern` is how the message writes it, "(V, 3)".
void requireShape(const py::array& array,
                  const std::string& name,
                  const std::vector<py::ssize_t>& dims,
                  const char* pattern);

// Every element finite, or a ValueError naming the first row that is not.
void requireFinite(const float* data, std::size_t rows, std::size_t rowSize, const std::string& name);
void requireFinite(const double* data, std::size_t rows, std::size_t rowSize, const std::string& name);

// Reads affine 4x4 matrices in column-vector convention (translation in M[:3, 3]), shaped `dims`
// ((N, 4, 4) or (4, 4)); each must be finite with last row [0, 0, 0, 1].
DoubleArray affineMatrices(py::handle object,
                           const std::string& name,
                           const std::vector<py::ssize_t>& dims,
                           const char* pattern);

}  // namespace tessik::python
