"""Meshes, rigs and references shared by the tests, built with numpy only."""

import json
import os
import struct
import subprocess
from typing import NamedTuple

import numpy as np

import tessik


class Rig(NamedTuple):
    vertices: np.ndarray  # (V, 3) float32
    triangles: np.ndarray  # (T, 3) int64
    joints: np.ndarray  # (B, 4, 4) bind matrices, column-vector convention
    parents: np.ndarray  # (B,) int64
    names: list


def cylinder_x(x0, x1, radius, rings, segments):
    """A closed tube along +x: `rings` rings of `segments` vertices, capped by fans around two centres."""
    theta = 2 * np.pi * np.arange(segments) / segments
    ring = np.stack([np.zeros(segments), radius * np.cos(theta), radius * np.sin(theta)], axis=1)
    xs = np.linspace(x0, x1, rings)
    vertices = np.concatenate([ring + [x, 0, 0] for x in xs] + [[[x0, 0, 0], [x1, 0, 0]]])
    r, s = np.meshgrid(np.arange(rings - 1), np.arange(segments), indexing="ij")
    r, s = r.ravel(), s.ravel()

    def at(ring_index, segment):
        return ring_index * segments + segment % segments

    # Counter-clockwise seen from outside, so the normals face out.
    side = np.concatenate([np.stack([at(r, s), at(r, s + 1), at(r + 1, s)], 1),
                           np.stack([at(r, s + 1), at(r + 1, s + 1), at(r + 1, s)], 1)])
    start, end = rings * segments, rings * segments + 1
    k = np.arange(segments)
    caps = np.concatenate([np.stack([np.full(segments, start), at(0, k + 1), at(0, k)], 1),
                           np.stack([np.full(segments, end), at(rings - 1, k), at(rings - 1, k + 1)], 1)])
    return vertices.astype(np.float32), np.concatenate([side, caps]).astype(np.int64)


def translation(t):
    m = np.eye(4)
    m[:3, 3] = t
    return m


def rotation(axis, angle):
    """4x4 rotation by `angle` radians about `axis` (right-handed, column vectors)."""
    x, y, z = np.asarray(axis, float) / np.linalg.norm(axis)
    c, s, t = np.cos(angle), np.sin(angle), 1 - np.cos(angle)
    m = np.eye(4)
    m[:3, :3] = [[t * x * x + c, t * x * y - s * z, t * x * z + s * y],
                 [t * x * y + s * z, t * y * y + c, t * y * z - s * x],
                 [t * x * z - s * y, t * y * z + s * x, t * z * z + c]]
    return m


def arm():
    """A capped tube along x from 0 to 2 with a shoulder-elbow-wrist chain inside it."""
    vertices, triangles = cylinder_x(0.0, 2.0, 0.2, 16, 12)
    joints = np.stack([translation([x, 0, 0]) for x in (0.1, 1.0, 1.9)])
    return Rig(vertices, triangles, joints, np.array([-1, 0, 1]), ["shoulder", "elbow", "wrist"])


def legs():
    """Two separate tubes hanging down from y = 0 at x = -0.3 and 0.3, each with its own
    hip-knee-ankle chain: a forest of two roots. Left-leg vertices come first."""
    tube, tube_triangles = cylinder_x(0.0, 2.0, 0.15, 14, 10)
    down = tube[:, [1, 0, 2]] * [1, -1, 1]  # (x, y, z) -> (y, -x, z): -90 degrees about z
    vertices = np.concatenate([down + [-0.3, 0, 0], down + [0.3, 0, 0]]).astype(np.float32)
    triangles = np.concatenate([tube_triangles, tube_triangles + len(tube)])
    joints = np.stack([translation([side, -y, 0]) for side in (-0.3, 0.3) for y in (0.1, 1.0, 1.9)])
    names = [f"{side}_{part}" for side in ("left", "right") for part in ("hip", "knee", "ankle")]
    return Rig(vertices, triangles, joints, np.array([-1, 0, 1, -1, 3, 4]), names)


RIGS = {"arm": arm, "legs": legs}


def bind(method, rig, **options):
    """Binds `rig` by "heatmap" or "geodesic" (at resolution 32 unless given, to stay fast)."""
    if method == "geodesic":
        options.setdefault("resolution", 32)
        return tessik.bind_geodesic(*rig, **options)
    return tessik.bind_heatmap(*rig, **options)


