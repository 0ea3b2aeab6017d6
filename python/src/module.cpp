// The Python module `tessik`: automatic skin binding and linear-blend skinning over numpy arrays.

#include <optional>
#include <utility>

#include <pybind11/numpy.h>
#include <pybind11/pybind11.h>
#include <pybind11/stl.h>

#include "binding.h"
#include "influences.h"
#include "skin.h"

namespace py = pybind11;
using tessik::python::BindMethod;
using tessik::python::BindOptions;

namespace {

constexpr const char* kModuleDoc = R"doc(
Automatic skin binding and linear-blend skinning on numpy arrays.

bind_heatmap, bind_geodesic
    Per-vertex bone weights for a triangle mesh and a joint hierarchy, as padded
    (V, k) arrays ``(bone_indices, weights)``.
to_dense
    Those padded arrays as a dense (V, B) weight matrix.
Skin
    Deforms points by posed bones (linear blend skinning).

Matrices are 4x4 in the usual column-vector convention: a point ``p`` maps to
``M @ [p, 1]`` and the translation lies in ``M[:3, 3]``.
)doc";

constexpr const char* kSharedParameters = R"doc(
vertices : array_like, (V, 3)
    Vertex positions, any real dtype; used as float32 and must be finite.
triangles : array_like of int, (T, 3)
    Vertex indices of every triangle, 0 <= index < V.
joints : array_like, (B, 4, 4) or (B, 3)
    Bind-pose joint matrices (column-vector convention, last row [0, 0, 0, 1]),
    or joint positions. Only the translation, the joint position, is used.
parents : array_like of int, (B,)
    Parent index of every joint, -1 for a root; the parents must form a forest.
names : sequence of str, optional
    Unique, non-empty bone names; "bone0", "bone1", ... when omitted. They only
    label the bones; indices in the result always follow the order of ``joints``.
falloff : float, default 0.5
    How sharply a bone's influence fades: 0 soft and wide, 1 sharp; in [0, 1].
max_influences : int, default 4
    Keep at most this many of the strongest bones per vertex (up to 64); 0 keeps all.
leaf_tips : bool, default True
    Give every leaf bone (a head, a hand without fingers, a tail tip) a tip of its
    own, cast from its joint away from its parent to just inside the surface, so
    that it carries its whole part instead of sharing it with its parent. Tips
    never appear in the result.
verbose : bool, default False
    Let the library print its own phase lines and stage timings to stdout.

The mesh is prepared as the command-line tool prepares it: vertices at the same
position are welded (so seams do not cut the surface), pieces wound inside out are
turned for binding, pieces that cannot be bound with the rest are bound on their
own, and a vertex no bone reaches takes its nearest joint.)doc";

constexpr const char* kSharedProgress = R"doc(
progress : callable(stage: str, fraction: float), optional
    Called on the calling thread as each stage starts (fraction 0), at most
    every 50 ms within it, and when the library marks a stage done (1). If it raises, the binding is cancelled
    and the exception propagates once the library has stopped; Ctrl-C
    (KeyboardInterrupt) cancels the same way, with or without a callable.

Returns
-------
bone_indices : ndarray of int32, (V, k)
    Bone indices per vertex, in the library's order, padded with -1.
weights : ndarray of float64, (V, k)
    The matching weights, padded with 0; each vertex's weights sum to 1.
    ``k`` is the largest influence count of any vertex.

Raises
------
ValueError
    An argument has the wrong shape or dtype, an index is out of range, a
    coordinate is not finite, or ``parents`` is not a forest; the message names
    the argument.
BindingError
    No piece of the surface could reach any bone (see the message).
OpenGLUnavailableError
    ``voxelizer="gpu"`` was asked for, and no OpenGL context is current and no
    headless one could be made; the message says which packages provide one.
KeyboardInterrupt, or what ``progress`` raised
    The binding was cancelled; nothing is returned.

The GIL is released while the library works. Bindings from several threads
take turns (each already uses every core).)doc";

