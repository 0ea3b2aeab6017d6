import concurrent.futures
import gc

import numpy as np
import pytest

import rigs
import tessik


def random_affine(rng, count):
    """Well-conditioned affine 4x4 matrices: rotation, mild scale and shear, translation."""
    out = np.empty((count, 4, 4))
    for i in range(count):
        stretch = np.eye(4)
        stretch[:3, :3] = np.diag(rng.uniform(0.5, 2.0, 3)) + 0.1 * np.triu(rng.uniform(-1, 1, (3, 3)), 1)
        turn = rigs.rotation(rng.normal(size=3), rng.uniform(-3, 3))
        out[i] = rigs.translation(rng.uniform(-4, 4, 3)) @ turn @ stretch
    return out


def random_influences(rng, points, bones, columns, normalised):
    """Padding (-1, 0) anywhere in a row, not only at the end; some rows without any influence."""
    bone_indices = rng.integers(0, bones, (points, columns))
    bone_indices[rng.random((points, columns)) < 0.3] = -1
    weights = np.where(bone_indices >= 0, rng.uniform(0.05, 1.0, (points, columns)), 0.0)
    if normalised:
        total = weights.sum(axis=1, keepdims=True)
        weights = np.divide(weights, total, out=np.zeros_like(weights), where=total > 0)
    else:
        weights[::7] *= 1e-6  # sums at most 1e-5: those points stay where they are
    return bone_indices, weights


@pytest.mark.parametrize("seed", range(3))
@pytest.mark.parametrize("columns", [1, 2, 4])
@pytest.mark.parametrize("normalised", [True, False], ids=["normalised", "raw"])
@pytest.mark.parametrize("with_object", [False, True], ids=["identity", "object"])
def test_deform_matches_a_numpy_reference(seed, columns, normalised, with_object):
    rng = np.random.default_rng(seed)
    bones, points = int(rng.integers(1, 7)), 300
    bind, poses = random_affine(rng, bones), random_affine(rng, bones)
    object_matrix = random_affine(rng, 1)[0] if with_object else np.eye(4)
    bone_indices, weights = random_influences(rng, points, bones, columns, normalised)
    rest = rng.uniform(-3, 3, (points, 3))

    skin = tessik.Skin(bind, bone_indices, weights, object_matrix if with_object else None)
    moved = skin.deform(rest, poses)
    expected = rigs.skinning_reference(rest, bind, poses, bone_indices, weights, object_matrix)
    assert moved.shape == (points, 3) and moved.dtype == np.float32
    np.testing.assert_allclose(moved, expected, rtol=1e-4, atol=1e-3)
    if normalised:
        np.testing.assert_allclose(skin.deform(rest, bind), rest, atol=1e-4, err_msg="the bind pose moved")


def test_padding_position_does_not_matter_and_the_skin_packs_it():
    rng = np.random.default_rng(7)
    bind, poses = random_affine(rng, 3), random_affine(rng, 3)
    packed_indices = np.array([[0, 1, -1], [2, -1, -1], [1, 2, 0]])
    packed_weights = np.array([[0.25, 0.75, 0], [1, 0, 0], [0.2, 0.3, 0.5]])
    spread_indices = np.array([[-1, 0, -1, 1], [-1, -1, 2, -1], [1, 2, -1, 0]])
    spread_weights = np.array([[0, 0.25, 0, 0.75], [0, 0, 1, 0], [0.2, 0.3, 0, 0.5]])
    rest = rng.uniform(-1, 1, (3, 3))
    packed = tessik.Skin(bind, packed_indices, packed_weights)
    spread = tessik.Skin(bind, spread_indices, spread_weights)
    np.testing.assert_array_equal(spread.deform(rest, poses), packed.deform(rest, poses))
    np.testing.assert_array_equal(spread.bone_indices[:, :3], packed_indices)
    np.testing.assert_array_equal(spread.bone_indices[:, 3], -1)
    np.testing.assert_array_equal(spread.weights[:, :3], packed_weights.astype(np.float32))
    assert spread.bone_indices.dtype == np.int32 and spread.weights.dtype == np.float32


