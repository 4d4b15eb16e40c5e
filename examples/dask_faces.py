#!/usr/bin/python3
"""Faces and landmarks for every image below a folder, on a Dask cluster.

    /usr/bin/python3 examples/dask_faces.py PHOTOS OUT [--workers N | --scheduler ADDRESS]

Each worker thread makes one tavi.Detector, once, and reads its images
itself; each partition of the file list becomes OUT/part-NNNNN.jsonl, one
JSON object per image, written under a temporary name and renamed when
complete. An image that fails is recorded with its error and the others go on.
"""
import argparse
import json
import os
import threading
import time

import cv2
from dask.distributed import Client, LocalCluster, get_worker, progress


def _models(landmarks):
    """This worker thread's detector and, if asked, the landmark model: made
    on first use and kept on the worker (the functions travel by value)."""
    import tavi
    worker = get_worker()
    if not hasattr(worker, "tavi_models"):
        worker.tavi_models = threading.local()
    local = worker.tavi_models
    if not hasattr(local, "detector"):
        local.detector = tavi.Detector()
        local.landmarks = tavi.Landmarks() if landmarks else None
    return local.detector, local.landmarks


def _one_image(path, min_face, landmarks):
    detector, model = _models(landmarks)
    image = cv2.imread(path, cv2.IMREAD_COLOR)
    if image is None:
        return {"file": path, "error": "not an image OpenCV can decode"}
    faces = []
    for face in detector.detect(image, min_face=min_face):
        entry = {"box": list(face.box), "score": face.score}
        if model is not None:
            entry["points"] = model.align(image, face.box, points=landmarks).tolist()
        faces.append(entry)
    return {"file": path, "width": image.shape[1], "height": image.shape[0], "faces": faces}


def process_partition(index, paths, out_dir, min_face, landmarks):
    """Writes one partition's results; returns the number of images and of failures."""
    failures = 0
    target = os.path.join(out_dir, "part-%05d.jsonl" % index)
    with open(target + ".partial", "w") as out:
        for path in paths:
            try:
                result = _one_image(path, min_face, landmarks)
            except Exception as error:  # one bad image must not lose the others
                result = {"file": path, "error": "%s: %s" % (type(error).__name__, error)}
            failures += "error" in result
            out.write(json.dumps(result) + "\n")
    os.replace(target + ".partial", target)
    return len(paths), failures


def list_images(root):
    return sorted(os.path.join(folder, name)
                  for folder, _, names in os.walk(root) for name in names)


def run(client, root, out_dir, partitions, min_face=40, landmarks=68, show_progress=True):
    """Processes every file below root; returns (images, failures)."""
    os.makedirs(out_dir, exist_ok=True)
    paths = list_images(root)
    count = max(1, min(partitions, len(paths)))
    chunks = [paths[i::count] for i in range(count)]
    futures = client.map(process_partition, range(count), chunks, out_dir=out_dir,
                         min_face=min_face, landmarks=landmarks, pure=False)
    if show_progress:
        progress(futures)
    done = client.gather(futures)
    return sum(n for n, _ in done), sum(f for _, f in done)


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    parser.add_argument("photos")
    parser.add_argument("out")
    parser.add_argument("--workers", type=int, default=2, help="local worker processes")
    parser.add_argument("--scheduler", help="address of an existing Dask scheduler")
    parser.add_argument("--partitions", type=int, default=16)
    parser.add_argument("--min-face", type=int, default=40)
    parser.add_argument("--landmarks", type=int, choices=(0, 5, 68), default=68)
    args = parser.parse_args()
    if args.scheduler:
        client = Client(args.scheduler)
    else:
        # One thread a worker: each holds one detector and runs on one core.
        client = Client(LocalCluster(n_workers=args.workers, threads_per_worker=1,
                                     env={"OPENBLAS_NUM_THREADS": "1"}))
    start = time.monotonic()
    images, failures = run(client, args.photos, args.out, args.partitions,
                           args.min_face, args.landmarks)
    seconds = time.monotonic() - start
    print("\n%d images, %d failed, in %.1f s (%.1f images/s); results in %s"
          % (images, failures, seconds, images / seconds, args.out))
    client.close()


if __name__ == "__main__":
    main()
