#!/usr/bin/python3
"""Applies each deliberate fault of faults.tsv in turn to a scratch copy of
the project, builds it and runs the suite, and reports which faults the
suite catches.

    /usr/bin/python3 tests/faults/run_faults.py [--scratch DIR] [--only N ...]

A fault is an exact text that must occur once in its file and its
replacement. Caught: the build fails or some test fails. The baseline
(no fault) must build and pass first. Takes about a minute a fault on two
cores."""
import argparse
import os
import shutil
import subprocess
import sys

ROOT = os.path.abspath(os.path.join(os.path.dirname(__file__), "..", ".."))


def faults():
    for number, line in enumerate(
            (l for l in open(os.path.join(ROOT, "tests", "faults", "faults.tsv"))
             if l.strip() and not l.startswith("#")), start=1):
        path, text, replacement, what = line.rstrip("\n").split("\t")
        yield number, path, text, replacement, what


def run(command, cwd):
    return subprocess.run(command, cwd=cwd, stdout=subprocess.DEVNULL,
                          stderr=subprocess.DEVNULL).returncode == 0


def main():
    parser = argparse.ArgumentParser(description=__doc__.split("\n")[0])
    parser.add_argument("--scratch", default="/tmp/tavi-faults")
    parser.add_argument("--only", type=int, nargs="*")
    args = parser.parse_args()
    jobs = str(os.cpu_count())
    shutil.rmtree(args.scratch, ignore_errors=True)
    shutil.copytree(ROOT, args.scratch, ignore=shutil.ignore_patterns("build*", ".git"))
    build = os.path.join(args.scratch, "build")
    configure = ["cmake", "-S", args.scratch, "-B", build, "-DCMAKE_BUILD_TYPE=Release",
                 "-DTAVI_BUILD_BENCHMARKS=OFF", "-DTAVI_BUILD_PYTHON=OFF"]
    make = ["cmake", "--build", build, "-j", jobs]
    test = ["ctest", "--test-dir", build, "-j", jobs, "--stop-on-failure"]
    env_ok = run(configure, args.scratch) and run(make, args.scratch) and run(test, args.scratch)
    if not env_ok:
        sys.exit("the baseline does not build and pass")
    caught = missed = 0
    for number, path, text, replacement, what in faults():
        if args.only and number not in args.only:
            continue
        file = os.path.join(args.scratch, path)
        original = open(file).read()
        if original.count(text) != 1:
            print("%2d STALE   %s: %s" % (number, path, what))
            continue
        open(file, "w").write(original.replace(text, replacement))
        if not run(make, args.scratch):
            verdict = "caught (build)"
        elif not run(test, args.scratch):
            verdict = "caught"
        else:
            verdict = "MISSED"
        open(file, "w").write(original)
        caught += verdict.startswith("caught")
        missed += verdict == "MISSED"
        print("%2d %-14s %s: %s" % (number, verdict, path, what), flush=True)
    run(make, args.scratch)
    print("%d caught, %d missed" % (caught, missed))


if __name__ == "__main__":
    main()
