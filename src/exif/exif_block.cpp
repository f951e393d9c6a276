// The EXIF TIFF block: header, IFD0, EXIF sub-IFD, optional GPS sub-IFD and
// optional thumbnail IFD (IFD1), each IFD followed by the values that do not
// fit in its entries. Nothing is aligned; offsets may be odd.
//
// Which entries an IFD holds is decided in one place per IFD (the visit_*
// functions). The same visit drives three sinks: one that counts entries and
// data bytes, one that writes, so the entry counts, the offsets between IFDs
// and the size the APP1 writer reserves can never disagree with the bytes.
#include "exif/exif_block.h"

#include "exif/tiff_writers.h"

#include <algorithm>
#include <cstdio>
#include <cstring>

namespace {

// Offsets that entries point at; all zero while measuring (they are inline
// values and do not change any size).
struct Links {
    uint64_t exif_ifd = 0;
    uint64_t gps_ifd = 0;
    uint64_t ifd1 = 0;
    uint64_t end = 0;
};

bool present(const ExifRational& r) { return r.numerator != 0 || r.denominator != 0; }
bool present(const ExifRational (&r)[3]) { return present(r[0]) || present(r[1]) || present(r[2]); }

// The reference letters live in 4-byte fields; never read past the field even
// when the caller left no NUL in it.
size_t ref_length(const char (&ref)[4]) {
    const void* nul = std::memchr(ref, 0, sizeof ref);
    return nul == nullptr ? sizeof ref : static_cast<size_t>(static_cast<const char*>(nul) - ref);
}

template <class Sink>
void visit_ifd0(const ExifInfo& e, const Links& links, const char* date, Sink& s) {
    if (e.make != nullptr) s.ascii(0x010F, e.make, std::strlen(e.make));
    if (e.model != nullptr) s.ascii(0x0110, e.model, std::strlen(e.model));
    if (e.orientation != 0) s.short_value(0x0112, e.orientation);
    if (present(e.x_resolution)) s.rationals(0x011A, &e.x_resolution, 1);
    if (present(e.y_resolution)) s.rationals(0x011B, &e.y_resolution, 1);
    if (e.resolution_unit != 0) s.short_value(0x0128, e.resolution_unit);
    if (e.stamp_date_time != 0) s.ascii(0x0132, date, tekoj::kExifDateLength);
    if (e.ycbcr_positioning != 0) s.short_value(0x0213, e.ycbcr_positioning);
    s.long_value(0x8769, links.exif_ifd);
    if (e.gps != nullptr) s.long_value(0x8825, links.gps_ifd);
}

template <class Sink>
void visit_exif(const ExifInfo& e, Sink& s) {
    if (present(e.exposure_time)) s.rationals(0x829A, &e.exposure_time, 1);
    if (present(e.f_number)) s.rationals(0x829D, &e.f_number, 1);
    if (e.iso_speed != 0) s.short_value(0x8827, e.iso_speed);
    if (e.flash != 0) s.short_value(0x9209, e.flash);
    if (present(e.focal_length)) s.rationals(0x920A, &e.focal_length, 1);
    s.short_value(0xA403, e.white_balance);
}

template <class Sink>
void visit_gps(const GpsInfo& g, Sink& s) {
    if (g.latitude_ref[0] == 'N' || g.latitude_ref[0] == 'S')
        s.ascii(0x0001, g.latitude_ref, ref_length(g.latitude_ref));
    if (present(g.latitude)) s.rationals(0x0002, g.latitude, 3);
    if (g.longitude_ref[0] == 'E' || g.longitude_ref[0] == 'W')
        s.ascii(0x0003, g.longitude_ref, ref_length(g.longitude_ref));
    if (present(g.longitude)) s.rationals(0x0004, g.longitude, 3);
    if (g.altitude_ref <= 1) s.byte_value(0x0005, g.altitude_ref);
    if (present(g.altitude)) s.rationals(0x0006, &g.altitude, 1);
    if (present(g.time_stamp)) s.rationals(0x0007, g.time_stamp, 3);
    if (g.processing_method != nullptr) {
        // The method is stored with its NUL, as an UNDEFINED run.
        s.undefined(0x001B, reinterpret_cast<const uint8_t*>(g.processing_method),
                    std::strlen(g.processing_method) + 1);
    }
}

template <class Sink>
void visit_ifd1(const ExifInfo& e, const Links& links, Sink& s) {
    if (e.thumb_width != 0) s.short_value(0x0100, e.thumb_width);
    if (e.thumb_height != 0) s.short_value(0x0101, e.thumb_height);
    if (e.thumb_compression != 0) s.short_value(0x0103, e.thumb_compression);
    if (present(e.thumb_x_resolution)) s.rationals(0x011A, &e.thumb_x_resolution, 1);
    if (present(e.thumb_y_resolution)) s.rationals(0x011B, &e.thumb_y_resolution, 1);
    s.long_value(0x0201, links.end);  // the thumbnail follows the block
    if (e.thumb_length != 0) s.long_value(0x0202, e.thumb_length);
}

// Counts the entries of an IFD and the bytes its values take behind it.
struct EntryCounter {
    uint32_t entries = 0;
    uint64_t data = 0;

