#!/usr/bin/env bash
# Installs every build and test dependency from Debian packages.
# Runs as root, asks nothing, and can be run any number of times.
set -euo pipefail

if [ "$(id -u)" -ne 0 ]; then
  echo "install-deps.sh must run as root" >&2
  exit 1
fi

export DEBIAN_FRONTEND=noninteractive
apt-get update
apt-get install -y --no-install-recommends \
  build-essential cmake pkg-config binutils clang libclang-rt-14-dev \
  protobuf-compiler libprotobuf-dev \
  libgoogle-glog-dev \
  libopencv-dev \
  libboost-dev libboost-thread-dev \
  libopenblas-dev \
  libleveldb-dev libsnappy-dev \
  libgtest-dev libgmock-dev \
  libbenchmark-dev \
  libboost-program-options-dev liblapacke-dev nlohmann-json3-dev \
  python3-dev pybind11-dev python3-numpy python3-pytest python3-opencv python3-distributed
