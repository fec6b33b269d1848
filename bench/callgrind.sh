#!/usr/bin/env bash
# Instruction counts of entropy decoding under callgrind: repeatable where
# timings on a busy machine are not.
#
#   bench/callgrind.sh FILE [BENCH]
#
# FILE is a baseline JPEG. BENCH is the vetaj_bench program; by default
# build-bench/bench/vetaj_bench, built (CMake's Release flags) when missing.
#
# Counts, both inclusive and with callgrind's branch simulation:
#   vetaj          VETAJ_DecodeMcu over every MCU of the first scan, and the
#                  whole entropy pass around it (clearing the blocks included)
#   libjpeg-turbo  its decode_mcu within jpeg_read_coefficients, and the whole
#                  jpeg_read_coefficients (coefficient buffer set-up and zeroing
#                  included)
# and the decoder's instructions per compressed bit (entropy-coded bytes x 8).
set -euo pipefail

if [ $# -lt 1 ] || [ $# -gt 2 ]; then
  echo "usage: bench/callgrind.sh FILE [BENCH]" >&2
  exit 2
fi
file=$1
here=$(cd "$(dirname "$0")" && pwd)
root=$(dirname "$here")
bench=${2:-$root/build-bench/bench/vetaj_bench}

SUDO=()
if [ "$(id -u)" -ne 0 ] && command -v sudo >/dev/null; then SUDO=(sudo); fi
if ! command -v valgrind >/dev/null || ! command -v python3 >/dev/null; then
  echo "callgrind: installing valgrind and python3"
  "${SUDO[@]}" apt-get update -qq
  DEBIAN_FRONTEND=noninteractive "${SUDO[@]}" apt-get install -y -qq --no-install-recommends \
    valgrind python3
fi
if [ ! -x "$bench" ]; then
  cmake -S "$root" -B "$root/build-bench" -DCMAKE_BUILD_TYPE=Release -DVETAJ_BUILD_BENCH=ON \
        -DVETAJ_BUILD_TESTS=OFF -DVETAJ_BUILD_TOOLS=OFF -DVETAJ_SANITIZE=OFF
  cmake --build "$root/build-bench" -j2 --target vetaj_bench
  bench=$root/build-bench/bench/vetaj_bench
fi

tmp=$(mktemp -d)
trap 'rm -rf "$tmp"' EXIT

# run SIDE: callgrind over one entropy pass of SIDE; prints the cost line.
run() {
  local side=$1
  valgrind --tool=callgrind --branch-sim=yes --callgrind-out-file="$tmp/$side.out" \
    "$bench" entropy "$file" --once --side "$side" >"$tmp/$side.txt" 2>"$tmp/$side.log" || {
    cat "$tmp/$side.txt" "$tmp/$side.log" >&2
    echo "callgrind: the $side pass failed" >&2
    return 1
  }
  local mcus
  mcus=$(sed -n 's/^entropy-once .* mcus=\([0-9]*\) .*/\1/p' "$tmp/$side.txt")
  python3 "$here/callgrind_costs.py" "$side" "$tmp/$side.out" "$mcus"
}

vetaj=$(run vetaj)
turbo=$(run libjpeg)
bytes=$(sed -n 's/^entropy-once .* entropy_bytes=\([0-9]*\).*/\1/p' "$tmp/vetaj.txt")
mcus=$(sed -n 's/^entropy-once .* mcus=\([0-9]*\) .*/\1/p' "$tmp/vetaj.txt")

python3 - "$(basename "$file")" "$bytes" "$mcus" "$vetaj" "$turbo" <<'EOF'
import sys

name, nbytes, mcus = sys.argv[1], int(sys.argv[2]), int(sys.argv[3])
bits = nbytes * 8
print(f"{name}: {mcus} MCUs, {nbytes} entropy-coded bytes ({bits} bits)")
print(f"{'':14} {'MCU decoder Ir':>15} {'Ir/bit':>7} {'Ir/MCU':>7} "
      f"{'mispredicts':>12} {'/kbit':>6} {'whole pass Ir':>14}")
for who, line in (("vetaj", sys.argv[4]), ("libjpeg-turbo", sys.argv[5])):
    v = dict(kv.split("=") for kv in line.split())
    ir, total, miss = int(v["decoder"]), int(v["pass"]), int(v.get("mispredicts", 0))
    print(f"{who:14} {ir:15,} {ir / bits:7.2f} {ir / mcus:7.0f} "
          f"{miss:12,} {miss * 1000 / bits:6.2f} {total:14,}")
EOF