    void ascii(uint32_t, const char*, size_t length) { add(length + 1); }
    void short_value(uint32_t, uint32_t) { add(0); }
    void long_value(uint32_t, uint64_t) { add(0); }
    void byte_value(uint32_t, uint8_t) { add(0); }
    void rationals(uint32_t, const ExifRational*, uint32_t count) { add(8u * count); }
    void undefined(uint32_t, const uint8_t*, size_t count) { add(count > 4 ? count : 0); }

    void add(uint64_t bytes) {
        ++entries;
        data += bytes;
    }
    uint64_t ifd_bytes() const { return 2 + uint64_t{tekoj::kIfdEntrySize} * entries + 4 + data; }
};

// Writes the entries through the TIFF field writers. Lengths and offsets fit
// 32 bits here: the block was measured first.
struct EntryWriter {
    uint8_t* base;
    uint8_t* entry;
    uint32_t data_offset;

    void ascii(uint32_t tag, const char* text, size_t length) {
        entry = tekoj::write_ascii_tag(base, entry, &data_offset, tag, text, static_cast<uint32_t>(length));
    }
    void short_value(uint32_t tag, uint32_t value) { entry = __eko_WriteSHORTTag(base, entry, tag, value); }
    void long_value(uint32_t tag, uint64_t value) {
        entry = __eko_WriteLONGTag(base, entry, tag, static_cast<uint32_t>(value));
    }
    void byte_value(uint32_t tag, uint8_t value) {
        entry = __eko_WriteBYTESTag(base, entry, &data_offset, tag, &value, 1);
    }
    void rationals(uint32_t tag, const ExifRational* r, uint32_t count) {
        uint32_t words[6];
        for (uint32_t i = 0; i < count; ++i) {
            words[2 * i] = r[i].numerator;
            words[2 * i + 1] = r[i].denominator;
        }
        entry = __eko_WriteGPSInfoTag(base, entry, &data_offset, tag, words, count);
    }
    void undefined(uint32_t tag, const uint8_t* data, size_t count) {
        __eko_WriteUNDEFINEDTag(base, entry, &data_offset, tag, data, static_cast<uint32_t>(count));
        entry += tekoj::kIfdEntrySize;
    }
};

template <class Visit>
uint64_t measure_ifd(Visit&& visit) {
    EntryCounter counter;
    visit(counter);
    return counter.ifd_bytes();
}

// Writes one IFD at `data_offset`: its entry count, its entries, the offset
// of the next IFD, then its values; moves `data_offset` past all of them.
template <class Visit>
void write_ifd(uint8_t* base, uint32_t* data_offset, uint64_t next_ifd, Visit&& visit) {
    EntryCounter counter;
    visit(counter);
    const uint32_t start = *data_offset;
    __eko_WriteSHORT_LE(base + start, counter.entries);
    EntryWriter writer{base, base + start + 2, start + 2 + tekoj::kIfdEntrySize * counter.entries + 4};
    visit(writer);
    __eko_WriteLONG_LE(writer.entry, static_cast<uint32_t>(next_ifd));
    *data_offset = writer.data_offset;
}

Links layout_of(const ExifInfo& e) {
    const Links none;
    Links links;
    uint64_t offset = 8;
    offset += measure_ifd([&](auto& s) { visit_ifd0(e, none, nullptr, s); });
    links.exif_ifd = offset;
    offset += measure_ifd([&](auto& s) { visit_exif(e, s); });
    links.gps_ifd = offset;
    if (e.gps != nullptr) offset += measure_ifd([&](auto& s) { visit_gps(*e.gps, s); });
    links.ifd1 = offset;
    if (e.has_thumbnail != 0) offset += measure_ifd([&](auto& s) { visit_ifd1(e, none, s); });
    links.end = offset;
    return links;
}

void stamp_now(char out[tekoj::kExifDateLength + 1]) {
    // localtime_r: the result lands in our own record, so encoders stamping
    // on several threads never share conversion storage.
    const std::time_t now = std::time(nullptr);
    std::tm local{};
    if (now == static_cast<std::time_t>(-1) || localtime_r(&now, &local) == nullptr) {
        // No clock: the form EXIF reserves for an unknown date.
        static constexpr char kUnknown[] = "    :  :     :  :  ";
        DORVATEKO_OsMemcpy(out, kUnknown, sizeof kUnknown);
        return;
    }
    tekoj::format_exif_date(local, out);
}

const ExifInfo kNoDescription{};

}  // namespace

