"""The Dask example on a small local cluster: every image gets a result."""
import json
import os
import shutil
import sys

import pytest
from dask.distributed import Client, LocalCluster

EXAMPLES = os.path.join(os.path.dirname(__file__), "..", "..", "examples")


@pytest.fixture(scope="module")
def example():
    sys.path.insert(0, EXAMPLES)
    import dask_faces
    return dask_faces


def test_every_image_gets_a_line_and_a_bad_one_its_error(example, tmp_path):
    photos = tmp_path / "photos"
    (photos / "inner").mkdir(parents=True)
    for name in ("a.png", "b.png", "inner/c.png"):
        shutil.copy(os.environ["TAVI_SAMPLE"], photos / name)
    (photos / "notes.txt").write_text("not a photo\n")
    with LocalCluster(n_workers=2, threads_per_worker=1, processes=True,
                      dashboard_address=None) as cluster, Client(cluster) as client:
        images, failures = example.run(client, str(photos), str(tmp_path / "out"), partitions=3,
                                       landmarks=5, show_progress=False)
    assert (images, failures) == (4, 1)
    parts = sorted(os.listdir(tmp_path / "out"))
    assert parts == ["part-00000.jsonl", "part-00001.jsonl", "part-00002.jsonl"]
    lines = [json.loads(line) for part in parts for line in open(tmp_path / "out" / part)]
    by_name = {os.path.relpath(line["file"], photos): line for line in lines}
    assert sorted(by_name) == ["a.png", "b.png", "inner/c.png", "notes.txt"]
    assert by_name["notes.txt"]["error"] == "not an image OpenCV can decode"
    for name in ("a.png", "b.png", "inner/c.png"):
        assert len(by_name[name]["faces"]) == 1
        assert len(by_name[name]["faces"][0]["points"]) == 5
