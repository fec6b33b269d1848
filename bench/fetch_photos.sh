#!/usr/bin/env bash
# Builds the benchmark photographs in bench/photos/ (not committed).
#
# The sources are real photographs from Debian's mate-backgrounds package
# (GPL-2+). Each is brought to 4000x3000 (12 Mpixel) and re-encoded with
# libjpeg-turbo's cjpeg at quality 90 in six variants:
#
#   NAME_420.jpg      4:2:0 baseline        NAME_grey.jpg     greyscale baseline
#   NAME_422.jpg      4:2:2 baseline        NAME_prog420.jpg  4:2:0 progressive
#   NAME_444.jpg      4:4:4 baseline        NAME_rst420.jpg   4:2:0, a restart marker
#                                                             after every MCU row
#
# Photographs:
#   elephants  abstract/Elephants_5640x3172.jpg, centre crop (full detail)
#   wood       nature/Wood.jpg (2560x1920), enlarged 13/8 by djpeg, centre crop
#
# Idempotent: files already present are kept. Installs cjpeg/djpeg
# (libjpeg-turbo-progs) and python3 when missing.
set -euo pipefail

here=$(cd "$(dirname "$0")" && pwd)
out=$here/photos
mkdir -p "$out"

names=(elephants wood)
variants=(420 422 444 grey prog420 rst420)

complete=1
for n in "${names[@]}"; do
  for v in "${variants[@]}"; do
    [ -s "$out/${n}_$v.jpg" ] || complete=0
  done
done
if [ "$complete" -eq 1 ]; then
  echo "fetch_photos: bench/photos is complete"
  exit 0
fi

SUDO=()
if [ "$(id -u)" -ne 0 ] && command -v sudo >/dev/null; then SUDO=(sudo); fi
need=()
command -v cjpeg >/dev/null && command -v djpeg >/dev/null || need+=(libjpeg-turbo-progs)
command -v python3 >/dev/null || need+=(python3)
if [ "${#need[@]}" -gt 0 ]; then
  echo "fetch_photos: installing ${need[*]}"
  "${SUDO[@]}" apt-get update -qq
  DEBIAN_FRONTEND=noninteractive "${SUDO[@]}" apt-get install -y -qq --no-install-recommends "${need[@]}"
fi

tmp=$(mktemp -d)
trap 'rm -rf "$tmp"' EXIT
# apt-get download writes into the current directory; the _apt user must be
# able to write there.
chmod 755 "$tmp"
(cd "$tmp" && apt-get download -q mate-backgrounds >/dev/null 2>&1) || {
  "${SUDO[@]}" apt-get update -qq
  (cd "$tmp" && apt-get download -q mate-backgrounds)
}
dpkg -x "$tmp"/mate-backgrounds_*.deb "$tmp/pkg"
src=$tmp/pkg/usr/share/backgrounds/mate

# Centre crop of a binary PPM (P6, maxval 255) to WIDTHxHEIGHT.
crop() {
  python3 - "$1" "$2" "$3" "$4" <<'EOF'
import sys

src, dst, w, h = sys.argv[1], sys.argv[2], int(sys.argv[3]), int(sys.argv[4])
data = open(src, "rb").read()
fields, pos = [], 0
while len(fields) < 4:  # magic, width, height, maxval; '#' comments allowed
    while data[pos:pos + 1].isspace():
        pos += 1
    if data[pos:pos + 1] == b"#":
        pos = data.index(b"\n", pos) + 1
        continue
    end = pos
    while not data[end:end + 1].isspace():
        end += 1
    fields.append(data[pos:end])
    pos = end
pos += 1  # the single whitespace byte before the samples
if fields[0] != b"P6" or fields[3] != b"255":
    sys.exit("crop: expected an 8-bit binary PPM")
sw, sh = int(fields[1]), int(fields[2])
if sw < w or sh < h:
    sys.exit(f"crop: source {sw}x{sh} is smaller than {w}x{h}")
x0, y0 = (sw - w) // 2, (sh - h) // 2
rows = []
for y in range(y0, y0 + h):
    start = pos + (y * sw + x0) * 3
    rows.append(data[start:start + w * 3])
with open(dst, "wb") as f:
    f.write(b"P6\n%d %d\n255\n" % (w, h))
    f.write(b"".join(rows))
EOF
}

# prepare NAME SOURCE [DJPEG OPTIONS...]: 4000x3000 PPM of a source photo.
prepare() {
  local name=$1 file=$2
  shift 2
  djpeg -pnm "$@" -outfile "$tmp/$name.full.ppm" "$src/$file"
  crop "$tmp/$name.full.ppm" "$tmp/$name.ppm" 4000 3000
  rm -f "$tmp/$name.full.ppm"
}

encode() {
  local name=$1 variant=$2 target=$out/${1}_$2.jpg
  shift 2
  [ -s "$target" ] && return 0
  cjpeg -quality 90 "$@" -outfile "$target.part" "$tmp/$name.ppm"
  mv "$target.part" "$target"
  echo "fetch_photos: wrote bench/photos/${name}_$variant.jpg"
}

prepare elephants abstract/Elephants_5640x3172.jpg
prepare wood nature/Wood.jpg -scale 13/8
for n in "${names[@]}"; do
  encode "$n" 420 -sample 2x2
  encode "$n" 422 -sample 2x1
  encode "$n" 444 -sample 1x1
  encode "$n" grey -grayscale
  encode "$n" prog420 -sample 2x2 -progressive
  encode "$n" rst420 -sample 2x2 -restart 1
done