std::string heatmapDoc() {
  return std::string(
             R"doc(bind_heatmap($module, vertices, triangles, joints, parents, names=None, *, falloff=0.5, max_influences=4, progress=None)
--

Bone weights by heat diffusion over the surface (bone heat).

Heat flows from the bones each vertex can see along the mesh surface. Needs no
OpenGL: nothing of it is loaded for this call.

Parameters
----------)doc") +
         kSharedParameters + kSharedProgress;
}

std::string geodesicDoc() {
  return std::string(
             R"doc(bind_geodesic($module, vertices, triangles, joints, parents, names=None, *, falloff=0.5, max_influences=4, resolution=64, refine_interior=False, leaf_tips=True, verbose=False, voxelizer="auto", progress=None)
--

Bone weights from geodesic distances through the voxelised mesh volume.

The inside of the mesh is voxelised on the processor or on the GPU (see
``voxelizer``); the two decide the same voxels but for ties within half a voxel
of the surface.

Parameters
----------)doc") +
         kSharedParameters + R"doc(
resolution : int, default 64
    Voxels along the longest side of the mesh box, 8 to 1024. Time and memory
    grow with its cube; thin parts need enough voxels across them.
refine_interior : bool, default False
    Classify the interior voxels more carefully, at some extra cost.
voxelizer : {"auto", "gpu", "cpu"}, default "auto"
    Where the inside is voxelised. "auto" uses the GPU when a hardware OpenGL
    context is current or can be made headless, and the processor otherwise
    (a software renderer such as Mesa's llvmpipe is far slower than it); "gpu"
    needs an OpenGL 2.1 context (the current one, or a headless EGL one made for
    the call) and raises OpenGLUnavailableError without one; "cpu" never loads
    OpenGL.)doc" +
         kSharedProgress;
}

constexpr const char* kDenseDoc = R"doc(to_dense($module, bone_indices, weights, num_bones=None)
--

The (V, B) float64 weight matrix of padded ``(bone_indices, weights)``.

Entries with bone index -1 (weight 0) are skipped and repeated bones in a row add
up. ``num_bones`` defaults to the largest bone index plus one.)doc";

constexpr const char* kSkinDoc = R"doc(Skin(bind_matrices, bone_indices, weights, object_matrix=None)

Linear blend skinning of a fixed set of points by posed bones.

Parameters
----------
bind_matrices : array_like, (B, 4, 4)
    Every bone's bone-to-world matrix at bind time (column-vector convention,
    translation in M[:3, 3], last row [0, 0, 0, 1]).
bone_indices : array_like of int, (V, k)
    Bones per point, -1 for an unused entry, as the binding functions return.
weights : array_like, (V, k)
    The matching weights, 0 where the index is -1; used as float32.
object_matrix : array_like, (4, 4), optional
    The skinned object's object-to-world matrix at bind time; identity when
    omitted. Points are given and returned in object space.

The Skin keeps its own packed float32/int32 copy of the influences (used entries
first in each row; see ``bone_indices`` and ``weights``), so later changes to the
arrays passed in have no effect.

Weights are used as given, not normalised. A point with several influences
moves to ``sum_j w_j X_j p`` with ``X_j = O^-1 C_j B_j^-1 O`` (O the object
matrix, B_j the bind and C_j the posed matrix of bone j), or stays where it is
when its weights sum to at most 1e-5; a point with a single influence moves the
fraction ``w`` of the way to ``X p``; a point without influences stays. For
weights that sum to 1 all of this is the usual linear blend.)doc";

constexpr const char* kDeformDoc = R"doc(deform($self, points, bone_matrices)
--

Maps every point for one pose.

Parameters
----------
points : array_like, (V, 3)
    Bind-time positions in object space, one row per point of the skin.
bone_matrices : array_like, (B, 4, 4)
    Every bone's current bone-to-world matrix (column-vector convention).

Returns
-------
ndarray of float32, (V, 3)
    The deformed points. The work runs in parallel with the GIL released; calls
    on the same Skin from several threads take turns.)doc";

}  // namespace

