import numpy as np
import pytest

import rigs
import tessik

ARM = rigs.arm()
NAN_VERTICES = ARM.vertices.copy()
NAN_VERTICES[5, 1] = np.nan
TRANSPOSED = ARM.joints.transpose(0, 2, 1)  # row-vector layout: translation in the last row
BAD_JOINT = ARM.joints.copy()
BAD_JOINT[2, 0, 3] = np.inf

# (overrides of the arm's arguments, the expected message fragment)
BIND_ERRORS = {
    "vertices 2 columns": (dict(vertices=ARM.vertices[:, :2]),
                           r"vertices must have shape \(V, 3\), got \(194, 2\)"),
    "vertices 1-d": (dict(vertices=ARM.vertices.ravel()), r"vertices must have shape \(V, 3\)"),
    "vertices complex": (dict(vertices=ARM.vertices + 0j),
                         "vertices must hold real numbers.*got dtype complex64"),
    "vertices text": (dict(vertices=ARM.vertices.astype(str)), "vertices must hold real numbers"),
    "vertices ragged": (dict(vertices=[[0, 0, 0], [1, 2]]), "vertices cannot be read as a numpy array"),
    "vertices nan": (dict(vertices=NAN_VERTICES), r"vertices\[5\] holds a non-finite value"),
    "vertices float32 overflow": (dict(vertices=ARM.vertices * np.float64(1e300)),
                                  r"vertices\[0\] holds a coordinate too large for float32"),
    "vertices one point": (dict(vertices=np.ones_like(ARM.vertices)), "vertices all lie at one point"),
    "vertices none": (dict(vertices=None), "vertices is required"),
    "triangles float": (dict(triangles=ARM.triangles.astype(float)),
                        "triangles must be an integer array, got dtype float64"),
    "triangles 4 columns": (dict(triangles=np.zeros((3, 4), int)),
                            r"triangles must have shape \(T, 3\), got \(3, 4\)"),
    "triangles empty": (dict(triangles=np.zeros((0, 3), int)), "triangles is empty"),
    "triangles too large": (dict(triangles=np.where(ARM.triangles == 7, 194, ARM.triangles)),
                            r"triangles\[\d+, \d\] = 194 is out of range for 194 vertices"),
    "triangles negative": (dict(triangles=-ARM.triangles), r"triangles\[\d+, \d\] = -\d+ is out of range"),
    "triangles uint64 huge": (dict(triangles=np.full((2, 3), 2**63, np.uint64)),
                              "triangles holds values beyond the int64 range"),
    "joints 3x3": (dict(joints=ARM.joints[:, :3, :3]),
                   r"joints must have shape \(B, 4, 4\) or \(B, 3\), got \(3, 3, 3\)"),
    "joints transposed": (dict(joints=TRANSPOSED),
                          r"joints\[0\] must be an affine 4x4 matrix with last row \[0, 0, 0, 1\]"),
    "joints infinite": (dict(joints=BAD_JOINT), r"joints\[2\] holds a non-finite value"),
    "joints empty": (dict(joints=np.zeros((0, 3)), parents=np.zeros(0, int), names=[]), "joints is empty"),
    "parents length": (dict(parents=[-1, 0]),
                       r"parents must have shape \(3,\), one entry per joint, got \(2,\)"),
    "parents float": (dict(parents=[-1.0, 0.0, 1.0]), "parents must be an integer array, got dtype float64"),
    "parents too large": (dict(parents=[-1, 3, 1]),
                          r"parents\[1\] = 3 is out of range: use -1 for a root or a bone index below 3"),
    "parents below -1": (dict(parents=[-2, 0, 1]), r"parents\[0\] = -2 is out of range"),
    "parents cycle": (dict(parents=[-1, 2, 1]),
                      r"parents do not form a forest: bones (1 -> 2 -> 1|2 -> 1 -> 2) form a cycle"),
    "parents self": (dict(parents=[0, 0, 1]), r"parents do not form a forest: bones 0 -> 0 form a cycle"),
    "names count": (dict(names=["a", "b"]), r"names must hold one name per joint \(3\), got 2"),
    "names repeated": (dict(names=["a", "b", "a"]), r"names\[2\] = 'a' repeats names\[0\]"),
    "names empty": (dict(names=["a", "", "c"]), r"names\[1\] is empty"),
    "names not str": (dict(names=["a", 2, "c"]), r"names\[1\] must be a str, got <class 'int'>"),
    "names one str": (dict(names="abc"), "names must be a sequence of 3 strings, not a single string"),
    "names not iterable": (dict(names=3), "names must be a sequence of 3 strings"),
    "names nul": (dict(names=["a", "b\0", "c"]), r"names\[1\] contains a NUL character"),
    "falloff nan": (dict(falloff=float("nan")), "falloff must be between 0 .* got nan"),
    "falloff above one": (dict(falloff=1.5), "falloff must be between 0 .* got 1.5"),
    "max_influences negative": (dict(max_influences=-1), "max_influences must be between 0 .* got -1"),
    "max_influences too many": (dict(max_influences=65), "max_influences must be between 0 .* and 64, got 65"),
}


