#!/usr/bin/env bash
# Builds the library and its command-line tool, then decodes the bundled
# sample photograph into sample.png.
set -euo pipefail
cd "$(dirname "$0")/.."
source scripts/lib.sh

scripts/setup.sh
vetaj_build build

if [ ! -x build/tools/vetajpeg ]; then
  echo "sample.sh: build/tools/vetajpeg was not built (is libpng-dev installed?)" >&2
  exit 1
fi
build/tools/vetajpeg decode tests/data/sample.jpg -o sample.png
echo "sample.sh: wrote sample.png"
