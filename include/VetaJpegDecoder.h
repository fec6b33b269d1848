/*
 * libVetaJpegDecoder: public interface.
 *
 * A JPEG decoder with a C interface. A caller creates a decoder object
 * (DecInfo) on an input (a file path, an open file handle, a memory block
 * or a stream with callbacks), optionally asks for a header summary,
 * decodes into a pixel buffer that it owns, and destroys the object.
 *
 * Results: public calls return 1 for success and 0 for failure
 * (constructors return a pointer or NULL) and leave the reason in the
 * process-wide gKOLVAVETA_Error (see the KOLVAVETA_ERR_ codes below).
 *
 * The header compiles as C99 and as C++.
 */
#ifndef VETA_JPEG_DECODER_H
#define VETA_JPEG_DECODER_H

#include <stdint.h>
#include <pthread.h>

#ifdef __cplusplus
extern "C" {
#endif

#if defined(VETAJ_BUILDING_LIBRARY)
#define VETAJ_API __attribute__((visibility("default")))
#else
#define VETAJ_API
#endif

/* ------------------------------------------------------------------ */
/* Codes                                                                */
/* ------------------------------------------------------------------ */

/* Library version number returned by VETAJ_GetVersion(). */
#define VETAJ_VERSION 37017

/* Error codes left in gKOLVAVETA_Error. */
#define KOLVAVETA_ERR_NONE 0          /* no error */
#define KOLVAVETA_ERR_NULL_OBJECT 1   /* a null decoder object was passed */
#define KOLVAVETA_ERR_SETUP 2         /* decoder set-up failed (header, tables, sampling) */
#define KOLVAVETA_ERR_NO_MEMORY 4     /* an allocation failed */
#define KOLVAVETA_ERR_NOT_IMAGE 5     /* not a recognised image, or unreadable header */
#define KOLVAVETA_ERR_BAD_KIND 11     /* invalid input kind */
#define KOLVAVETA_ERR_EMPTY_MEMORY 12 /* memory input of size 0 */
#define KOLVAVETA_ERR_OPEN_FILE 13    /* file cannot be opened, or null file handle */

/* Input kinds (IoStream.kind). */
#define KOLVAVETA_IO_FILE_PATH 0   /* file named by a path, opened "rb" by the library */
#define KOLVAVETA_IO_MEMORY 1      /* memory block owned by the caller, read in place */
#define KOLVAVETA_IO_FILE_HANDLE 2 /* FILE* already opened by the caller */
#define KOLVAVETA_IO_STREAM 4      /* caller stream reached through callbacks */
#define KOLVAVETA_IO_MEMORY_OWNED 5 /* memory block from KOLVAVETA_OsMalloc handed over;
                                      KOLVAVETA_DestroyDecInfo frees it */

/* Size of the window buffer through which every input is read. */
#define KOLVAVETA_WINDOW_SIZE 16384

/* Option word (DecInfo.options). */
#define KOLVAVETA_OPT_THUMB_MASK 0x3u      /* thumbnail policy */
#define KOLVAVETA_OPT_THUMB_IF_LARGE 0x0u  /* decode the thumbnail when it covers the request */
#define KOLVAVETA_OPT_THUMB_NEVER 0x1u     /* always decode the main picture */
#define KOLVAVETA_OPT_THUMB_ALWAYS 0x2u    /* decode a JPEG thumbnail whenever present */
#define KOLVAVETA_OPT_THUMB_ORIENTED 0x3u  /* as IF_LARGE, rotating a thumbnail of the
                                              other orientation by 90 degrees */
#define KOLVAVETA_OPT_ROTATE_MASK 0xCu     /* output rotation, clockwise */
#define KOLVAVETA_OPT_ROTATE_0 0x0u
#define KOLVAVETA_OPT_ROTATE_90 0x4u
#define KOLVAVETA_OPT_ROTATE_180 0x8u
#define KOLVAVETA_OPT_ROTATE_270 0xCu
#define KOLVAVETA_OPT_FIT_MASK 0x700u      /* fit of the picture into the requested size */
#define KOLVAVETA_OPT_FIT_CENTRE 0x000u    /* fit inside keeping aspect, centred */
#define KOLVAVETA_OPT_FIT_ROWLEN 0x100u    /* fit inside, buffer row length = output width */
#define KOLVAVETA_OPT_FIT_TOPLEFT 0x200u   /* fit inside, placed at the top-left */
#define KOLVAVETA_OPT_FIT_FILL 0x300u      /* fill keeping aspect, crop the overhang */
#define KOLVAVETA_OPT_FIT_STRETCH 0x700u   /* stretch to exactly the requested size */
#define KOLVAVETA_OPT_EXIF_ORIENT 0x1000u  /* apply the Exif orientation tag */
#define KOLVAVETA_OPT_CHROMA_RANGE 0x2000u /* compress the chroma range (second clamp table) */
#define KOLVAVETA_OPT_SKIP_TABLES 0x4000u  /* build coefficient-skip tables at full size */
#define KOLVAVETA_OPT_REGION_MAP 0x10000u  /* region decoding with an index of the entropy data */
#define KOLVAVETA_OPT_ISLOW_TABLE 0x20000u /* use the accurate-transform slot template */

/*
 * Output formats (DecInfo.output_format). All multi-byte values are stored
 * little-endian; alpha is always 255. Every colour space (grey, RGB, YCbCr,
 * CMYK, YCCK) is written in every format, and every format honours the
 * output rotation.
 *   0  RGB565: one 16-bit word, red in bits 15-11, green 10-5, blue 4-0
 *      (each channel truncated).
 *   1  three bytes per pixel: R, G, B.
 *   2  planar YUV 4:2:0: a full-size Y plane (row length = output width),
 *      then a U (Cb) plane and a V (Cr) plane of ((width+1)/2) x
 *      ((height+1)/2) bytes each. Chroma is taken from the pixel at even
 *      coordinates of each 2 x 2 group (no averaging). YCbCr pictures keep
 *      their samples; RGB, CMYK and YCCK pictures are converted back from
 *      RGB; grey pictures have chroma 128.
 *   3  three bytes per pixel: R, G, B (as 1).
 *   4  accepted, not written (rows are only counted).
 *   5  four bytes per pixel: A, R, G, B.
 *   6  three bytes per pixel: R, G, B (as 1).
 *   7  RGBA8888: R, G, B, A.
 *   8  BGRA8888: B, G, R, A.
 *   9  RGB565 (as 0).
 *   10 RGB565 (as 0).
 *   11 three bytes per pixel: R, G, B (as 1).
 *   12 RGBA8888 (as 7).
 */
#define KOLVAVETA_FMT_RGB565 0
#define KOLVAVETA_FMT_RGB888 1
#define KOLVAVETA_FMT_YUV420 2
#define KOLVAVETA_FMT_RGB888_ALT 3
#define KOLVAVETA_FMT_NONE 4
#define KOLVAVETA_FMT_ARGB8888 5
#define KOLVAVETA_FMT_RGB888_B 6
#define KOLVAVETA_FMT_RGBA8888 7
#define KOLVAVETA_FMT_BGRA8888 8
#define KOLVAVETA_FMT_RGB565_B 9
#define KOLVAVETA_FMT_RGB565_C 10
#define KOLVAVETA_FMT_RGB888_C 11
#define KOLVAVETA_FMT_RGBA8888_B 12

/* Decode modes (DecInfo.decode_mode), clamped to 0..4 by KOLVAVETA_SetDecMode. */
#define KOLVAVETA_MODE_BEST 0
#define KOLVAVETA_MODE_FAST_COLOUR 1
#define KOLVAVETA_MODE_FASTER 2
#define KOLVAVETA_MODE_FASTER2 3
#define KOLVAVETA_MODE_FASTEST 4
#define KOLVAVETA_MODE_THUMBNAIL 6 /* used internally while decoding a thumbnail */

/* Image type codes (DecInfo.image_type, KOLVAVETA_Parser). */
#define KOLVAVETA_IMAGE_UNKNOWN 0
#define KOLVAVETA_IMAGE_JPEG 1
#define KOLVAVETA_IMAGE_BMP 2
#define KOLVAVETA_IMAGE_PNG 3
#define KOLVAVETA_IMAGE_GIF 4
#define KOLVAVETA_IMAGE_WBMP 5
#define KOLVAVETA_IMAGE_GIF_ANIMATED 6

/* Status words of the internal steps; a few public calls return them. */
#define KOLVAVETA_STATUS_NEXT_ROW 100
#define KOLVAVETA_STATUS_END 101
#define KOLVAVETA_STATUS_CORRUPT 102
#define KOLVAVETA_STATUS_OK 200
#define KOLVAVETA_STATUS_FAIL 201
#define KOLVAVETA_STATUS_SOS 218
#define KOLVAVETA_STATUS_CANCELLED 6

/* ------------------------------------------------------------------ */
/* Records                                                              */
/* ------------------------------------------------------------------ */

struct DecInfo;
struct DecoderInfo;  /* the state of one decode; opaque */
struct StreamWindow; /* a window of at most 16384 bytes over an IoStream; opaque */
struct ExifInfo;     /* Exif record; opaque */

/* Stream callbacks: read(source, buffer, count) returns the bytes delivered;
 * skip(source, NULL, count) moves forward by count bytes and returns the new
 * position; rewind(source, NULL, 0) returns to the start. */
typedef int32_t (*KOLVAVETA_StreamFn)(void* source, void* buffer, uint32_t count);

/* Check callback: called with the rows written so far; 0 aborts the decode. */
typedef int32_t (*KOLVAVETA_CheckCallback)(struct DecInfo* object, int32_t row);

/* Progress callback: called with a percentage; 0 aborts the decode. */
typedef int32_t (*KOLVAVETA_ProgressCallback)(void* user, int32_t percent);

/* Progress record, allocated by the caller with KOLVAVETA_OsMalloc and owned
 * by the DecInfo once stored in its progress field. */
typedef struct KOLVAVETA_Progress {
  void* progress_user;
  KOLVAVETA_ProgressCallback progress_callback;
} KOLVAVETA_Progress;

/* One input of one of the kinds above. */
typedef struct IoStream {
  int32_t kind;                   /* input kind */
  void* source;                   /* path, memory block or the caller's stream pointer */
  uintptr_t file;                 /* FILE* for kinds 0 and 2 */
  uint32_t size;                  /* total input length in bytes */
  uint32_t position;              /* current read position */
  uint32_t origin;                /* kind 2: the handle's position when opened */
  uint32_t buffer_size;           /* always KOLVAVETA_WINDOW_SIZE */
  KOLVAVETA_StreamFn read_callback;   /* kind 4 */
  KOLVAVETA_StreamFn skip_callback;   /* kind 4 */
  KOLVAVETA_StreamFn rewind_callback; /* kind 4; may be NULL (no absolute seeks) */
  char* path_copy;                /* kind 0: private copy of the path */
} IoStream;

/* The header summary: thirteen 32-bit words. */
typedef struct JpegInfo {
  int32_t width;            /* 0: image width in pixels */
  int32_t height;           /* 1: image height in pixels */
  uint32_t input_size;      /* 2: total input size in bytes */
  int32_t image_count;      /* 3: 1 for a still image; the frame count of a GIF */
  int32_t progressive;      /* 4: 1 for a progressive JPEG; PNG: interlace method */
  int32_t restart_interval; /* 5: restart interval, or 0 */
  int32_t max_h_samp;       /* 6: largest horizontal sampling factor */
  int32_t max_v_samp;       /* 7: largest vertical sampling factor */
  int32_t reserved8;        /* 8: cleared by the JPEG header reader */
  int32_t reserved[3];      /* 9-11: not used */
  uint32_t jpeg_offset;     /* 12: where the JPEG data starts (in and out) */
} JpegInfo;

/* The public decoder object. Allocated zeroed by the create calls. */
typedef struct DecInfo {
  IoStream* stream;            /* the input; owned */
  int32_t output_format;       /* KOLVAVETA_FMT_ code */
  uint32_t options;            /* option word in force (decoding may OR rotation bits in) */
  uint32_t options_given;      /* option word as the caller last set it */
  int32_t decode_mode;         /* KOLVAVETA_MODE_ code */
  int32_t image_width;         /* picture size from the last summary or decode */
  int32_t image_height;
  int32_t output_width;        /* size produced by the last decode set-up */
  int32_t output_height;
  int32_t image_type;          /* KOLVAVETA_IMAGE_ code of the last identification */
  KOLVAVETA_CheckCallback check_callback; /* KOLVAVETA_CheckFn by default */
  void* region_info;           /* region decoding record (with one inner buffer); owned */
  KOLVAVETA_Progress* progress; /* optional progress record; owned */
  void* iter_window;           /* row-iterative decoder state / host window buffer */
  struct DecoderInfo* decoder; /* retained decoder; released by KOLVAVETA_DestroyJpegInfo */
  int32_t gif_duration;        /* total GIF animation time in milliseconds */
  uint32_t sample_size;        /* caller's scale denominator, 0 for none */
  uint32_t* region_map;        /* region map word: 1 once the index is complete; owned */
  uint32_t region_mode;        /* non-zero while region decoding is in force */
  uint32_t region_left;        /* region rectangle; outside region decoding the */
  uint32_t region_top;         /* width and height give the row length and row  */
  uint32_t region_width;       /* count of the output planes                    */
  uint32_t region_height;
  uint32_t region_step_divisor; /* divisor of the output row step (strip decoders) */
  volatile int32_t cancel;     /* non-zero stops a running decode; any thread may set it */
  uint32_t scan_sample_size;   /* 0, or 8/16/32/64: DC-only image made by an index pass */
  /* Region instances and two-thread splits. */
  struct DecInfo* parent;
  struct DecInfo* child_slots[8];
  int32_t child_count;
  int32_t child_index;
  uint32_t split_role;         /* 0 single, 1 upper part, 2 lower part */
  uint32_t split_claim;
  struct DecInfo* split_peer;
  int32_t split_offset;
  pthread_mutex_t split_lock;
  void* job_list;
  int32_t job_count;
  int32_t next_job;
  int32_t jobs_exhausted;
  void* split_handoff;         /* handoff record of the two-strip decode; owned */
  void* split_shared;          /* shared record of the dual-core decode; owned */
  uint32_t jpeg_offset;        /* where the JPEG data begins in the input */
} DecInfo;

/* Inverse transform routine: range_limit points at the centre of the
 * clamping table, multipliers to 64 dequantisation values, coefficients to
 * 64 values in natural order; output_rows to the row pointers. */
typedef void (*VETAJ_IdctFn)(const uint8_t* range_limit, const uint32_t* multipliers,
                             const int16_t* coefficients, uint8_t** output_rows,
                             uint32_t output_col);

/* Row decoder of a region decode. */
typedef int32_t (*VETAJ_RowDecoderFn)(struct DecoderInfo* decoder, int16_t* mcu_buffer);

/* ------------------------------------------------------------------ */
/* Platform services                                                    */
/* ------------------------------------------------------------------ */

VETAJ_API extern int32_t gKOLVAVETA_Error;

VETAJ_API void* KOLVAVETA_OsMalloc(uint32_t size);
VETAJ_API void* KOLVAVETA_OsRealloc(void* block, uint32_t size);
VETAJ_API void KOLVAVETA_OsFree(void* block);
VETAJ_API void* KOLVAVETA_OsMemset(void* destination, int32_t value, uint32_t count);
VETAJ_API void* KOLVAVETA_OsMemcpy(void* destination, const void* source, uint32_t count);
/* Returns NULL for a directory or a file that cannot be opened. */
VETAJ_API uintptr_t KOLVAVETA_OsFopen(const char* path, const char* mode);
VETAJ_API int32_t KOLVAVETA_OsFclose(uintptr_t file);
VETAJ_API int32_t KOLVAVETA_OsFseek(uintptr_t file, int32_t offset, int32_t whence);
VETAJ_API int32_t KOLVAVETA_OsFtell(uintptr_t file);
VETAJ_API uint32_t KOLVAVETA_OsFread(void* buffer, uint32_t element_size, uint32_t count,
                                     uintptr_t file);
VETAJ_API uint32_t KOLVAVETA_OsFwrite(const void* buffer, uint32_t element_size,
                                      uint32_t count, uintptr_t file);
/* Opens a file for reading; returns (uintptr_t)-1 on failure. */
VETAJ_API uintptr_t KOLVAVETA_OpenFile(const char* path);
VETAJ_API int32_t KOLVAVETA_CloseFile(uintptr_t file);
/* Seeks and returns the new absolute position (the seek result is ignored). */
VETAJ_API int32_t KOLVAVETA_SeekFile(uintptr_t file, int32_t offset, int32_t whence);
VETAJ_API uint32_t KOLVAVETA_ReadFile(uintptr_t file, void* buffer, uint32_t count);
/* Starts a system-scope thread; returns 1 and stores its handle, or 0. */
VETAJ_API int32_t KOLVAVETA_OsThreadCreate(void* (*start)(void*), void* argument,
                                           uintptr_t* thread_out);
VETAJ_API int32_t KOLVAVETA_OsThreadWait(uintptr_t thread, uint32_t unused);
VETAJ_API int32_t KOLVAVETA_OsThreadMutex_Init(pthread_mutex_t* mutex,
                                               const pthread_mutexattr_t* attributes);
VETAJ_API int32_t KOLVAVETA_OsThreadMutex_Lock(pthread_mutex_t* mutex);
VETAJ_API int32_t KOLVAVETA_OsThreadMutex_Unlock(pthread_mutex_t* mutex);
VETAJ_API int32_t KOLVAVETA_OsSleep(uint32_t microseconds);
VETAJ_API int32_t KOLVAVETA_OsClock(void);
/* Host hook: writes the external status (always 0 here) to *status. */
VETAJ_API void KOLVAVETA_CheckExStatus(int32_t* status);
/* 16-byte-aligned blocks for working buffers; free only with VETA_FakeFree. */
VETAJ_API void* VETA_FakeMalloc(void* context, uint32_t size);
VETAJ_API void VETA_FakeFree(void* block);

/* ------------------------------------------------------------------ */
/* Input streams                                                        */
/* ------------------------------------------------------------------ */

VETAJ_API IoStream* KOLVAVETA_Open_IO(int32_t kind, void* source, uint32_t size);
VETAJ_API IoStream* KOLVAVETA_Open_Stream(void* source, KOLVAVETA_StreamFn read_callback,
                                          KOLVAVETA_StreamFn skip_callback,
                                          KOLVAVETA_StreamFn rewind_callback, uint32_t size);
VETAJ_API int32_t KOLVAVETA_Read_IO(IoStream* stream, void* destination, uint32_t count);
VETAJ_API int32_t KOLVAVETA_Read_IO2(IoStream* stream, uint8_t** window_in_out,
                                     uint32_t count);
VETAJ_API int32_t KOLVAVETA_Seek_IO(IoStream* stream, int32_t offset, int32_t whence);
VETAJ_API int32_t KOLVAVETA_Close_IO(IoStream* stream);
VETAJ_API int32_t KOLVAVETA_DestroyInputBuffer(DecInfo* object);

/* ------------------------------------------------------------------ */
/* Decoder object                                                       */
/* ------------------------------------------------------------------ */

VETAJ_API DecInfo* KOLVAVETA_CreateDecInfo(int32_t kind, void* source, uint32_t size,
                                           int32_t output_format, uint32_t options);
VETAJ_API DecInfo* KOLVAVETA_CreateDecInfoWithStream(void* source, uint32_t size,
                                                     KOLVAVETA_StreamFn read_callback,
                                                     KOLVAVETA_StreamFn skip_callback,
                                                     KOLVAVETA_StreamFn rewind_callback,
                                                     int32_t output_format, uint32_t options);
VETAJ_API int32_t KOLVAVETA_SetDecOption(DecInfo* object, uint32_t options);
VETAJ_API int32_t KOLVAVETA_SetDecMode(DecInfo* object, int32_t mode);
/* Identifies the input (KOLVAVETA_IMAGE_ code) and fills info. */
VETAJ_API int32_t KOLVAVETA_Parser(DecInfo* object, JpegInfo* info);
/* Reads the JPEG header summary into info. */
VETAJ_API int32_t KOLVAVETA_JpgParser(DecInfo* object, JpegInfo* info);
VETAJ_API int32_t KOLVAVETA_SimpleParserGIF(DecInfo* object, JpegInfo* info,
                                            int32_t minimum_delay);
/* Decodes into output_buffer, a buffer of width x height pixels laid out in
 * the object's output_format. Progressive images: at most the first 30 scans
 * are decoded. */
VETAJ_API int32_t KOLVAVETA_DecodeJPEG(DecInfo* object, void* output_buffer, int32_t width,
                                       int32_t height);
VETAJ_API int32_t KOLVAVETA_DestroyJpegInfo(DecInfo* object);
VETAJ_API int32_t KOLVAVETA_DestroyDecInfo(DecInfo* object);
VETAJ_API int32_t KOLVAVETA_CheckFn(DecInfo* object, int32_t row);
VETAJ_API int32_t KOLVAVETA_ZoomCheckFn(void);
VETAJ_API int32_t VETAJ_GetVersion(void);

/* ------------------------------------------------------------------ */
/* Handles and aliases                                                  */
/* ------------------------------------------------------------------ */

/* Declared for the complete interface; this release does not define them
 * yet (linking against them fails). */

VETAJ_API int32_t KOLVAVETA_OpenDecHandle(void* source, uint32_t size, int32_t kind);
VETAJ_API int32_t KOLVAVETA_OpenDecHandle_Stream(void* source, uint32_t size, int32_t kind,
                                                 KOLVAVETA_StreamFn read_callback,
                                                 KOLVAVETA_StreamFn skip_callback,
                                                 KOLVAVETA_StreamFn rewind_callback);
VETAJ_API DecInfo* KOLVAVETA_GetDecInfoFromHandle(int32_t handle);
VETAJ_API DecInfo* KOLVAVETA_SetDecInfoFromHandle(int32_t handle, int32_t output_format);
VETAJ_API int32_t KOLVAVETA_CloseDecHandle(int32_t handle);

VETAJ_API int32_t PKX_Parser(DecInfo* object, JpegInfo* info);
VETAJ_API int32_t PKX_JpgParser(DecInfo* object, JpegInfo* info);
VETAJ_API DecInfo* PKX_CreateDecInfo(int32_t kind, void* source, uint32_t size,
                                     int32_t output_format, uint32_t options);
VETAJ_API DecInfo* PKX_CreateDecInfoWithStream(void* source, uint32_t size,
                                               KOLVAVETA_StreamFn read_callback,
                                               KOLVAVETA_StreamFn skip_callback,
                                               KOLVAVETA_StreamFn rewind_callback,
                                               int32_t output_format, uint32_t options);
VETAJ_API int32_t PKX_DestroyDecInfo(DecInfo* object);
VETAJ_API int32_t PKX_SkiaInitializeJPEG(DecInfo* object, uint32_t sample_size);
VETAJ_API int32_t PKX_SkiaDecodeJPEG(DecInfo* object, void* output_buffer,
                                     uint32_t sample_size);
VETAJ_API int32_t PKX_DecodeJPEG(DecInfo* object, void* output_buffer, int32_t width,
                                 int32_t height);
VETAJ_API int32_t PKX_PDecodeJPEG(DecInfo* object, void* output_buffer, int32_t width,
                                  int32_t height, uint32_t sample_size);
VETAJ_API int32_t PKX_DestroyInputBuffer(DecInfo* object);

/* ------------------------------------------------------------------ */
/* Scaled decoding: inverse transform selectors                         */
/* ------------------------------------------------------------------ */

VETAJ_API VETAJ_IdctFn VETAJ_GetDctMethod8to1(struct DecoderInfo* decoder, int32_t index);
VETAJ_API VETAJ_IdctFn VETAJ_GetDctMethod4to1(struct DecoderInfo* decoder, int32_t index);
VETAJ_API VETAJ_IdctFn VETAJ_GetDctMethod2to1(struct DecoderInfo* decoder, int32_t index);
VETAJ_API VETAJ_IdctFn VETAJ_GetDctMethod8to3(struct DecoderInfo* decoder, int32_t index);
VETAJ_API int32_t VETAJ_GetDctMethodIndex(int32_t last_index);

/* Constant tables. */
VETAJ_API extern const uint8_t VETAJ_NATURAL_ORDER[80];
VETAJ_API extern const int32_t VETAJ_HUFF_EXTEND_TEST[16];
/* Inverse transform slot templates. Full size: slot min(k, 28) for a block
 * whose last coefficient is at zig-zag position k; pIDctFunc holds routines
 * specialised for blocks ending at k (k must be exact or larger),
 * pIDctFuncIslow the full transform in every slot. pIDctResizeFunc: by
 * scale index 0 (full, the uniform template), 1 (1/2), 2 (1/4), 3 (1/8);
 * entries 1..3 have 7 slots, every slot holding the same routine. */
VETAJ_API extern const VETAJ_IdctFn pIDctFunc[29];
VETAJ_API extern const VETAJ_IdctFn pIDctFuncIslow[29];
VETAJ_API extern const VETAJ_IdctFn* const pIDctResizeFunc[4];
/* Region row decoders by scale (not defined in this release, see below). */
VETAJ_API extern const VETAJ_RowDecoderFn pRegionDecodingResize[7];

/* ------------------------------------------------------------------ */
/* Region decoding and the scan index                                   */
/* ------------------------------------------------------------------ */

/* Declared for the complete interface; this release does not define them
 * yet (linking against them fails). */

VETAJ_API DecInfo* KOLVAVETA_CreateRegionDecoderInstance(DecInfo* parent, uint32_t x,
                                                         uint32_t y, uint32_t width,
                                                         uint32_t height,
                                                         uint32_t sample_size);
VETAJ_API int32_t KOLVAVETA_DecodeRegionBase(DecInfo* instance, void* output_buffer,
                                             int32_t width, int32_t height);
VETAJ_API int32_t KOLVAVETA_DecodeRegion(DecInfo* parent, void* output_buffer, int32_t width,
                                         int32_t height, uint32_t x, uint32_t y,
                                         uint32_t region_width, uint32_t region_height,
                                         uint32_t sample_size);
VETAJ_API int32_t KOLVAVETA_PDecodeRegionBase(DecInfo* instance, void* output_buffer,
                                              int32_t width, int32_t height, uint32_t x,
                                              uint32_t y, uint32_t region_width,
                                              uint32_t region_height, uint32_t sample_size);
VETAJ_API int32_t KOLVAVETA_PDecodeRegion(DecInfo* parent, void* output_buffer, int32_t width,
                                          int32_t height, uint32_t x, uint32_t y,
                                          uint32_t region_width, uint32_t region_height,
                                          uint32_t sample_size);
VETAJ_API int32_t KOLVAVETA_P2DecodeRegion(DecInfo* parent, void* output_buffer,
                                           int32_t width, int32_t height, uint32_t x,
                                           uint32_t y, uint32_t region_width,
                                           uint32_t region_height, uint32_t sample_size);
VETAJ_API int32_t KOLVAVETA_ScanHuffmanInfo(DecInfo* object);
VETAJ_API int32_t KOLVAVETA_ScanHuffmanInfoWithDec(DecInfo* object, void* output_buffer,
                                                   uint32_t sample_size);

/* ------------------------------------------------------------------ */
/* Parallel strip decoding and thread bodies                            */
/* ------------------------------------------------------------------ */

/* Declared for the complete interface; this release does not define them
 * yet (linking against them fails). */

VETAJ_API int32_t KOLVAVETA_PDecodeJPEG(DecInfo* object, void* output_buffer, int32_t width,
                                        int32_t height, uint32_t sample_size);
VETAJ_API int32_t KOLVAVETA_PDecodeJPEG_RST(DecInfo* object, void* output_buffer,
                                            int32_t width, int32_t height,
                                            uint32_t sample_size);
VETAJ_API int32_t KOLVAVETA_PDecodeJPEG_No_RST(DecInfo* object, void* output_buffer,
                                               int32_t width, int32_t height,
                                               uint32_t sample_size);
VETAJ_API void* decode_jpeg(void* job);
VETAJ_API void* decode_jpeg2(void* job);
VETAJ_API void* decode_jpeg_greedy(void* job);
VETAJ_API void* dualdecode_jpeg(void* job);

/* ------------------------------------------------------------------ */
/* Row-iterative decoding                                               */
/* ------------------------------------------------------------------ */

/* Declared for the complete interface; this release does not define them
 * yet (linking against them fails). */

VETAJ_API int32_t KOLVAVETA_PrepareJPEGIter(DecInfo* object, int32_t width, int32_t height);
VETAJ_API int32_t KOLVAVETA_InitJPEGIter(DecInfo* object, void* output_buffer, int32_t width,
                                         int32_t height);
VETAJ_API int32_t KOLVAVETA_DecodeJPEGIter(DecInfo* object, void* output_buffer,
                                           int32_t width, int32_t height, uint32_t flags,
                                           int32_t rows);
VETAJ_API int32_t KOLVAVETA_DecodeJPEGIter4LTN(DecInfo* object, void* band_buffer,
                                               int32_t width, int32_t unused, uint32_t flags,
                                               int32_t band_height);
VETAJ_API int32_t KOLVAVETA_GetCurOutputRow(DecInfo* object);
VETAJ_API int32_t KOLVAVETA_AbortJPEGIter(DecInfo* object);

/* ------------------------------------------------------------------ */
/* Image type detection                                                 */
/* ------------------------------------------------------------------ */

/* Type code (KOLVAVETA_IMAGE_) of the input from its first 8 bytes; also
 * stored in image_type. A TIFF container is not recognised here. */
VETAJ_API int32_t KOLVAVETA_GetImageType(DecInfo* object);
/* For a TIFF container holding a JPEG stream: returns 1 with the stream's
 * input position and its length up to and including EOI; 0 otherwise. */
VETAJ_API int32_t KOLVAVETA_GetJpegOffset(DecInfo* object, uint32_t* offset_out,
                                          uint32_t* length_out);
/* The readers below work on a window that starts at input offset 0. */
VETAJ_API int32_t VETA_GetImageType(DecInfo* object, struct StreamWindow* window);
VETAJ_API int32_t VETA_Parse(DecInfo* object, struct StreamWindow* window, JpegInfo* info);
/* As VETA_Parse, but a JPEG inside a TIFF is measured up to its EOI. */
VETAJ_API int32_t VETA_ParseJPEGOffset(DecInfo* object, struct StreamWindow* window,
                                       JpegInfo* info);
/* GIF summary: 4 for one image, 6 for several, 0 otherwise. Sets
 * gif_duration to the sum of the frame delays in milliseconds, each counted
 * as at least minimum_delay. */
VETAJ_API int32_t __VETA_ParserGIF(DecInfo* object, struct StreamWindow* window,
                                   JpegInfo* info, int32_t minimum_delay);
/* WBMP size: 5, or 0. */
VETAJ_API int32_t __VETA_ParserWBMP(DecInfo* object, struct StreamWindow* window);

/* ------------------------------------------------------------------ */
/* Host-toolkit entry points                                            */
/* ------------------------------------------------------------------ */

/* Declared for the complete interface; this release does not define them
 * yet (linking against them fails). */

VETAJ_API int32_t KOLVAVETA_SkiaInitializeJPEG(DecInfo* object, uint32_t sample_size);
VETAJ_API int32_t KOLVAVETA_SkiaDecodeJPEG(DecInfo* object, void* output_buffer,
                                           uint32_t sample_size);

/* ------------------------------------------------------------------ */
/* Performance statistics                                               */
/* ------------------------------------------------------------------ */

/* Capacity limits. jpeg_get_index refuses a new name when all entries are in
 * use (it returns -1) and registers a name longer than
 * JPEG_STAT_NAME_SIZE - 1 characters truncated to that length (so a later
 * lookup of the same long name finds it again); argument texts longer than
 * JPEG_STAT_ARGUMENT_SIZE - 1 characters are truncated. accumulate_stat_info
 * adds times and call counts with saturation at the 32-bit limits. */
#define JPEG_STAT_MAX_ENTRIES 1024
#define JPEG_STAT_NAME_SIZE 128
#define JPEG_STAT_ARGUMENT_SIZE 512

typedef struct MethodStat {
  int32_t time;       /* accumulated time, in the caller's unit */
  int32_t call_times; /* accumulated number of calls */
  char name[JPEG_STAT_NAME_SIZE];
} MethodStat;

typedef struct JpegStatInfo {
  char argument[JPEG_STAT_ARGUMENT_SIZE];
  int32_t argument_values[5];
  int32_t entry_count;
  MethodStat entries[JPEG_STAT_MAX_ENTRIES];
} JpegStatInfo;

VETAJ_API extern JpegStatInfo jsInfo;

VETAJ_API JpegStatInfo* jpeg_set_stat_info(JpegStatInfo* record);
VETAJ_API JpegStatInfo* stat_set_info(void);
VETAJ_API JpegStatInfo* jpeg_set_argument(JpegStatInfo* record, const char* text, int32_t a1,
                                          int32_t a2, int32_t a3, int32_t a4, int32_t a5);
VETAJ_API JpegStatInfo* stat_set_argument(const char* text, int32_t a1, int32_t a2, int32_t a3,
                                          int32_t a4, int32_t a5);
VETAJ_API int32_t jpeg_get_index(JpegStatInfo* record, const char* name);
VETAJ_API int32_t sort_func(const void* a, const void* b);
VETAJ_API void jpeg_stat_sort(JpegStatInfo* record);
VETAJ_API int32_t accumulate_stat_info(JpegStatInfo* destination, const JpegStatInfo* source);
VETAJ_API int32_t stat_accumulate(JpegStatInfo* destination);
VETAJ_API char* reverse_string(char* text);
VETAJ_API int32_t get_method_time(const JpegStatInfo* record, const char* name);
VETAJ_API int32_t get_method_call_times(const JpegStatInfo* record, const char* name);
VETAJ_API int32_t get_method_time_prefix(const JpegStatInfo* record, const char* prefix,
                                         int32_t n);
VETAJ_API const char* get_method_name_prefix(const JpegStatInfo* record, const char* prefix,
                                             int32_t n);
VETAJ_API int32_t get_method_num_of_prefix(const JpegStatInfo* record, const char* prefix);
VETAJ_API int32_t get_method_time_postfix(const JpegStatInfo* record, const char* suffix,
                                          int32_t n);
VETAJ_API const char* get_method_name_postfix(const JpegStatInfo* record, const char* suffix,
                                              int32_t n);
VETAJ_API int32_t get_method_num_of_postfix(const JpegStatInfo* record, const char* suffix);
VETAJ_API void jpeg_print_stat_simple_info(const JpegStatInfo* record);
VETAJ_API void jpeg_print_stat_all_info(const JpegStatInfo* record);
VETAJ_API void jpeg_print_stat_simple_veta_info(const JpegStatInfo* record);
VETAJ_API void jpeg_print_veta_info(const JpegStatInfo* record);
VETAJ_API void stat_print_simple_info(void);
VETAJ_API void stat_acc_print_simple_info(const JpegStatInfo* record);
VETAJ_API void stat_print_all_info(void);
VETAJ_API void stat_acc_print_all_info(const JpegStatInfo* record);
VETAJ_API void stat_print_simple_veta_info(void);
VETAJ_API void stat_acc_print_simple_veta_info(const JpegStatInfo* record);
VETAJ_API void stat_print_veta_info(void);
VETAJ_API void stat_acc_print_veta_info(const JpegStatInfo* record);
VETAJ_API int32_t stat_print_argument(int32_t value);

#ifdef __cplusplus
}
#endif

#endif /* VETA_JPEG_DECODER_H */