PYBIND11_MODULE(tessik, m) {
  // The docstrings open with numpy-style signatures; pybind11's would show the C++ parameter types.
  py::options options;
  options.disable_function_signatures();
  m.doc() = kModuleDoc;

  auto bindingError =
      py::register_exception<tessik::python::BindingFailed>(m, "BindingError", PyExc_RuntimeError);
  bindingError.doc() = "The library returned no weights for the mesh and skeleton.";
  auto glError = py::register_exception<tessik::python::OpenGLUnavailable>(m, "OpenGLUnavailableError",
                                                                           PyExc_RuntimeError);
  glError.doc() = "No OpenGL 2.1 context was current and no headless one could be made.";

  m.def(
      "bind_heatmap",
      [](py::handle vertices, py::handle triangles, py::handle joints, py::handle parents, py::handle names,
         double falloff, long long maxInfluences, bool leafTips, bool verbose, py::object progress) {
        BindOptions options;
        options.method = BindMethod::Heatmap;
        options.falloff = falloff;
        options.maxInfluences = maxInfluences;
        options.leafTips = leafTips;
        options.verbose = verbose;
        return tessik::python::bind(vertices, triangles, joints, parents, names, options,
                                    std::move(progress));
      },
      heatmapDoc().c_str(), py::arg("vertices"), py::arg("triangles"), py::arg("joints"), py::arg("parents"),
      py::arg("names") = py::none(), py::kw_only(), py::arg("falloff") = 0.5, py::arg("max_influences") = 4,
      py::arg("leaf_tips") = true, py::arg("verbose") = false, py::arg("progress") = py::none());

  m.def(
      "bind_geodesic",
      [](py::handle vertices, py::handle triangles, py::handle joints, py::handle parents, py::handle names,
         double falloff, long long maxInfluences, long long resolution, bool refineInterior, bool leafTips,
         bool verbose, std::string voxelizer, py::object progress) {
        if (voxelizer != "auto" && voxelizer != "gpu" && voxelizer != "cpu")
          throw py::value_error("voxelizer = '" + voxelizer + "' is none of \"auto\", \"gpu\" and \"cpu\"");
        BindOptions options;
        options.voxelizer = voxelizer;
        options.method = BindMethod::Geodesic;
        options.leafTips = leafTips;
        options.verbose = verbose;
        options.falloff = falloff;
        options.maxInfluences = maxInfluences;
        options.resolution = resolution;
        options.refineInterior = refineInterior;
        return tessik::python::bind(vertices, triangles, joints, parents, names, options,
                                    std::move(progress));
      },
      geodesicDoc().c_str(), py::arg("vertices"), py::arg("triangles"), py::arg("joints"), py::arg("parents"),
      py::arg("names") = py::none(), py::kw_only(), py::arg("falloff") = 0.5, py::arg("max_influences") = 4,
      py::arg("resolution") = 64, py::arg("refine_interior") = false, py::arg("leaf_tips") = true,
      py::arg("verbose") = false, py::arg("voxelizer") = "auto", py::arg("progress") = py::none());

  m.def("to_dense", &tessik::python::denseWeights, kDenseDoc, py::arg("bone_indices"), py::arg("weights"),
        py::arg("num_bones") = py::none());

  py::class_<tessik::python::Skin>(m, "Skin", kSkinDoc)
      .def(py::init<py::handle, py::handle, py::handle, py::handle>(), py::arg("bind_matrices"),
           py::arg("bone_indices"), py::arg("weights"), py::arg("object_matrix") = py::none())
      .def("deform", &tessik::python::Skin::deform, kDeformDoc, py::arg("points"), py::arg("bone_matrices"))
      .def_property_readonly("num_bones", &tessik::python::Skin::numBones, "Number of bones, B.")
      .def_property_readonly("num_points", &tessik::python::Skin::numPoints, "Number of points, V.")
      .def_property_readonly("bone_indices", &tessik::python::Skin::boneIndices,
                             "Read-only (V, k) int32 bone indices the engine reads, used entries first.")
      .def_property_readonly("weights", &tessik::python::Skin::weights,
                             "Read-only (V, k) float32 weights the engine reads, used entries first.")
      .def("__repr__", [](const tessik::python::Skin& skin) {
        return "<tessik.Skin with " + std::to_string(skin.numBones()) + " bones and " +
               std::to_string(skin.numPoints()) + " points>";
      });
}
