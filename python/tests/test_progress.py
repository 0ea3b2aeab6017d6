import os
import signal
import sys
import threading
import time

import numpy as np
import pytest

import rigs
import tessik


def test_progress_reports_each_stage_on_the_calling_thread(gl):
    calls = []
    rigs.bind("geodesic", rigs.arm(),
              progress=lambda stage, fraction: calls.append((stage, fraction, threading.get_ident())))
    stages = list(dict.fromkeys(stage for stage, _, _ in calls))
    assert len(stages) >= 3
    # Titles come without the library's trailing " ... ".
    assert all(stage and stage == stage.strip(" .") for stage in stages)
    for stage in stages:
        assert next(f for s, f, _ in calls if s == stage) == 0.0, f"{stage} starts at 0"
    assert all(isinstance(f, float) and 0.0 <= f <= 1.0 for _, f, _ in calls)
    assert calls[-1][1] == 1.0
    assert {thread for _, _, thread in calls} == {threading.get_ident()}


class Stop(Exception):
    pass


@pytest.mark.parametrize("method, exception, at_call", [
    ("heatmap", KeyboardInterrupt, 1),
    ("geodesic", KeyboardInterrupt, 1),
    ("geodesic", KeyboardInterrupt, 4),
    ("heatmap", Stop, 1),
    ("geodesic", Stop, 2),
])
def test_an_exception_from_progress_cancels_the_binding_and_propagates(bound, method, exception, at_call):
    calls = []

    def progress(stage, fraction):
        calls.append(stage)
        if len(calls) == at_call:
            raise exception("stop here")

    rig = rigs.arm()
    with pytest.raises(exception, match="stop here") as info:
        rigs.bind(method, rig, progress=progress)
    assert info.type is exception, "the exception keeps its type (KeyboardInterrupt stays one)"
    assert len(calls) == at_call, "no Python is called once the binding is cancelled"
    # Nothing is left half-done: the next binding is complete and the same as an undisturbed one.
    _, expected_indices, expected_weights = bound("geodesic", "arm")
    bone_indices, weights = rigs.bind("geodesic", rig)
    np.testing.assert_array_equal(bone_indices, expected_indices)
    np.testing.assert_array_equal(weights, expected_weights)


class Interrupted(Exception):
    """What SIGINT raises during the next test: an ordinary exception, so that a signal arriving after
    the call returned fails that test instead of stopping the whole pytest session."""


def test_ctrl_c_while_the_library_works_cancels_the_binding(gl):
    # A helper thread sends SIGINT once the main thread is inside the library. It can run then only
    # because the binding released the GIL; the library, polling through isCanceled, runs the signal
    # handler, stops, and the call raises what the handler raised instead of returning.
    main = threading.main_thread().ident
    started = threading.Event()
    calls, seen = [], []
    # Dense enough (about 40k vertices) that the heat stage lasts far longer than the helper needs to
    # react, however fast the binding gets.
    vertices, triangles = rigs.cylinder_x(0.0, 2.0, 0.2, 600, 64)
    dense_arm = rigs.arm()._replace(vertices=vertices, triangles=triangles)

    def progress(stage, fraction):
        calls.append(stage)
        # The pipeline's own steps before it are over in a moment; the method's stage takes longer.
        if stage.startswith("Computing Heatmap weights"):
            started.set()

    def interrupt():
        started.wait()
        while sys._current_frames()[main].f_code is progress.__code__:
            time.sleep(0.001)  # let the callable return into the library
        seen.append(len(calls))
        os.kill(os.getpid(), signal.SIGINT)

    def on_sigint(signum, frame):
        raise Interrupted("Ctrl-C")

    previous = signal.signal(signal.SIGINT, on_sigint)
    result = None
    try:
        helper = threading.Thread(target=interrupt)
        helper.start()
        try:
            with pytest.raises(Interrupted):
                result = tessik.bind_heatmap(*dense_arm, progress=progress)
        finally:
            helper.join()
    finally:
        signal.signal(signal.SIGINT, previous)
    assert result is None
    assert len(seen) == 1 and calls[seen[0] - 1].startswith("Computing Heatmap weights"), \
        "the helper ran while the library worked on the heat-map stage"
    assert len(calls) == seen[0], "the interrupt stopped the run before it reported again"


def test_a_binding_started_from_a_progress_callback_raises_instead_of_waiting():
    seen = []

    def nested(stage, fraction):
        if not seen:
            seen.append(stage)
            tessik.bind_heatmap(*rigs.arm())

    with pytest.raises(RuntimeError, match="already binding"):
        tessik.bind_heatmap(*rigs.arm(), progress=nested)
    # The lock and the flag are released: the next binding runs.
    _, weights = tessik.bind_heatmap(*rigs.arm())
    assert weights.shape[0] == len(rigs.arm().vertices)