@pytest.mark.parametrize("function", [tessik.bind_heatmap, tessik.bind_geodesic])
@pytest.mark.parametrize("overrides, message", BIND_ERRORS.values(), ids=BIND_ERRORS.keys())
def test_bad_binding_input_raises_value_error_naming_it(function, overrides, message):
    args = ARM._asdict()
    options = {k: v for k, v in overrides.items() if k in ("falloff", "max_influences")}
    args.update({k: v for k, v in overrides.items() if k not in options})
    with pytest.raises(ValueError, match=message):
        function(*args.values(), **options)


@pytest.mark.parametrize("resolution", [7, 0, -5, 1025])
def test_geodesic_resolution_outside_the_tools_range_is_refused(resolution):
    with pytest.raises(ValueError, match=f"resolution must be between 8 and 1024 .* got {resolution}"):
        tessik.bind_geodesic(*ARM, resolution=resolution)


def test_a_progress_that_is_not_callable_is_a_type_error():
    with pytest.raises(TypeError, match="progress must be None or callable"):
        tessik.bind_heatmap(*ARM, progress="loud")


BIND = np.stack([np.eye(4)] * 3)
INDICES = np.array([[0, 1], [2, -1]])
WEIGHTS = np.array([[0.5, 0.5], [1.0, 0.0]])
SKIN_ERRORS = {
    "bind shape": (dict(bind_matrices=BIND[:, :3]),
                   r"bind_matrices must have shape \(B, 4, 4\), got \(3, 3, 4\)"),
    "bind empty": (dict(bind_matrices=np.zeros((0, 4, 4))), "bind_matrices is empty"),
    "bind not affine": (dict(bind_matrices=BIND * 2), r"bind_matrices\[0\] must be an affine 4x4 matrix"),
    "indices float": (dict(bone_indices=INDICES.astype(float)), "bone_indices must be an integer array"),
    "indices 1-d": (dict(bone_indices=INDICES.ravel()), r"bone_indices must have shape \(V, k\), got \(4,\)"),
    "indices too large": (dict(bone_indices=[[0, 3], [2, -1]]),
                          r"bone_indices\[0, 1\] = 3 is out of range: "
                          r"use -1 for an unused entry or a bone index below 3"),
    "indices below -1": (dict(bone_indices=[[0, -2], [2, -1]]), r"bone_indices\[0, 1\] = -2 is out of range"),
    "weights shape": (dict(weights=WEIGHTS[:, :1]),
                      r"weights must have the shape of bone_indices, \(2, 2\), got \(2, 1\)"),
    "weights nan": (dict(weights=[[0.5, np.nan], [1, 0]]), r"weights\[0\] holds a non-finite value"),
    "weights at padding": (dict(weights=[[0.5, 0.5], [0.7, 0.3]]),
                           r"weights\[1, 1\] must be 0 where bone_indices is -1"),
    "weights float32 overflow": (dict(weights=[[1e300, 0], [1, 0]]),
                                 r"weights\[0, 0\] is too large for float32"),
    "object shape": (dict(object_matrix=np.eye(3)), r"object_matrix must have shape \(4, 4\), got \(3, 3\)"),
    "object not affine": (dict(object_matrix=np.ones((4, 4))), "object_matrix must be an affine 4x4 matrix"),
}


@pytest.mark.parametrize("overrides, message", SKIN_ERRORS.values(), ids=SKIN_ERRORS.keys())
def test_bad_skin_input_raises_value_error_naming_it(overrides, message):
    args = dict(bind_matrices=BIND, bone_indices=INDICES, weights=WEIGHTS)
    args.update(overrides)
    with pytest.raises(ValueError, match=message):
        tessik.Skin(**args)


DEFORM_ERRORS = {
    "points count": (dict(points=np.zeros((3, 3))),
                     r"points must have shape \(2, 3\), one row per skinned point, got \(3, 3\)"),
    "points text": (dict(points=[["a", "b", "c"]] * 2), "points must hold real numbers"),
    "poses count": (dict(bone_matrices=BIND[:2]),
                    r"bone_matrices must have shape \(3, 4, 4\), one matrix per bone"),
    "poses not affine": (dict(bone_matrices=BIND * 2), r"bone_matrices\[0\] must be an affine 4x4 matrix"),
}


@pytest.mark.parametrize("overrides, message", DEFORM_ERRORS.values(), ids=DEFORM_ERRORS.keys())
def test_bad_deform_input_raises_value_error_naming_it(overrides, message):
    skin = tessik.Skin(BIND, INDICES, WEIGHTS)
    args = dict(points=np.zeros((2, 3)), bone_matrices=BIND)
    args.update(overrides)
    with pytest.raises(ValueError, match=message):
        skin.deform(**args)


@pytest.mark.parametrize("bone_indices, weights, num_bones, message", [
    ([[0, 4]], [[0.5, 0.5]], 4, r"bone_indices\[0, 1\] = 4 is out of range"),
    ([[0, 1]], [[0.5, 0.5]], -1, "num_bones must be at least 0, got -1"),
    ([[0, -1]], [[0.5, 0.5]], None, r"weights\[0, 1\] must be 0 where bone_indices is -1"),
])
def test_bad_to_dense_input_raises_value_error(bone_indices, weights, num_bones, message):
    with pytest.raises(ValueError, match=message):
        tessik.to_dense(bone_indices, weights, num_bones)


def test_an_unknown_voxelizer_is_refused():
    with pytest.raises(ValueError, match="voxelizer = 'opengl' is none of"):
        tessik.bind_geodesic(*ARM, voxelizer="opengl")
