import concurrent.futures
import os
import pathlib
import subprocess
import sys

import numpy as np
import pytest

import rigs
import tessik

METHOD_RIGS = [(m, r) for m in ("heatmap", "geodesic") for r in ("arm", "legs")]


@pytest.mark.parametrize("method, rig_name", METHOD_RIGS)
def test_results_are_padded_arrays_of_normalised_weights(bound, method, rig_name):
    rig, bone_indices, weights = bound(method, rig_name)
    vertex_count, bone_count = len(rig.vertices), len(rig.joints)
    assert bone_indices.dtype == np.int32 and weights.dtype == np.float64
    assert bone_indices.shape == weights.shape
    assert bone_indices.shape[0] == vertex_count and 1 <= bone_indices.shape[1] <= 4
    assert bone_indices.flags.c_contiguous and weights.flags.c_contiguous
    used = bone_indices >= 0
    # k is the largest influence count, and padding only ever follows the used entries.
    assert used.sum(axis=1).max() == bone_indices.shape[1]
    assert np.all(used[:, :-1] | ~used[:, 1:])
    assert np.all(bone_indices[~used] == -1) and np.all(weights[~used] == 0)
    assert np.all(bone_indices < bone_count)
    np.testing.assert_allclose(weights.sum(axis=1), 1.0, atol=1e-9)
    dense = tessik.to_dense(bone_indices, weights, bone_count)
    assert dense.shape == (vertex_count, bone_count) and dense.dtype == np.float64
    np.testing.assert_allclose(dense.sum(axis=1), 1.0, atol=1e-9)


@pytest.mark.parametrize("method", ["heatmap", "geodesic"])
def test_arm_weights_follow_the_chain(bound, method):
    rig, bone_indices, weights = bound(method, "arm")
    dense = tessik.to_dense(bone_indices, weights, 3)
    x = rig.vertices[:, 0]
    assert np.all(dense[x < 0.3, 0] > 0.95), "the upper arm belongs to the shoulder"
    assert np.all(dense[(x > 1.3) & (x < 1.7), 1] > 0.9), "the forearm belongs to the elbow"
    assert np.all(dense[x < 0.7, 2] < 0.01) and np.all(dense[x > 1.3, 0] < 0.1)


@pytest.mark.parametrize("method", ["heatmap", "geodesic"])
def test_each_leg_is_bound_only_to_its_own_tree(bound, method):
    rig, bone_indices, weights = bound(method, "legs")
    dense = tessik.to_dense(bone_indices, weights, 6)
    left = rig.vertices[:, 0] < 0
    assert np.all(dense[left][:, 3:] == 0) and np.all(dense[~left][:, :3] == 0)
    assert np.all(dense[left][:, :3].sum(axis=1) > 0.999)


@pytest.mark.parametrize("method, rig_name", [("heatmap", "legs"), ("geodesic", "arm"), ("geodesic", "legs")])
def test_matches_the_command_line_tool(gl, tmp_path, method, rig_name):
    # tessik-bind reads the rig as OBJ and JSON; both front ends hand the same mesh and bones to the
    # library's one binding pipeline, so the weights must be the same, vertex for vertex. The module binds
    # the mesh as the tool read it, so that the OBJ's decimal text cannot make the inputs differ.
    found = rigs.tool_bind(tmp_path, rigs.RIGS[rig_name](), method)
    if found is None:
        pytest.skip("TESSIK_BIND_EXE is not set (ctest sets it)")
    mesh, rows = found
    bone_indices, weights = rigs.bind(method, mesh)
    assert len(rows) == len(mesh.vertices)
    for v, entries in enumerate(rows):
        n = len(entries)
        assert bone_indices[v, :n].tolist() == [b for b, _ in entries], v
        np.testing.assert_array_equal(weights[v, :n], [w for _, w in entries])
        assert np.all(bone_indices[v, n:] == -1)


def test_joint_positions_names_and_rotations_give_the_same_weights(bound):
    rig, expected_indices, expected_weights = bound("geodesic", "legs")
    # Only the joint positions matter: a (B, 3) array, rotated matrices, default names, integer
    # coordinates in other dtypes and plain lists all describe the same binding.
    turned = rig.joints @ rigs.rotation([1, 2, 3], 0.7)
    variants = [
        dict(joints=rig.joints[:, :3, 3]),
        dict(joints=turned, names=None),
        dict(joints=rig.joints.astype(np.float32).tolist(), parents=rig.parents.astype(np.int8)),
        dict(vertices=rig.vertices.astype(np.float64), triangles=rig.triangles.astype(np.uint32)),
    ]
    for variant in variants:
        args = rig._asdict()
        args.update(variant)
        bone_indices, weights = tessik.bind_geodesic(*args.values(), resolution=32)
        np.testing.assert_array_equal(bone_indices, expected_indices)
        np.testing.assert_array_equal(weights, expected_weights)


