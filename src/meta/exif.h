// Exif and TIFF metadata: camera fields, GPS position and the thumbnail
// location read from an Exif APP1 segment, and the position of the JPEG
// stream that a TIFF container holds.
#ifndef VETAJ_META_EXIF_H
#define VETAJ_META_EXIF_H

#include <cstddef>
#include <cstdint>

#include "platform/common.h"
#include "syntax/markers.h"

struct StreamWindow;

// TIFF field types used by the readers.
constexpr uint16_t kTiffByte = 1;
constexpr uint16_t kTiffAscii = 2;
constexpr uint16_t kTiffShort = 3;
constexpr uint16_t kTiffLong = 4;
constexpr uint16_t kTiffRational = 5;
constexpr uint16_t kTiffUndefined = 7;
constexpr uint16_t kTiffSRational = 10;
constexpr uint16_t kTiffIfd = 13;

// One IFD entry as decoded by VETAJ_ReadExifField.
struct ExifField {
  uint16_t tag;
  uint16_t type;
  uint32_t count;
  uint32_t byte_length;  // count times the size of one value
  // A 2- or 4-byte type with count 1: the value itself. Otherwise the
  // position in the TIFF data of the first value byte (the entry's own value
  // bytes when they hold the values, else the offset).
  uint32_t value;
};

// Fields of the GPS sub-IFD, in tag order. Strings are NUL-terminated.
struct GpsInfo {
  uint8_t version_id[4];       // tag 0, BYTE / 4
  char latitude_ref[2];        // tag 1, ASCII / 2
  uint32_t latitude[6];        // tag 2, three rationals
  char longitude_ref[2];       // tag 3, ASCII / 2
  uint32_t longitude[6];       // tag 4, three rationals
  uint8_t altitude_ref;        // tag 5, BYTE / 1
  uint32_t altitude[2];        // tag 6, RATIONAL / 1
  uint32_t time_stamp[6];      // tag 7, three rationals
  char* map_datum;             // tag 18, owned string
  uint8_t* processing_method;  // tag 27, owned copy (one NUL byte follows it)
  char date_stamp[11];         // tag 29, ASCII / 11; the last byte is always 0
  uint32_t processing_method_length;  // bytes in processing_method
};

// The Exif record: 55 words on a 32-bit target. Owned strings and buffers
// are released by VETAJ_DestroyExifInfo.
struct ExifInfo {
  uint32_t reserved0;
  // IFD0
  uint32_t bits_per_sample[3];   // 258, SHORT / 3
  uint32_t compression;          // 259, SHORT / 1
  char* make;                    // 271, ASCII
  char* model;                   // 272, ASCII
  uint32_t orientation;          // 274, SHORT / 1
  uint32_t x_resolution[2];      // 282, RATIONAL / 1
  uint32_t y_resolution[2];      // 283, RATIONAL / 1
  uint32_t resolution_unit;      // 296, SHORT / 1
  char* software;                // 305, ASCII
  uint32_t ycbcr_positioning;    // 531, SHORT / 1
  char* rights_notice;           // 33432, ASCII
  // Exif sub-IFD
  uint32_t exposure_time[2];     // 33434, RATIONAL / 1
  uint8_t* exif_version;         // 36864, UNDEFINED / 4 (four bytes, then a NUL)
  char* date_time_original;      // 36867, ASCII / 20
  char* date_time_digitized;     // 36868, ASCII / 20
  uint32_t flash;                // 37385, SHORT / 1
  uint32_t color_space;          // 40961, SHORT / 1
  uint32_t pixel_x_dimension;    // 40962, SHORT or LONG / 1
  uint32_t pixel_y_dimension;    // 40963, SHORT or LONG / 1
  uint32_t exposure_mode;        // 41986, SHORT / 1
  uint32_t white_balance;        // 41987, SHORT / 1
  uint32_t digital_zoom_ratio[2];  // 41988, RATIONAL / 1
  uint32_t focal_length[2];      // 37386, RATIONAL / 1
  uint32_t iso_speed_ratings;    // 34855, SHORT: the value, or the offset of a list
  int32_t exposure_bias_value[2];  // 37380, SRATIONAL / 1
  uint32_t f_number[2];          // 33437, RATIONAL / 1
  int32_t shutter_speed_value[2];  // 37377, SRATIONAL / 1
  uint32_t reserved38;
  ThumbnailInfo thumbnail;       // from IFD1
  GpsInfo* gps;                  // 34853, owned
};

