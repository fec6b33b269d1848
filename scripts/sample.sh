#!/usr/bin/env bash
# Builds the library and its command-line tool, then decodes the bundled
# sample photograph into sample.png.
set -euo pipefail
cd "$(dirname "$0")/.."
source scripts/lib.sh

scripts/setup.sh
vetaj_build build

if [ -x build/tools/vetajpeg ]; then
  build/tools/vetajpeg decode tests/data/sample.jpg -o sample.png
  echo "sample.sh: wrote sample.png"
else
  # Temporary, until the command-line tool is in the tree: show that the
  # library builds and loads by printing its version.
  printf '#include <stdio.h>\n#include "VetaJpegDecoder.h"\nint main(void) { printf("VetaJpegDecoder %%d\\n", (int)VETAJ_GetVersion()); return 0; }\n' \
    | cc -x c - -Iinclude -Lbuild -lVetaJpegDecoder -Wl,-rpath,"$PWD/build" -o build/print_version
  build/print_version
fi
