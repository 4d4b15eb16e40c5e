#!/usr/bin/env bash
# Installs the dependencies, builds the library and the tavi tool, and finds
# the face and its 68 landmarks in the bundled sample photo: the JSON on
# standard output, the annotated copy in build/sample/. The Python module
# lands in build/python/.
set -euo pipefail
cd "$(dirname "$0")/.."

if [ "$(id -u)" -eq 0 ]; then
  bash scripts/install-deps.sh >&2
else
  sudo bash scripts/install-deps.sh >&2
fi

cmake -S . -B build -DCMAKE_BUILD_TYPE=Release >&2
cmake --build build -j "$(nproc)" --target tavi_tool tavi_python >&2
build/tools/tavi detect --landmarks 68 --draw build/sample samples/astronaut.png
echo "annotated copy: build/sample/astronaut.png" >&2