static_assert(sizeof(void*) != 4 || sizeof(ExifInfo) == 55 * 4, "ExifInfo is 55 words");
static_assert(sizeof(void*) != 4 || offsetof(ExifInfo, thumbnail) == 39 * 4,
              "the thumbnail record starts at word 39");
static_assert(sizeof(void*) != 4 || offsetof(GpsInfo, date_stamp) + 10 == 114,
              "the date stamp ends at byte 114 of the GPS record");

// State of one TIFF container read through a stream window.
struct TiffReader {
  DecInfo* object;        // receives jpeg_offset
  StreamWindow* window;
  uint32_t base;          // input position of the TIFF header
  uint32_t length;        // bytes of the container from the header on
  bool little_endian;
  uint32_t ifds_left;     // IFDs that may still be read (bounds SubIFD chains)
};

// Decodes the 12-byte IFD entry at entry_position of data. Returns 1 when the
// entry is usable (its values lie inside the data), 0 otherwise.
int32_t VETAJ_ReadExifField(const uint8_t* data, uint32_t entry_position, uint32_t data_length,
                            int32_t little_endian, ExifField* out);

// IFD readers over TIFF data held in memory. Each returns the IFD's link to
// the next IFD, or 0 when the IFD does not fit in the data or reading ended
// early.
uint32_t VETAJ_Read0thIFDInfo(const uint8_t* data, uint32_t ifd_offset, uint32_t length,
                              int32_t little_endian, ExifInfo* exif);
uint32_t VETAJ_ReadExifIFDInfo(const uint8_t* data, uint32_t ifd_offset, uint32_t length,
                               int32_t little_endian, ExifInfo* exif);
uint32_t VETAJ_ReadGpsIFDInfo(const uint8_t* data, uint32_t ifd_offset, uint32_t length,
                              int32_t little_endian, GpsInfo* gps);

// Reads IFD0, its Exif and GPS sub-IFDs and IFD1 (the thumbnail) from TIFF
// data. tiff_position is the input position of the TIFF header, added to the
// thumbnail offset. Returns 1 once IFD0 has been read, 0 for a bad header.
int32_t VETAJ_ReadExifInfo(const uint8_t* tiff_data, uint32_t tiff_position, uint32_t length,
                           ExifInfo* exif);

// A new record read from the object's input at its jpeg_offset, or null.
ExifInfo* VETAJ_CreatExifInfo(DecInfo* object);
// A new record read from an APP1 segment held in memory, or null.
ExifInfo* VETAJ_CreatExifInfoUseExifBuffer(const uint8_t* buffer, uint32_t length);
// Finds the Exif APP1 segment of the JPEG stream at the window's position and
// fills the record, copying the thumbnail data. Returns non-zero on success.
int32_t VETAJ_GetExifInfo(StreamWindow* window, ExifInfo* exif);
int32_t VETAJ_GetTiffInfo(StreamWindow* window, ExifInfo* exif);

// Reads the IFD0 of the TIFF container at the window's position and records
// the embedded JPEG stream's position in the object's jpeg_offset. Returns 1,
// 0 for a bad header, or 201 when the input cannot be read.
int32_t VETAJ_ReadTiffInfo(DecInfo* object, StreamWindow* window, uint32_t ignored,
                           uint32_t length, ExifInfo* exif);
// Reads one IFD of a TIFF container, following SubIFDs. Returns 1 or 201.
int32_t VETAJ_ReadTiffIFDInfo(TiffReader* reader, uint32_t ifd_offset, uint32_t depth);

// Frame size of a JPEG stream in memory: 200 with width and height, or 201.
int32_t VETAJ_GetJPEGResolution(const uint8_t* jpeg_data, uint32_t length, int32_t* width,
                                int32_t* height);

// Uncompressed thumbnails are not decoded: returns 1 and does nothing.
int32_t VETAJ_DecodeUncompressThumbnail(DecInfo* object, StreamWindow* window, uint32_t length,
                                        uint8_t* output);

// Frees the record and everything it owns. Returns 1, or 0 for null.
int32_t VETAJ_DestroyExifInfo(ExifInfo* exif);

#endif  // VETAJ_META_EXIF_H
