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

# Runs the tool with the given arguments; leaves rc, out and err.
macro(run_tool)
  execute_process(COMMAND ${emulator} "${TOOL}" ${ARGN}
                  RESULT_VARIABLE rc OUTPUT_VARIABLE out ERROR_VARIABLE err)
  string(REPLACE ";" " " last_command "vetajpeg ${ARGN}")
endmacro()

# Reports a failed check of the last run; the script then ends with an error.
function(fail text)
  message(SEND_ERROR "${last_command}: ${text}\n  exit status: ${rc}\n  stdout: ${out}\n  stderr: ${err}")
endfunction()

function(expect_status expected)
  if(NOT "${rc}" STREQUAL "${expected}")
    fail("expected exit status ${expected}")
  endif()
endfunction()

# expect_match(out|err regex)
function(expect_match variable regex)
  if(NOT "${${variable}}" MATCHES "${regex}")
    fail("${variable} does not match '${regex}'")
  endif()
endfunction()

# expect_png(file width height): a PNG file of that size.
function(expect_png file width height)
  if(NOT EXISTS "${file}")
    fail("${file} was not written")
    return()
  endif()
  file(READ "${file}" head LIMIT 24 HEX)
  string(SUBSTRING "${head}" 0 16 signature)
  string(SUBSTRING "${head}" 32 8 w_hex)  # IHDR width and height, big-endian
  string(SUBSTRING "${head}" 40 8 h_hex)
  math(EXPR w "0x${w_hex}")
  math(EXPR h "0x${h_hex}")
  if(NOT signature STREQUAL "89504e470d0a1a0a")
    fail("${file} does not start with the PNG signature")
  elseif(NOT "${w}x${h}" STREQUAL "${width}x${height}")
    fail("${file} is ${w}x${h}, expected ${width}x${height}")
  endif()
endfunction()

# Decoding to PNG: the picture size by default, turned by a quarter-turn
# rotation (given or from Exif), or the buffer size given; with the
# row-length fit the output area alone.
run_tool(decode "${DATA}/sample.jpg" -o "${WORK}/sample.png")
expect_status(0)
expect_png("${WORK}/sample.png" 800 600)
run_tool(decode "${DATA}/sample.jpg" -o "${WORK}/turned.png" --rotate 90 --format rgb565 --progress)
expect_status(0)
expect_png("${WORK}/turned.png" 600 800)
expect_match(err "100%")
run_tool(decode "${DATA}/exif_orient6_ii_48x32.jpg" -o "${WORK}/orient.png" --exif-orient --format=bgra)
expect_status(0)
expect_png("${WORK}/orient.png" 32 48)
run_tool(decode "${DATA}/sample.jpg" -o "${WORK}/stretched.png" --size 700x700 --fit stretch --format argb)
expect_status(0)
expect_png("${WORK}/stretched.png" 700 700)
run_tool(decode "${DATA}/sample.jpg" -o "${WORK}/rows.png" --size 1000x700 --fit rowlen --rotate 270 --format yuv420)
expect_status(0)
expect_png("${WORK}/rows.png" 525 700)
# Reduced decodes: a scale denominator, and the fastest mode into a small
# stretched buffer.
run_tool(decode "${DATA}/sample.jpg" -o "${WORK}/quarter.png" --scale 1/4 --format yuv420)
expect_status(0)
expect_png("${WORK}/quarter.png" 200 150)
run_tool(decode "${DATA}/sample.jpg" -o "${WORK}/tiny.png" --size 100x100 --fit stretch --mode 4)
expect_status(0)
expect_png("${WORK}/tiny.png" 100 100)
run_tool(decode "${DATA}/prog_420_q90_640x480.jpg" -o "${WORK}/prog.png" --scale 1/8)
expect_status(0)
expect_png("${WORK}/prog.png" 80 60)

# Header summary and Exif fields.
run_tool(info "${DATA}/exif_orient6_ii_48x32.jpg")
expect_status(0)
expect_match(out "width: +48\n")
expect_match(out "orientation: +6 ")
run_tool(info "${DATA}/exif_thumb_ii_640x480.jpg")
expect_status(0)
expect_match(out "thumbnail: +JPEG 160x120")

# Other picture types are identified; a JPEG inside a TIFF file decodes.
run_tool(info "${WORK}/sample.png")
expect_status(0)
expect_match(out "type: +PNG\n")
expect_match(out "width: +800\nheight: +600\n")
run_tool(info "${DATA}/tiff_subifd_be_jpeg_64x48.tif")
expect_status(0)
expect_match(out "type: +JPEG \\(in a TIFF file\\)")
expect_match(out "JPEG stream: +1786 bytes at offset 194")
run_tool(decode "${DATA}/tiff_le_jpeg_64x48.tif" -o "${WORK}/tiff.png")
expect_status(0)
expect_png("${WORK}/tiff.png" 64 48)

# Failures: a clear message and a non-zero status.
run_tool(decode "${WORK}/missing.jpg" -o "${WORK}/missing.png")
expect_status(1)
expect_match(err "cannot open .*missing.jpg")
run_tool(decode "${WORK}/sample.png" -o "${WORK}/png.png")
expect_status(1)
expect_match(err "not a JPEG file \\(it is a PNG image\\)")
run_tool(decode "${DATA}/MANIFEST.txt" -o "${WORK}/text.png")
expect_status(1)
expect_match(err "not a JPEG file")
run_tool(decode "${DATA}/bad_arith_420_64x48.jpg" -o "${WORK}/arith.png")
expect_status(1)
expect_match(err "arithmetic-coded")
run_tool(decode "${DATA}/bad_12bit_sof0_64x48.jpg" -o "${WORK}/deep.png")
expect_status(1)
expect_match(err "12-bit samples")
run_tool(decode "${DATA}/sample.jpg" -o "${WORK}/x.png" --colour)
expect_status(2)
expect_match(err "unknown option '--colour'.*usage:")
run_tool(decode "${DATA}/sample.jpg" -o "${WORK}/x.png" --scale 1/3)
expect_status(2)
expect_match(err "bad value '1/3' for --scale")
run_tool(decode "${DATA}/sample.jpg")
expect_status(2)
expect_match(err "no output file")
run_tool(frobnicate)
expect_status(2)