def skinning_reference(points, bind, poses, bone_indices, weights, object_matrix=np.eye(4)):
    """Linear blend skinning in float64, with the engine's rules for unusual weights: a point with
    one influence moves that fraction of the way, one whose weights sum to at most 1e-5 stays."""
    points = np.asarray(points, float)
    inverse_object = np.linalg.inv(object_matrix)
    # X_b = O^-1 C_b B_b^-1 O, as (B, 4, 4).
    xforms = inverse_object @ poses @ np.linalg.inv(bind) @ object_matrix
    homogeneous = np.concatenate([points, np.ones((len(points), 1))], axis=1)
    moved = np.einsum("bij,vj->vbi", xforms, homogeneous)[..., :3]  # (V, B, 3)
    used = bone_indices >= 0
    index = np.where(used, bone_indices, 0)
    w = np.where(used, weights, 0.0)
    targets = np.take_along_axis(moved, index[..., None], axis=1)  # (V, k, 3)
    blended = np.einsum("vk,vki->vi", w, targets)
    count = used.sum(axis=1)
    total = w.sum(axis=1)
    single = count == 1
    blended[single] = points[single] + (blended[single] / np.where(total[single], total[single], 1)[:, None]
                                        - points[single]) * total[single][:, None]
    still = (count == 0) | ((count > 1) & (total <= 1e-5))
    blended[still] = points[still]
    return blended


def _glb_accessor(document, binary, index):
    accessor = document["accessors"][index]
    view = document["bufferViews"][accessor["bufferView"]]
    dtype = {5126: np.float32, 5125: np.uint32, 5123: np.uint16, 5121: np.uint8}[accessor["componentType"]]
    width = {"SCALAR": 1, "VEC3": 3, "VEC4": 4}[accessor["type"]]
    start = view.get("byteOffset", 0) + accessor.get("byteOffset", 0)
    return np.frombuffer(binary, dtype, accessor["count"] * width, start).reshape(accessor["count"], width)


def tool_bind(tmp_path, rig, method, resolution=32):
    """Binds `rig` through tessik-bind, which reads it as OBJ and JSON, and answers (mesh, rows): the mesh
    as the tool read it (vertices, triangles, from the GLB it wrote) and, per vertex of that mesh, its
    (bone, weight) pairs from the CSV. None when the program is not available."""
    program = os.environ.get("TESSIK_BIND_EXE")
    if not program:
        return None
    obj, skeleton = tmp_path / "rig.obj", tmp_path / "rig.json"
    glb, csv = tmp_path / "rig.glb", tmp_path / "weights.csv"
    with open(obj, "w") as f:
        f.writelines("v " + " ".join(f"{c:.9g}" for c in v) + "\n" for v in rig.vertices.astype(float))
        f.writelines("f " + " ".join(str(i + 1) for i in t) + "\n" for t in rig.triangles)
    bones = [{"name": name, "parent": None if parent < 0 else rig.names[parent],
              "matrix": [float(e) for e in matrix.ravel()]}
             for name, parent, matrix in zip(rig.names, rig.parents, rig.joints)]
    skeleton.write_text(json.dumps(bones))
    subprocess.run([program, str(obj), "--skeleton", str(skeleton), "--method", method, "--resolution",
                    str(resolution), "-o", str(glb), "--csv", str(csv)], capture_output=True, check=True)
    data = glb.read_bytes()
    json_length = struct.unpack_from("<I", data, 12)[0]
    document = json.loads(data[20:20 + json_length])
    binary = data[20 + json_length + 8:]
    primitive = document["meshes"][0]["primitives"][0]
    vertices = _glb_accessor(document, binary, primitive["attributes"]["POSITION"])
    triangles = _glb_accessor(document, binary, primitive["indices"]).reshape(-1, 3).astype(np.int64)
    index = {name: b for b, name in enumerate(rig.names)}
    rows = [[] for _ in vertices]
    for line in csv.read_text().splitlines()[1:]:
        vertex, bone, weight = line.split(",")
        rows[int(vertex)].append((index[bone], float(weight)))
    return rig._replace(vertices=vertices.copy(), triangles=triangles), rows
