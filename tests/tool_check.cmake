# Runs the command-line tool vetajpeg on the bundled fixtures: decodes to
# PNG, the header and Exif summary, and the failures (missing file, not a
# JPEG, unsupported frame, bad command line) with their messages and exit
# status.
#
#   cmake -DTOOL=path/to/vetajpeg -DDATA=tests/data -DWORK=scratch/dir
#         [-DEMULATOR="qemu-arm -L ..."] -P tool_check.cmake
separate_arguments(emulator UNIX_COMMAND "${EMULATOR}")
file(REMOVE_RECURSE "${WORK}")
file(MAKE_DIRECTORY "${WORK}")

# Runs the tool with the given arguments, expects exit status `status` and
# each `regex` to match stdout (info) or stderr (everything else):
#   run(status "regex;regex" arguments...)
function(run status regexes)
  execute_process(COMMAND ${emulator} "${TOOL}" ${ARGN}
                  RESULT_VARIABLE rc OUTPUT_VARIABLE out ERROR_VARIABLE err)
  string(REPLACE ";" " " command "vetajpeg ${ARGN}")
  set(context "${command}\n  exit status: ${rc}\n  stdout: ${out}\n  stderr: ${err}")
  if(NOT "${rc}" STREQUAL "${status}")
    message(SEND_ERROR "expected exit status ${status}: ${context}")
  endif()
  set(text "${err}")
  if(ARGV2 STREQUAL "info")  # the summary goes to stdout
    set(text "${out}")
  endif()
  foreach(regex IN LISTS regexes)
    if(NOT "${text}" MATCHES "${regex}")
      message(SEND_ERROR "no match for '${regex}': ${context}")
    endif()
  endforeach()
endfunction()

# decodes(name width height input options...): writes ${WORK}/name.png, a PNG
# of that size.
function(decodes name width height input)
  set(file "${WORK}/${name}.png")
  run(0 "" decode "${input}" -o "${file}" ${ARGN})
  file(READ "${file}" head LIMIT 24 HEX)  # signature, IHDR width and height
  if(head MATCHES "^89504e470d0a1a0a................(........)(........)$")
    math(EXPR w "0x${CMAKE_MATCH_1}")
    math(EXPR h "0x${CMAKE_MATCH_2}")
  endif()
  if(NOT "${w}x${h}" STREQUAL "${width}x${height}")
    message(SEND_ERROR "${file}: not a PNG of ${width}x${height} (${head})")
  endif()
endfunction()

# Decoding to PNG: the picture size by default, turned by a quarter-turn
# rotation (given or from Exif), the buffer size given, with the row-length
# fit the output area alone; reduced decodes; a JPEG inside a TIFF file.
set(sample "${DATA}/sample.jpg")
decodes(sample 800 600 "${sample}")
decodes(turned 600 800 "${sample}" --rotate 90 --format rgb565)
decodes(orient 32 48 "${DATA}/exif_orient6_ii_48x32.jpg" --exif-orient --format=bgra)
decodes(stretched 700 700 "${sample}" --size 700x700 --fit stretch --format argb)
decodes(rows 525 700 "${sample}" --size 1000x700 --fit rowlen --rotate 270 --format yuv420)
decodes(quarter 200 150 "${sample}" --scale 1/4 --format yuv420)
decodes(tiny 100 100 "${sample}" --size 100x100 --fit stretch --mode 4)
decodes(prog 80 60 "${DATA}/prog_420_q90_640x480.jpg" --scale 1/8)
decodes(tiff 64 48 "${DATA}/tiff_le_jpeg_64x48.tif")
run(0 "100%" decode "${sample}" -o "${WORK}/progress.png" --progress)

# Header summary, Exif fields, other picture types.
run(0 "width: +48\n;orientation: +6 " info "${DATA}/exif_orient6_ii_48x32.jpg")
run(0 "thumbnail: +JPEG 160x120" info "${DATA}/exif_thumb_ii_640x480.jpg")
run(0 "type: +PNG\n;width: +800\nheight: +600\n" info "${WORK}/sample.png")
run(0 "type: +JPEG \\(in a TIFF file\\);JPEG stream: +1786 bytes at offset 194"
    info "${DATA}/tiff_subifd_be_jpeg_64x48.tif")

# Failures: a clear message and a non-zero status.
run(1 "cannot open .*missing.jpg" decode "${WORK}/missing.jpg" -o "${WORK}/x.png")
run(1 "not a JPEG file \\(it is a PNG image\\)" decode "${WORK}/sample.png" -o "${WORK}/x.png")
run(1 "not a JPEG file" decode "${DATA}/MANIFEST.txt" -o "${WORK}/x.png")
run(1 "arithmetic-coded" decode "${DATA}/bad_arith_420_64x48.jpg" -o "${WORK}/x.png")
run(1 "12-bit samples" decode "${DATA}/bad_12bit_sof0_64x48.jpg" -o "${WORK}/x.png")
run(2 "unknown option '--colour'.*usage:" decode "${sample}" -o "${WORK}/x.png" --colour)
run(2 "bad value '1/3' for --scale" decode "${sample}" -o "${WORK}/x.png" --scale 1/3)
run(2 "no output file" decode "${sample}")
run(2 "" frobnicate)
