#include "binding.h"

#include <algorithm>
#include <array>
#include <cmath>
#include <cstdint>
#include <limits>
#include <map>
#include <memory>
#include <mutex>
#include <optional>
#include <stdexcept>
#include <string>
#include <utility>
#include <vector>

#if defined(__GLIBC__)
#include <malloc.h>
#endif

#include <pybind11/numpy.h>

#include <tessik/geombind.h>
#include <tessik/pipeline.h>

#include "arrays.h"
#include "headless_gl/headless_gl.h"
#include "progress_bridge.h"

namespace tessik::python {

namespace {

namespace pl = TessikSDK::Pipeline;

// Everything the library needs, read from numpy while the GIL is held, so the run itself never
// touches a Python object.
struct BindInput {
  std::vector<float> vertices;  // x, y, z per vertex
  std::vector<std::uint32_t> triangles;
  std::vector<std::array<double, 16>> matrices;  // row-major, translation in elements 3, 7 and 11
  std::vector<std::string> names;
  std::vector<std::int64_t> parents;  // -1 for a root
  std::size_t vertexCount() const { return vertices.size() / 3; }
};

struct BindOutput {
  enum class Status { Done, Canceled, NoOpenGL, Invalid, Empty } status = Status::Done;
  std::string message;
  std::size_t columns = 0;
  std::vector<std::int32_t> bones;  // vertexCount * columns, padded with -1
  std::vector<double> weights;      // padded with 0
};

std::string countText(std::size_t n, const char* what) { return std::to_string(n) + " " + what; }

pl::Options pipelineOptions(const BindOptions& options) {
  pl::Options o;
  o.method = options.method == BindMethod::Heatmap ? pl::Method::heatmap : pl::Method::geodesic;
  o.falloff = static_cast<float>(options.falloff);
  o.maxInfluences = static_cast<unsigned>(options.maxInfluences);
  o.resolution = static_cast<int>(options.resolution);
  o.refineInterior = options.refineInterior;
  o.leafTips = options.leafTips;
  o.verbose = options.verbose;
  o.voxelizer = options.voxelizer == "gpu"   ? pl::Voxelizer::gpu
                : options.voxelizer == "cpu" ? pl::Voxelizer::cpu
                                             : pl::Voxelizer::automatic;
  return o;
}

void readVertices(py::handle object, BindInput& in) {
  const py::array raw = asArray(object, "vertices");
  requireShape(raw, "vertices", {-1, 3}, "(V, 3)");
  if (raw.shape(0) == 0) fail("vertices", "is empty: a mesh needs vertices");
  if (static_cast<std::uint64_t>(raw.shape(0)) > std::numeric_limits<std::uint32_t>::max()) {
    fail("vertices", "has more rows than 32-bit vertex indices can address");
  }
  // Checked in double precision before narrowing, so a value past float32 gets its own message rather
  // than numpy's overflow warning and an infinity.
  const DoubleArray vertices = realAsDouble(raw, "vertices");
  const auto count = static_cast<std::size_t>(vertices.shape(0));
  requireFinite(vertices.data(), count, 3, "vertices");
  in.vertices.resize(3 * count);
  for (std::size_t i = 0; i < 3 * count; ++i) {
    if (std::abs(vertices.data()[i]) > std::numeric_limits<float>::max()) {
      fail("vertices[" + std::to_string(i / 3) + "]", "holds a coordinate too large for float32");
    }
    in.vertices[i] = static_cast<float>(vertices.data()[i]);
  }
  // The library scales the mesh into a unit box; a box of size zero has no scale.
  bool spread = false;
  for (std::size_t i = 3; i < in.vertices.size() && !spread; ++i)
    spread = in.vertices[i] != in.vertices[i % 3];
  if (!spread) fail("vertices", "all lie at one point: the mesh has no extent to bind");
}

void readTriangles(py::handle object, BindInput& in) {
  const py::array raw = asArray(object, "triangles");
  requireShape(raw, "triangles", {-1, 3}, "(T, 3)");
  if (raw.shape(0) == 0) fail("triangles", "is empty: a mesh needs triangles");
  const Int64Array triangles = integerAsInt64(raw, "triangles");
  const std::size_t vertexCount = in.vertexCount();
  const std::int64_t* data = triangles.data();
  const auto n = static_cast<std::size_t>(triangles.size());
  in.triangles.resize(n);
  for (std::size_t i = 0; i < n; ++i) {
    if (data[i] < 0 || static_cast<std::uint64_t>(data[i]) >= vertexCount) {
      fail("triangles[" + std::to_string(i / 3) + ", " + std::to_string(i % 3) + "]",
           "= " + std::to_string(data[i]) + " is out of range for " + countText(vertexCount, "vertices") +
               " (valid indices are 0 to " + std::to_string(vertexCount - 1) + ")");
    }
    in.triangles[i] = static_cast<std::uint32_t>(data[i]);
  }
}

void readJoints(py::handle object, BindInput& in) {
  const py::array raw = asArray(object, "joints");
  if (raw.ndim() == 2 && raw.shape(1) == 3) {
    const DoubleArray positions = realAsDouble(raw, "joints");
    const auto count = static_cast<std::size_t>(positions.shape(0));
    requireFinite(positions.data(), count, 3, "joints");
    for (std::size_t b = 0; b < count; ++b) {
      const double* p = positions.data() + 3 * b;
      in.matrices.push_back({1, 0, 0, p[0], 0, 1, 0, p[1], 0, 0, 1, p[2], 0, 0, 0, 1});
    }
  } else {
    const DoubleArray matrices = affineMatrices(raw, "joints", {-1, 4, 4}, "(B, 4, 4) or (B, 3)");
    const auto count = static_cast<std::size_t>(matrices.shape(0));
    // numpy's row-major 4x4 with the translation in the last column is already the library's layout.
    for (std::size_t b = 0; b < count; ++b) {
      std::array<double, 16> m;
      std::copy(matrices.data() + 16 * b, matrices.data() + 16 * (b + 1), m.begin());
      in.matrices.push_back(m);
    }
  }
  if (in.matrices.empty()) fail("joints", "is empty: binding needs at least one bone");
}

std::vector<std::int64_t> readParents(py::handle object, std::size_t boneCount) {
  const py::array raw = asArray(object, "parents");
  const std::string pattern = "(" + std::to_string(boneCount) + ",), one entry per joint";
  requireShape(raw, "parents", {static_cast<py::ssize_t>(boneCount)}, pattern.c_str());
  const Int64Array parents = integerAsInt64(raw, "parents");
  std::vector<std::int64_t> out(parents.data(), parents.data() + boneCount);
  const auto count = static_cast<std::int64_t>(boneCount);
  for (std::size_t b = 0; b < boneCount; ++b) {
    if (out[b] < -1 || out[b] >= count) {
      fail("parents[" + std::to_string(b) + "]", "= " + std::to_string(out[b]) +
                                                     " is out of range: use -1 for a root or a bone index "
                                                     "below " +
                                                     std::to_string(count));
    }
  }
  // Whether they form a forest is the binding pipeline's check, which every front end shares.
  return out;
}

void readNames(py::handle object, BindInput& in) {
  const std::size_t count = in.matrices.size();
  in.names.clear();
  if (object.is_none()) {
    for (std::size_t b = 0; b < count; ++b) in.names.push_back("bone" + std::to_string(b));
    return;
  }
  if (py::isinstance<py::str>(object) || py::isinstance<py::bytes>(object)) {
    fail("names", "must be a sequence of " + countText(count, "strings") + ", not a single string");
  }
  py::list names;
  try {
    names = py::list(py::reinterpret_borrow<py::object>(object));
  } catch (py::error_already_set& e) {
    if (!e.matches(PyExc_TypeError)) throw;
    fail("names", "must be a sequence of " + countText(count, "strings") + ", got " +
                      py::str(py::type::of(object)).cast<std::string>());
  }
  if (names.size() != count) {
    fail("names",
         "must hold one name per joint (" + std::to_string(count) + "), got " + std::to_string(names.size()));
  }
  std::map<std::string, std::size_t> seen;
  for (std::size_t b = 0; b < count; ++b) {
    const std::string at = "names[" + std::to_string(b) + "]";
    if (!py::isinstance<py::str>(names[b])) {
      fail(at, "must be a str, got " + py::str(py::type::of(names[b])).cast<std::string>());
    }
    std::string name = names[b].cast<std::string>();
    if (name.empty()) fail(at, "is empty: every bone needs a name");
    if (name.find('\0') != std::string::npos) fail(at, "contains a NUL character");
    const auto [it, fresh] = seen.emplace(name, b);
    if (!fresh) fail(at, "= '" + name + "' repeats names[" + std::to_string(it->second) + "]");
    in.names.push_back(std::move(name));
  }
}

// Without the GIL. Everything between the arrays and the weights is the library's binding pipeline, the
// same one the command-line tool calls.
BindOutput run(const BindInput& in, const BindOptions& options, ProgressBridge& progress) {
  BindOutput out;
  // Declared before the binding so that it outlives the binding context the pipeline makes in it. Only
  // the geodesic method's GPU voxelizer draws; automatic keeps a context only when it is hardware.
  std::optional<support::HeadlessGLContext> headless;
  // Without a context the pipeline still checks the input first, so bad arguments are reported as such;
  // the reason no context could be made replaces its plainer message below.
  std::string noContext;
  if (options.method == BindMethod::Geodesic && options.voxelizer != "cpu") {
    const bool gpu = options.voxelizer == "gpu";
    if (!support::acquireGLForGpuWork(headless, gpu, &noContext) && gpu && noContext.empty())
      noContext = "no headless OpenGL context could be made";
  }
  pl::Mesh mesh;
  mesh.positions.resize(in.vertexCount());
  for (std::size_t v = 0; v < in.vertexCount(); ++v)
    mesh.positions[v] = {in.vertices[3 * v], in.vertices[3 * v + 1], in.vertices[3 * v + 2]};
  for (std::size_t t = 0; t + 2 < in.triangles.size(); t += 3)
    mesh.triangles.push_back({in.triangles[t], in.triangles[t + 1], in.triangles[t + 2]});
  std::vector<pl::Bone> bones(in.names.size());
  for (std::size_t b = 0; b < bones.size(); ++b) {
    bones[b].name = in.names[b];
    bones[b].parent = static_cast<int>(in.parents[b]);
    bones[b].bindPose = in.matrices[b];
  }

  pl::Result result;
  try {
    result = pl::bindSkin(mesh, bones, pipelineOptions(options), &progress);
  } catch (const pl::BindError& e) {
    using Kind = pl::BindError::Kind;
    out.status = e.kind() == Kind::cancelled      ? BindOutput::Status::Canceled
                 : e.kind() == Kind::noOpenGL     ? BindOutput::Status::NoOpenGL
                 : e.kind() == Kind::invalidInput ? BindOutput::Status::Invalid
                                                  : BindOutput::Status::Empty;
    out.message = e.kind() == Kind::noOpenGL && !noContext.empty() ? noContext : e.what();
    return out;
  }
  // A cancelled run may still hand back weights; none of them is to reach the caller.
  if (progress.canceled()) {
    out.status = BindOutput::Status::Canceled;
    return out;
  }
  const pl::Weights& w = result.weights;
  for (std::size_t v = 0; v < w.numVertices(); ++v)
    out.columns = std::max<std::size_t>(out.columns, w.end(v) - w.begin(v));
  const std::size_t count = w.numVertices();
  out.bones.assign(count * out.columns, -1);
  out.weights.assign(count * out.columns, 0.0);
  for (std::size_t v = 0; v < count; ++v)
    for (std::uint32_t i = w.begin(v); i < w.end(v); ++i) {
      out.bones[v * out.columns + (i - w.begin(v))] = static_cast<std::int32_t>(w.influences[i].bone);
      out.weights[v * out.columns + (i - w.begin(v))] = w.influences[i].weight;
    }
  return out;
}

// Hands the vector's storage to numpy: the array owns it through a capsule, so nothing is copied.
template <typename T>
py::array_t<T> adopt(std::vector<T>&& data, std::size_t rows, std::size_t columns) {
  auto owned = std::make_unique<std::vector<T>>(std::move(data));
  T* storage = owned->data();
  py::capsule base(owned.get(), [](void* p) { delete static_cast<std::vector<T>*>(p); });
  owned.release();
  return py::array_t<T>({static_cast<py::ssize_t>(rows), static_cast<py::ssize_t>(columns)}, storage, base);
}

const char* functionName(BindMethod method) {
  return method == BindMethod::Heatmap ? "tessik.bind_heatmap" : "tessik.bind_geodesic";
}

// Bindings take turns, whichever the method: two geodesic runs would share the library's stage timers.
// Each run already uses every core through OpenMP, so little is lost.
std::mutex& bindingMutex() {
  static std::mutex mutex;
  return mutex;
}

// Set while this thread binds: a progress callback that starts another binding would otherwise wait
// for the lock its own thread holds, for ever.
thread_local bool bindingOnThisThread = false;

}  // namespace

py::tuple bind(py::handle vertices,
               py::handle triangles,
               py::handle joints,
               py::handle parents,
               py::handle names,
               const BindOptions& options,
               py::object progress) {
  BindInput in;
  readVertices(vertices, in);
  readTriangles(triangles, in);
  readJoints(joints, in);
  const std::vector<std::int64_t> parentIndices = readParents(parents, in.matrices.size());
  readNames(names, in);
  in.parents = parentIndices;

  // The ranges are the library's, shared with every other front end; only what a Python integer can hold
  // beyond a C++ one is checked here first.
  if (options.maxInfluences < 0 || options.maxInfluences > pl::Limits::maxInfluences) {
    fail("max_influences", "must be between 0 (keep every influence) and " +
                               std::to_string(pl::Limits::maxInfluences) + ", got " +
                               std::to_string(options.maxInfluences));
  }
  if (options.resolution < pl::Limits::minResolution || options.resolution > pl::Limits::maxResolution) {
    fail("resolution", "must be between " + std::to_string(pl::Limits::minResolution) + " and " +
                           std::to_string(pl::Limits::maxResolution) +
                           " voxels along the longest side, got " + std::to_string(options.resolution));
  }
  const std::string invalidOption = pl::validateOptions(pipelineOptions(options));
  if (!invalidOption.empty()) throw py::value_error(invalidOption);
  if (!progress.is_none() && !PyCallable_Check(progress.ptr())) {
    throw py::type_error("progress must be None or callable(stage: str, fraction: float), got " +
                         py::str(py::type::of(progress)).cast<std::string>());
  }

  if (bindingOnThisThread)
    throw std::runtime_error(std::string(functionName(options.method)) +
                             " was called while this thread is already binding (from a progress callback?); "
                             "bindings cannot nest");
  ProgressBridge bridge(std::move(progress));
  BindOutput out;
  {
    py::gil_scoped_release release;
    const std::lock_guard<std::mutex> lock(bindingMutex());
    bindingOnThisThread = true;
    struct Clear {
      ~Clear() { bindingOnThisThread = false; }
    } clear;
    out = run(in, options, bridge);
#if defined(__GLIBC__)
    // A binding frees many small blocks (topology, voxels, the factor); glibc keeps freed blocks like
    // these, so without this a long-lived interpreter would hold on to them.
    malloc_trim(0);
#endif
  }
  bridge.rethrowIfCanceled();
  const std::string where = functionName(options.method);
  switch (out.status) {
    case BindOutput::Status::Done:
      break;
    case BindOutput::Status::Canceled:
      // Cancellation always comes with a saved Python exception; this is only a safety net.
      throw std::runtime_error(where + ": the binding was cancelled");
    case BindOutput::Status::NoOpenGL:
      throw OpenGLUnavailable(where +
                              " needs an OpenGL 2.1 context: none is current on this thread and no "
                              "headless one could be made.\n" +
                              out.message);
    case BindOutput::Status::Invalid:
      throw py::value_error(where + ": " + out.message);
    case BindOutput::Status::Empty:
      throw BindingFailed(where + ": " + out.message +
                          ". Common causes are joints outside the mesh, or pieces of the surface that every "
                          "bone is hidden from.");
  }
  const std::size_t rows = in.vertexCount();
  const std::size_t columns = out.columns;
  return py::make_tuple(adopt(std::move(out.bones), rows, columns),
                        adopt(std::move(out.weights), rows, columns));
}

}  // namespace tessik::python