@pytest.mark.parametrize("limit", [1, 2, 0])
def test_max_influences_caps_the_columns(gl, limit):
    bone_indices, weights = rigs.bind("geodesic", rigs.legs(), max_influences=limit)
    counts = (bone_indices >= 0).sum(axis=1)
    if limit:
        assert bone_indices.shape[1] == limit and counts.max() == limit
    else:
        assert bone_indices.shape[1] >= 3, "0 keeps every influence"
    np.testing.assert_allclose(weights.sum(axis=1), 1.0, atol=1e-9)


def test_falloff_changes_the_blend(bound):
    rig, _, soft_weights = bound("geodesic", "arm")
    _, sharp_weights = rigs.bind("geodesic", rig, falloff=1.0)
    # Sharper falloff: the strongest bone of a vertex gets more of it.
    assert sharp_weights.max(axis=1).mean() > soft_weights.max(axis=1).mean()


def test_concurrent_bindings_match_serial_ones(bound):
    # The GIL is released during a binding, so threads overlap in Python; the bindings take turns.
    expected = {name: bound("geodesic", name)[1:] for name in ("arm", "legs")}
    with concurrent.futures.ThreadPoolExecutor(4) as pool:
        jobs = [(name, pool.submit(rigs.bind, "geodesic", rigs.RIGS[name]())) for name in ["arm", "legs"] * 3]
        for name, job in jobs:
            bone_indices, weights = job.result()
            np.testing.assert_array_equal(bone_indices, expected[name][0])
            np.testing.assert_array_equal(weights, expected[name][1])


def test_to_dense_adds_repeated_bones_and_skips_padding():
    bone_indices = np.array([[2, 0, -1], [1, 1, -1], [-1, -1, -1]])
    weights = np.array([[0.25, 0.75, 0], [0.5, 0.25, 0], [0, 0, 0]])
    expected = [[0.75, 0, 0.25, 0], [0, 0.75, 0, 0], [0, 0, 0, 0]]
    np.testing.assert_array_equal(tessik.to_dense(bone_indices, weights, num_bones=4), expected)
    assert tessik.to_dense(bone_indices, weights).shape == (3, 3)


def test_inside_out_mesh_binds_like_the_outward_one(bound):
    # A file wound inside out is turned for binding: the middle of the arm stays the elbow's.
    rig, expected_indices, expected_weights = bound("geodesic", "arm")
    bone_indices, weights = rigs.bind("geodesic", rig._replace(triangles=rig.triangles[:, ::-1].copy()))
    np.testing.assert_array_equal(bone_indices, expected_indices)
    np.testing.assert_array_equal(weights, expected_weights)


def test_the_library_prints_only_when_asked(gl, capfd):
    rig = rigs.arm()
    rigs.bind("geodesic", rig)
    assert capfd.readouterr().out == ""
    rigs.bind("geodesic", rig, verbose=True)
    assert "Total (s)" in capfd.readouterr().out


def test_binds_with_no_gl_library_installed(tmp_path):
    # The shim makes every dlopen of a GL, EGL or GLEW library fail, as on a machine without them; the
    # module links none, so both methods must still bind, the geodesic one voxelising on the processor.
    shim = os.environ.get("TESSIK_NO_GL_SHIM")
    if shim is None:
        pytest.skip("TESSIK_NO_GL_SHIM is not set (ctest sets it)")
    script = (
        "import sys; sys.path.insert(0, %r)\n"
        "import rigs, tessik, numpy as np\n"
        "rig = rigs.arm()\n"
        "for method in ('heatmap', 'geodesic'):\n"
        "    _, weights = rigs.bind(method, rig)\n"
        "    assert np.allclose(weights.sum(axis=1), 1.0), method\n"
        "print('bound')\n" % str(pathlib.Path(__file__).parent))
    env = dict(os.environ, LD_PRELOAD=shim)
    run = subprocess.run([sys.executable, "-c", script], capture_output=True, text=True, env=env)
    assert run.returncode == 0, run.stderr
    assert "bound" in run.stdout