def test_the_skin_owns_its_influences():
    rng = np.random.default_rng(3)
    bind, poses = random_affine(rng, 2), random_affine(rng, 2)
    bone_indices = np.array([[0, 1], [1, -1]], np.int32)
    weights = np.array([[0.5, 0.5], [1.0, 0.0]], np.float32)  # already the engine's dtypes
    rest = rng.uniform(-1, 1, (2, 3))
    skin = tessik.Skin(bind, bone_indices, weights)
    before = skin.deform(rest, poses)
    bone_indices[:] = 7  # would be out of range if the engine still read this memory
    weights[:] = np.nan
    del bone_indices, weights
    gc.collect()
    np.testing.assert_array_equal(skin.deform(rest, poses), before)
    with pytest.raises(ValueError, match="read-only"):
        skin.weights[0, 0] = 2.0
    assert (skin.num_bones, skin.num_points) == (2, 2)
    assert repr(skin) == "<tessik.Skin with 2 bones and 2 points>"


def test_deform_takes_any_real_array_like_and_leaves_it_alone():
    bind = np.stack([np.eye(4), rigs.translation([1, 0, 0])])
    skin = tessik.Skin(bind, [[0], [1]], [[1.0], [1.0]])
    rest = [[0, 0, 0], [1, 0, 0]]  # a list of ints
    poses = [rigs.translation([0, 0, 5]), rigs.translation([1, 0, 0]) @ rigs.rotation([0, 0, 1], np.pi / 2)]
    moved = skin.deform(rest, poses)
    np.testing.assert_allclose(moved, [[0, 0, 5], [1, 0, 0]], atol=1e-6)
    fixed = np.array([[0, 1, 0], [2, 0, 0]], np.float32)
    copy = fixed.copy()
    out = skin.deform(fixed, np.stack(poses))
    np.testing.assert_array_equal(fixed, copy)
    np.testing.assert_allclose(out, [[0, 1, 5], [1, 1, 0]], atol=1e-6)
    assert out is not skin.deform(fixed, np.stack(poses))


def test_concurrent_deforms_on_one_skin_match_serial_ones():
    rng = np.random.default_rng(11)
    bind = random_affine(rng, 5)
    bone_indices, weights = random_influences(rng, 20000, 5, 4, True)
    rest = rng.uniform(-2, 2, (20000, 3))
    skin = tessik.Skin(bind, bone_indices, weights)
    poses = [random_affine(rng, 5) for _ in range(8)]
    expected = [skin.deform(rest, pose) for pose in poses]
    with concurrent.futures.ThreadPoolExecutor(4) as pool:
        for result, wanted in zip(pool.map(lambda pose: skin.deform(rest, pose), poses), expected):
            np.testing.assert_array_equal(result, wanted)


@pytest.mark.parametrize("method", ["heatmap", "geodesic"])
def test_binding_then_skinning_bends_the_arm_at_the_elbow(bound, method):
    rig, bone_indices, weights = bound(method, "arm")
    skin = tessik.Skin(rig.joints, bone_indices, weights)
    # Turn the elbow and everything below it 90 degrees about z around the elbow joint.
    turn = rigs.translation([1, 0, 0]) @ rigs.rotation([0, 0, 1], np.pi / 2) @ rigs.translation([-1, 0, 0])
    poses = rig.joints.copy()
    poses[1:] = turn @ rig.joints[1:]
    moved = skin.deform(rig.vertices, poses)
    expected = rigs.skinning_reference(rig.vertices, rig.joints, poses, bone_indices, weights)
    np.testing.assert_allclose(moved, expected, atol=1e-5)
    x = rig.vertices[:, 0]
    np.testing.assert_allclose(moved[x < 0.3], rig.vertices[x < 0.3], atol=1e-3)
    tip = len(rig.vertices) - 1  # the centre of the cap at x = 2
    np.testing.assert_allclose(moved[tip], [1, 1, 0], atol=1e-5)
