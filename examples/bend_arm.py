#!/usr/bin/env python3
"""Binds an OBJ mesh to a three-joint chain, bends it at the middle joint and writes the result.

The chain runs along the longest side of the mesh's bounding box (shoulder, elbow, wrist), so any
elongated mesh works; examples/arm.obj is a small tube. From the repository root, after a build:

    PYTHONPATH=build/release/python /usr/bin/python3 examples/bend_arm.py examples/arm.obj bent.obj
"""

import argparse

import numpy as np

import tessik


def load_obj(path):
    """Vertices (V, 3) and triangles (T, 3) of an OBJ file; polygons become triangle fans."""
    vertices, triangles = [], []
    with open(path) as f:
        for line in f:
            fields = line.split()
            if not fields:
                continue
            if fields[0] == "v":
                vertices.append([float(c) for c in fields[1:4]])
            elif fields[0] == "f":
                # "f 1 2 3", "f 1/1/1 2/2/2 ...": one-based, negative counts back from the last vertex.
                corners = [int(c.split("/")[0]) for c in fields[1:]]
                corners = [c - 1 if c > 0 else len(vertices) + c for c in corners]
                triangles += [(corners[0], corners[k], corners[k + 1]) for k in range(1, len(corners) - 1)]
    return np.array(vertices, dtype=np.float64), np.array(triangles, dtype=np.int64)


def save_obj(path, vertices, triangles):
    with open(path, "w") as f:
        f.write("# bent by tessik examples/bend_arm.py\n")
        np.savetxt(f, vertices, fmt="v %.6f %.6f %.6f")
        np.savetxt(f, triangles + 1, fmt="f %d %d %d")


def chain_along_longest_side(vertices):
    """Bind matrices (3, 4, 4) of joints at 5 %, 50 % and 95 % of the longest side, and their parents."""
    lower, upper = vertices.min(axis=0), vertices.max(axis=0)
    axis = np.argmax(upper - lower)
    centre = (lower + upper) / 2
    joints = np.tile(np.eye(4), (3, 1, 1))
    for joint, t in zip(joints, (0.05, 0.5, 0.95)):
        joint[:3, 3] = centre
        joint[axis, 3] = lower[axis] + t * (upper[axis] - lower[axis])
    return joints, np.array([-1, 0, 1]), axis


def turn_about(point, axis, degrees):
    """4x4 rotation by `degrees` about the line through `point` along a unit `axis`."""
    x, y, z = axis
    a = np.radians(degrees)
    c, s, t = np.cos(a), np.sin(a), 1 - np.cos(a)
    rotation = np.array([[t * x * x + c, t * x * y - s * z, t * x * z + s * y],
                         [t * x * y + s * z, t * y * y + c, t * y * z - s * x],
                         [t * x * z - s * y, t * y * z + s * x, t * z * z + c]])
    m = np.eye(4)
    m[:3, :3] = rotation
    m[:3, 3] = point - rotation @ point
    return m


def main():
    parser = argparse.ArgumentParser(description=__doc__.splitlines()[0])
    parser.add_argument("mesh", help="input OBJ")
    parser.add_argument("out", help="where to write the bent OBJ")
    parser.add_argument("--angle", type=float, default=60.0, help="elbow bend in degrees (default 60)")
    parser.add_argument("--method", choices=["geodesic", "heatmap"], default="geodesic")
    args = parser.parse_args()

    vertices, triangles = load_obj(args.mesh)
    joints, parents, axis = chain_along_longest_side(vertices)
    if args.method == "geodesic":
        bone_indices, weights = tessik.bind_geodesic(vertices, triangles, joints, parents, resolution=64)
    else:
        bone_indices, weights = tessik.bind_heatmap(vertices, triangles, joints, parents)

    # Pose one bone: turn the elbow, and the wrist below it, about an axis across the chain.
    bend_axis = np.roll([0.0, 0.0, 1.0], axis)  # z for a chain along x, x along y, y along z
    turn = turn_about(joints[1, :3, 3], bend_axis, args.angle)
    poses = joints.copy()
    poses[1:] = turn @ joints[1:]

    skin = tessik.Skin(joints, bone_indices, weights)
    bent = skin.deform(vertices, poses)
    save_obj(args.out, bent, triangles)
    print(f"bound {len(vertices)} vertices to {len(joints)} bones (up to {bone_indices.shape[1]} each), "
          f"bent by {args.angle:g} degrees, wrote {args.out}")


if __name__ == "__main__":
    main()