namespace tekoj {

uint64_t exif_block_size(const ExifInfo* exif) { return layout_of(exif != nullptr ? *exif : kNoDescription).end; }

void format_exif_date(const std::tm& local, char out[kExifDateLength + 1]) {
    DORVATEKO_OsMemset(out, 0, kExifDateLength + 1);
    // Clamped so that every field keeps its width whatever the record holds.
    const auto two = [](int v) { return std::clamp(v, 0, 99); };
    const int year = std::clamp(local.tm_year + 1900, 0, 9999);
    std::snprintf(out, kExifDateLength + 1, "%04d:%02d:%02d %02d:%02d:%02d", year, two(local.tm_mon + 1),
                  two(local.tm_mday), two(local.tm_hour), two(local.tm_min), two(local.tm_sec));
}

}  // namespace tekoj

extern "C" {

EKO_API uint32_t __eko_CreateExif(uint8_t* dst, const ExifInfo* exif) {
    eko_SetError(EKO_OK);
    if (dst == nullptr) return eko_SetError(EKO_ERR_ARGUMENT), 0u;  // a real block is never empty
    const ExifInfo& e = exif != nullptr ? *exif : kNoDescription;
    char date[tekoj::kExifDateLength + 1] = {};
    if (e.stamp_date_time != 0) stamp_now(date);
    const Links links = layout_of(e);

    // "II", 42, offset of IFD0.
    dst[0] = 0x49;
    dst[1] = 0x49;
    __eko_WriteSHORT_LE(dst + 2, 42);
    __eko_WriteLONG_LE(dst + 4, 8);
    uint32_t data_offset = 8;

    const uint64_t ifd0_next = e.has_thumbnail != 0 ? links.ifd1 : 0;
    write_ifd(dst, &data_offset, ifd0_next, [&](auto& s) { visit_ifd0(e, links, date, s); });
    write_ifd(dst, &data_offset, 0, [&](auto& s) { visit_exif(e, s); });
    if (e.gps != nullptr) write_ifd(dst, &data_offset, 0, [&](auto& s) { visit_gps(*e.gps, s); });
    if (e.has_thumbnail != 0) write_ifd(dst, &data_offset, 0, [&](auto& s) { visit_ifd1(e, links, s); });
    return data_offset;
}

}  // extern "C"
