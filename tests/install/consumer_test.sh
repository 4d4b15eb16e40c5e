#!/usr/bin/env bash
# Installs the build tree into a scratch prefix, then builds a host program
# against it twice (CMake package, pkg-config) and runs it on the installed
# models, and runs the installed tavi tool without naming its models.
# usage: consumer_test.sh BUILD_DIR SOURCE_DIR
set -euo pipefail
build=$1
source=$2
scratch=$(mktemp -d)
trap 'rm -rf "$scratch"' EXIT
prefix=$scratch/prefix

cmake --install "$build" --prefix "$prefix" > /dev/null
# The installed tree must work wherever it lies.
mv "$prefix" "$scratch/moved"
prefix=$scratch/moved

cmake -S "$source/tests/install" -B "$scratch/cmake-build" -DCMAKE_PREFIX_PATH="$prefix" > /dev/null
cmake --build "$scratch/cmake-build" > /dev/null
LD_LIBRARY_PATH="$prefix/lib" "$scratch/cmake-build/consumer"

export PKG_CONFIG_PATH="$prefix/lib/pkgconfig"
g++ -std=c++17 "$source/tests/install/consumer.cpp" -o "$scratch/pc-consumer" \
  -DMODEL_DIR="\"$(pkg-config --variable=modeldir tavi)/\"" \
  $(pkg-config --cflags --libs tavi) -Wl,-rpath,"$(pkg-config --variable=libdir tavi)"
"$scratch/pc-consumer"

output=$("$prefix/bin/tavi" detect --landmarks 5 "$source/samples/astronaut.png")
echo "$output"
grep -q '"faces":\[{"box"' <<< "$output"

# The installed Python module, where one was built, with the installed models.
site=$(echo "$prefix"/lib/python3*/dist-packages)
if [ -d "$site" ]; then
  PYTHONPATH="$site" /usr/bin/python3 -c "
import sys, tavi
assert tavi.default_models.startswith(sys.argv[1]), tavi.default_models
tavi.Detector(); tavi.Landmarks()" "$prefix"
fi
