// The EXIF description: strings of any length (or none), every numeric field,
// GPS or none, the date stamp, a thumbnail of any pointer and length, on
// every output kind. A reported success must decode, and its APP1 segment
// must hold a TIFF block whose IFDs and values lie inside the segment.
#include "fuzz_support.h"

#include <string>

using namespace tekoj_fuzz;

namespace {

uint32_t le16(const uint8_t* p) { return p[0] | p[1] << 8; }
uint32_t le32(const uint8_t* p) { return le16(p) | le16(p + 2) << 16; }

// Walks IFD0 and the IFDs it links to; every entry's out-of-line value must
// lie inside the TIFF block of `size` bytes.
void check_tiff(const uint8_t* tiff, uint32_t size) {
    if (size < 8 || tiff[0] != 'I' || tiff[1] != 'I' || le16(tiff + 2) != 42) finding("bad TIFF header");
    static const uint32_t kTypeSize[8] = {0, 1, 1, 2, 4, 8, 0, 1};
    uint32_t pending[8] = {le32(tiff + 4)}, count = 1, visited = 0;
    while (count > 0) {
        const uint32_t at = pending[--count];
        if (at == 0) continue;
        if (++visited > 4 || at + 2 > size) finding("IFD outside the TIFF block");
        const uint32_t n = le16(tiff + at);
        if (at + 6 + 12 * n > size) finding("IFD entries outside the TIFF block");
        for (uint32_t i = 0; i < n; ++i) {
            const uint8_t* e = tiff + at + 2 + 12 * i;
            const uint32_t tag = le16(e), type = le16(e + 2), bytes = kTypeSize[type & 7] * le32(e + 4);
            if (bytes > 4 && uint64_t(le32(e + 8)) + bytes > size) finding("value outside the TIFF block");
            if ((tag == 0x8769 || tag == 0x8825) && count < 8) pending[count++] = le32(e + 8);
        }
        if (count < 8) pending[count++] = le32(tiff + at + 2 + 12 * n);  // the next IFD (IFD1)
    }
}

std::string text(Input& in) {
    const uint32_t n = in.flag() ? in.range(0, 8) : in.range(0, 9000);
    std::string s(n, 'a');
    for (auto& c : s) c = char(1 + in.u8() % 255);  // no NUL inside
    return s;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    Input in(data, size);
    std::string make = text(in), model = text(in), method = text(in);
    ExifInfo e{};
    GpsInfo g{};
    if (in.flag()) e.make = make.c_str();
    if (in.flag()) e.model = model.c_str();
    e.orientation = in.u32(), e.resolution_unit = in.u8(), e.ycbcr_positioning = in.u8(), e.flash = in.u8();
    e.x_resolution = {in.u32(), in.u8()}, e.y_resolution = {in.u8(), in.u32()}, e.exposure_time = {in.u8(), in.u16()};
    e.stamp_date_time = in.u8() & 1, e.white_balance = uint16_t(in.u16()), e.focal_length = {in.u8(), in.u8()};
    e.iso_speed = in.u16(), e.f_number = {in.u8(), in.u8()};
    if (in.flag()) {
        e.gps = &g;
        for (char* ref : {g.latitude_ref, g.longitude_ref}) ref[0] = char(in.u8()), ref[1] = char(in.u8() & 0x7F);
        for (auto* r : {&g.latitude[0], &g.latitude[1], &g.latitude[2], &g.longitude[0], &g.altitude, &g.time_stamp[2]})
            *r = {in.u8(), in.u8()};
        g.altitude_ref = uint8_t(in.u8() % 4);
        if (in.flag()) g.processing_method = method.c_str();
    }
    e.has_thumbnail = in.u8() & 1;
    e.thumb_width = in.u16(), e.thumb_height = in.u8(), e.thumb_compression = in.u8() & 7;
    e.thumb_x_resolution = {in.u8(), 1}, e.thumb_y_resolution = {0, in.u8()};
    const int kind = int(in.u8() % 3);  // memory, stream, file
    const Bytes pixels = in.fill(16 * 8);
    const Bytes thumb = in.take(in.range(0, 70000));
    e.thumb_length = in.flag() ? uint32_t(thumb.size()) : in.u32();
    e.thumb_data = in.flag() && e.thumb_length <= thumb.size() ? thumb.data() : nullptr;
    if (e.thumb_data == nullptr && in.flag()) e.thumb_length = 0;

    ImageInfo info{16, 8, pixels.data(), 0, 0, 0, 0, 0, EKO_FORMAT_GREY, &e};
    Bytes out;
    uint32_t r = 0;
    if (kind == 0) {
        uint8_t* block = nullptr;
        int32_t length = 0;
        r = eko_enc_jpeg_to_buffer(&info, &block, &length, 50);
        if (r == 1) out.assign(block, block + length);
        DORVATEKO_OsFree(block);
    } else if (kind == 1) {
        r = eko_enc_jpeg_to_stream(&info, collect, 50, &out);
    } else {
        // The file member's bytes equal the stream member's; only success is compared.
        Bytes streamed;
        r = eko_enc_jpeg_to_file(&info, "/dev/null", 50);
        if (r != eko_enc_jpeg_to_stream(&info, collect, 50, &streamed)) finding("file and stream disagree");
        out = streamed;
    }
    if (r == 0 && eko_GetLastError() == EKO_OK) finding("failure without a reason");
    if (r != 1) return 0;
    expect_decodes(out, 16, 8);
    if (out.size() < 30 || out[20] != 0xFF || out[21] != 0xE1) finding("no APP1 segment");
    const uint32_t length = out[22] << 8 | out[23];
    const uint32_t thumb_bytes = e.has_thumbnail ? e.thumb_length : 0;
    if (length < 8 + thumb_bytes || 20 + 2 + length > out.size()) finding("APP1 length field");
    check_tiff(out.data() + 30, length - 8 - thumb_bytes);
    return 0;
}
