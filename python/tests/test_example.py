import pathlib
import subprocess
import sys

import numpy as np

EXAMPLES = pathlib.Path(__file__).resolve().parents[2] / "examples"
sys.path.insert(0, str(EXAMPLES))
import bend_arm  # noqa: E402  (the example's own OBJ reader checks what it wrote)


def test_the_example_bends_the_arm_obj(gl, tmp_path):
    out = tmp_path / "bent.obj"
    run = subprocess.run([sys.executable, str(EXAMPLES / "bend_arm.py"), str(EXAMPLES / "arm.obj"), str(out),
                          "--angle", "90"], capture_output=True, text=True)
    assert run.returncode == 0, run.stderr
    assert f"wrote {out}" in run.stdout
    rest, triangles = bend_arm.load_obj(EXAMPLES / "arm.obj")
    bent, bent_triangles = bend_arm.load_obj(out)
    np.testing.assert_array_equal(bent_triangles, triangles)
    near_shoulder = rest[:, 0] < 0.3
    np.testing.assert_allclose(bent[near_shoulder], rest[near_shoulder], atol=1e-4)
    # The elbow sits at x = 1; the centre of the far cap turns 90 degrees about z around it.
    np.testing.assert_allclose(bent[-1], [1, 1, 0], atol=1e-4)
