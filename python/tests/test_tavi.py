"""The Python module against the C++ tool, on the bundled sample photo."""
import json
import os
import subprocess
import threading

import cv2
import numpy as np
import pytest

import tavi

SAMPLE = os.environ["TAVI_SAMPLE"]


@pytest.fixture(scope="module")
def photo():
    return cv2.imread(SAMPLE, cv2.IMREAD_COLOR)


def tool_faces(*options):
    out = subprocess.run([os.environ["TAVI_TOOL"], "detect", *options, SAMPLE],
                         check=True, capture_output=True, text=True).stdout
    return json.loads(out)["faces"]


def test_faces_and_landmarks_equal_the_tools(photo):
    expected = tool_faces("--landmarks", "68")
    faces = tavi.Detector().detect(photo)
    assert len(faces) == len(expected) == 1
    for face, want in zip(faces, expected):
        assert face.box == tuple(np.float32(want["box"]))
        assert np.float32(face.score) == np.float32(want["score"])
        points = tavi.Landmarks().align(photo, face.box, points=68)
        assert points.shape == (68, 2) and points.dtype == np.float32
        assert np.array_equal(points, np.float32(want["points"]))
    five = tavi.Landmarks().align(photo, faces[0].box, points=5)
    assert np.array_equal(five, np.float32(tool_faces("--landmarks", "5")[0]["points"]))


def test_other_layouts_are_converted_and_bad_arrays_refused(photo):
    detector = tavi.Detector()
    colour = detector.detect(photo)
    grey = cv2.cvtColor(photo, cv2.COLOR_BGR2GRAY)
    assert detector.detect(grey)[0].box == detector.detect(cv2.cvtColor(grey, cv2.COLOR_GRAY2BGR))[0].box
    assert detector.detect(cv2.cvtColor(photo, cv2.COLOR_BGR2BGRA))[0].box == colour[0].box
    mirrored = photo[:, ::-1]  # not contiguous: copied
    assert detector.detect(mirrored)[0].box == detector.detect(np.ascontiguousarray(mirrored))[0].box
    for bad in (photo.astype(np.float32), photo[:, :, :2], photo[:, :, 0].ravel(),
                np.zeros((0, 0, 3), np.uint8)):
        with pytest.raises(ValueError):
            detector.detect(bad)
    with pytest.raises(ValueError):
        detector.detect(photo, min_face=0)
    with pytest.raises(ValueError):
        tavi.Landmarks().align(photo, (1, 2, 3), points=68)
    with pytest.raises(ValueError):
        tavi.Detector(models="/nonexistent/")


def test_threads_with_their_own_detectors_agree(photo):
    expected = [face.box for face in tavi.Detector().detect(photo)]
    results = [None] * 4

    def work(slot):
        detector = tavi.Detector()
        results[slot] = [[face.box for face in detector.detect(photo)] for _ in range(3)]

    threads = [threading.Thread(target=work, args=(slot,)) for slot in range(4)]
    for thread in threads:
        thread.start()
    for thread in threads:
        thread.join()
    assert all(runs == [expected] * 3 for runs in results)


def test_a_detector_shared_by_two_threads_refuses_the_second(photo):
    detector = tavi.Detector()
    large = cv2.resize(photo, (2560, 2560))
    expected = [face.box for face in detector.detect(large, min_face=20)]
    outcomes = []

    def work():
        try:
            outcomes.append([face.box for face in detector.detect(large, min_face=20)])
        except RuntimeError as error:
            outcomes.append(str(error))

    for _ in range(5):  # until the two calls overlap
        outcomes.clear()
        threads = [threading.Thread(target=work) for _ in range(2)]
        for thread in threads:
            thread.start()
        for thread in threads:
            thread.join()
        if any(isinstance(outcome, str) for outcome in outcomes):
            break
    assert "create one Detector per thread" in " ".join(o for o in outcomes if isinstance(o, str))
    assert all(outcome == expected for outcome in outcomes if not isinstance(outcome, str))
