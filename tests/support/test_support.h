// Shared helpers of the test suite: decoding with libjpeg-turbo, image
// generators, golden files.
#pragma once

#include <TekoJEncoderInternal.h>

#include "support/fault_os_layer.h"

#include <cstdint>
#include <string>
#include <utility>
#include <vector>

namespace tekoj_test {

using Bytes = std::vector<uint8_t>;

struct Decoded {
    bool ok = false;        // decoded without error
    bool warning = false;   // libjpeg-turbo reported a warning
    std::string message;    // its message, if any
    int width = 0, height = 0, components = 0;
    Bytes pixels;           // RGB (3 bytes per pixel) or grey
};

// Decodes a JPEG stream; colour streams to RGB, grey to one byte per pixel.
Decoded decode_jpeg(const Bytes& jpeg, bool force_grey = false);

// The quantised coefficients of a stream read back by libjpeg: MCU rows,
// MCUs, blocks in MCU order; empty if libjpeg failed or warned.
std::vector<int16_t> coefficients_of(const Bytes& jpeg);

// Peak signal-to-noise ratio of two same-sized sample arrays, in dB.
double psnr(const uint8_t* a, const uint8_t* b, size_t count);

// Random bytes; with extremes a quarter of them 0 and a quarter 255, so that
// the extremes of every sum a kernel forms occur.
Bytes noise(size_t n, uint32_t seed);
Bytes noise_with_extremes(size_t n, uint32_t seed);
// A smooth, photo-like RGB image (gradients, soft edges, mild texture).
Bytes photo_rgb(int width, int height, uint32_t seed = 1);
// Converts interleaved RGB to another input layout of the library.
Bytes rgb_to_format(const Bytes& rgb, int width, int height, uint32_t format);
// Planar YUV 4:2:0 (format 2) from RGB, and grey (format 4) from RGB.
Bytes rgb_to_yuv420(const Bytes& rgb, int width, int height);
Bytes rgb_to_grey(const Bytes& rgb, int width, int height);
// Bytes per pixel of a packed format; 0 for planar ones.
int bytes_per_pixel(uint32_t format);
// Size of an image buffer of the given format.
size_t image_size(uint32_t format, int width, int height);

// Whole-image encode to a memory block; empty on failure.
Bytes encode_to_memory(const ImageInfo& info, uint32_t quality);
ImageInfo image_info(const void* data, int width, int height, uint32_t format);

// Three components, luma sampled h x v, chroma 1x1, the usual tables scaled
// to `quality` (50..99).
EncoderSettings settings(uint32_t size_estimate = 0, uint32_t write_dri = 1, uint8_t h = 2, uint8_t v = 2,
                         uint32_t quality = 90);

// A context made on `info` for a memory target starting in a 2048-byte block
// of ours; freed with whatever block it then holds when it goes.
struct Context {
    EncoderContext* ctx;
    explicit Context(const ImageInfo& info, const EncoderSettings* settings = nullptr, uint32_t quality = 75);
    ~Context();
    EncoderContext* operator->() const { return ctx; }
    // Fills every band row with 0xEE, so that cells a reader leaves alone show.
    void mark_band_rows();
    Bytes cells(int component, uint32_t row) const;  // a band row, padding included
    Bytes written(size_t from = 0) const;            // the target's bytes so far
};
// Frees a context and its target's block (or work buffer).
void release(EncoderContext* ctx);
// A whole encode through the exported steps (header, one call per band, end
// mark) to memory; empty when creation refuses.
Bytes encode_in_steps(const ImageInfo& info, const EncoderSettings* settings, uint32_t quality = 75);

// Header segments of a stream, SOI first and SOS last, markers included; the
// first segment with a marker code (empty if none); where a code pair first
// occurs anywhere (the stream's size if nowhere).
std::vector<Bytes> header_segments(const Bytes& jpeg);
Bytes segment(const Bytes& jpeg, uint8_t code);
size_t find_marker(const Bytes& jpeg, uint8_t code);
size_t open_descriptors();

// Checks when it goes that no block leaked and no file stayed open since it
// was made; failure injection is off again.
struct NoLeak {
    FaultScope scope;
    int64_t live = live_blocks();
    size_t fds = open_descriptors();
    ~NoLeak();
};

// The ten whole-image members, by output kind.
enum Member {
    kToFile, kToFileEx, kToFileFull, kToFileExFull,          // file: by name, by handle
    kToBuffer, kToBufferEx, kToBufferFull, kToBufferExFull,  // memory block
    kToStream, kToStreamEx,                                  // callback
    kMembers
};
inline bool is_memory_member(int m) { return m >= kToBuffer && m <= kToBufferExFull; }
std::string member_name(int m);

struct Call {
    uint32_t result = 0;
    Bytes out;                  // the stream: file contents, block or callback pieces in order
    uint32_t largest_piece = 0; // callback members
    std::vector<std::pair<const uint8_t*, Bytes>> pieces;  // callback members: where each piece was, and its bytes
    bool kept = true;           // memory members: the caller's block and length are as they were
};
// One call of member `m` as a caller following the header makes it: file
// members write to `path` (by name, or a handle opened on it), memory members
// start from a block of `start` bytes (none for 0). After a 0 result the
// caller's variables must hold its own block unchanged, or null and 0 (the
// library freed the block); checked here. Frees whatever the caller owns.
// With `fail_at` >= 0 that allocation of the member call itself fails.
Call call_member(int m, const ImageInfo& info, uint32_t quality, const std::string& path, int32_t start = 0,
                 int64_t fail_at = -1);

// The stream with its EXIF DateTime text ("YYYY:MM:DD HH:MM:SS") blanked:
// the clock may tick between two encodes.
Bytes without_date(Bytes jpeg);

// Files.
Bytes read_file(const std::string& path);
bool file_exists(const std::string& path);
std::string golden_path(const std::string& name);
std::string temp_path(const std::string& name);

}  // namespace tekoj_test
