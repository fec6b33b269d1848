# shellcheck shell=bash
# Shared by the scripts: configure and build one build tree.
#
#   vetaj_build DIR [cmake options...]
#
# The default is an optimised build that keeps assertions (no -DNDEBUG) and
# no sanitizers; later options override it.
vetaj_build() {
  local dir=$1
  shift
  cmake -S . -B "$dir" -DCMAKE_BUILD_TYPE=Release \
        -DCMAKE_C_FLAGS_RELEASE=-O2 -DCMAKE_CXX_FLAGS_RELEASE=-O2 \
        -DVETAJ_SANITIZE=OFF "$@"
  cmake --build "$dir" -j2
}
