// Exact bytes of the TIFF field writers and of the EXIF block. Buffers start
// filled with 0xAA, so a byte a writer leaves alone, or writes too far, shows.
#include "exif/exif_block.h"
#include "exif/exif_test_helpers.h"

#include <gtest/gtest.h>

using namespace exif_test;

TEST(TiffWriters, EachWriterFillsOneEntryAndItsDataArea) {
    // Entry at 0, data area from offset 38: the entry, the data and the offset after.
    const auto check = [](auto write, const char* entry, const char* data, uint32_t offset_after) {
        Bytes b(96, 0xAA);
        uint32_t offset = 38;
        EXPECT_EQ(write(b.data(), &offset), b.data() + 12) << entry;
        EXPECT_EQ(Bytes(b.begin(), b.begin() + 13), hex(std::string(entry) + " AA"));
        const Bytes stored = hex(std::string(data) + " AA");
        EXPECT_EQ(Bytes(b.begin() + 38, b.begin() + 38 + stored.size()), stored) << entry;
        EXPECT_EQ(offset, offset_after) << entry;
    };
    using P = uint8_t*;
    using O = uint32_t*;
    const uint8_t bytes[6] = {7, 1, 2, 3, 4, 5};
    check([](P b, O) { return __eko_WriteSHORTTag(b, b, 0x0112, 1); }, "12 01 03 00 01 00 00 00 01 00 00 00", "", 38);
    check([](P b, O o) { return __eko_WriteRATIONALTag(b, b, o, 0x011A, 72, 1); },
          "1A 01 05 00 01 00 00 00 26 00 00 00", "48 00 00 00 01 00 00 00", 46);
    // Short values stand inline, zero-padded; short strings also in the data area.
    check([](P b, O o) { return __eko_WriteASCIITag(b, b, o, 0x010F, "XY"); }, "0F 01 02 00 03 00 00 00 58 59 00 00",
          "58 59 00", 41);
    check([](P b, O o) { return __eko_WriteASCIITag(b, b, o, 0x0110, "ABCDEFGHI"); },
          "10 01 02 00 0A 00 00 00 26 00 00 00", "41 42 43 44 45 46 47 48 49 00", 48);
    check([](P b, O o) { return __eko_WriteASCIITag(b, b, o, 0x0110, ""); }, "10 01 02 00 01 00 00 00 00 00 00 00",
          "00", 39);
    check([&](P b, O o) { return __eko_WriteBYTESTag(b, b, o, 5, bytes, 1); }, "05 00 01 00 01 00 00 00 07 00 00 00",
          "", 38);
    check([&](P b, O o) { return __eko_WriteBYTESTag(b, b, o, 5, bytes, 6); }, "05 00 01 00 06 00 00 00 26 00 00 00",
          "07 01 02 03 04 05", 44);
    check([&](P b, O o) { return __eko_WriteUNDEFINEDTag(b, b, o, 0x1B, bytes, 3), b + 12; },
          "1B 00 07 00 03 00 00 00 07 01 02 00", "", 38);
    check([&](P b, O o) { return __eko_WriteUNDEFINEDTag(b, b, o, 0x1B, nullptr, 9), b + 12; },
          "1B 00 07 00 00 00 00 00 00 00 00 00", "", 38);
    EXPECT_EQ(__eko_GetStringSize(nullptr), 1u);
    EXPECT_EQ(__eko_GetStringSize("abc"), 4u);
    uint8_t text[4] = {0xAA, 0xAA, 0xAA, 0xAA};
    EXPECT_EQ(__eko_WriteASCII_String(text, "ab"), 3u);
    EXPECT_EQ(Bytes(text, text + 4), hex("61 62 00 AA"));
}

TEST(ExifBlock, EmptyDescriptionAndEmptyGpsGiveTheFixedBlocks) {
    ExifInfo e{};
    GpsInfo g{};
    const std::string head = "49 49 2A 00 08 00 00 00 ", exif = "01 00 03 A4 03 00 01 00 00 00 00 00 00 00 00 00 00 00 ";
    for (const GpsInfo* gps : std::initializer_list<const GpsInfo*>{nullptr, &g}) {
        e.gps = gps;
        const Bytes want =
            hex(head +
                (gps ? "02 00 69 87 04 00 01 00 00 00 26 00 00 00 25 88 04 00 01 00 00 00 38 00 00 00 00 00 00 00 "
                     : "01 00 69 87 04 00 01 00 00 00 1A 00 00 00 00 00 00 00 ") +
                exif + (gps ? "01 00 05 00 01 00 01 00 00 00 00 00 00 00 00 00 00 00 " : "") + "AA");
        Bytes b(128, 0xAA);
        ASSERT_EQ(__eko_CreateExif(b.data(), &e), want.size() - 1);  // 44 and 74
        EXPECT_EQ(Bytes(b.begin(), b.begin() + want.size()), want);
        EXPECT_EQ(tekoj::exif_block_size(&e), want.size() - 1);
    }
}

TEST(ExifBlock, EntriesFollowTheDescriptionAndOffsetsMayBeOdd) {
    ExifInfo e{};
    GpsInfo g{};
    e.make = "XY";  // three bytes of data area: the resolution lands on an odd offset
    e.x_resolution = {72, 1};
    e.focal_length = {0, 10};  // one non-zero word is enough
    e.gps = &g;
    g.latitude_ref[0] = 'X';  // not a hemisphere: no GPSLatitudeRef
    g.latitude[2] = {5, 1};
    g.altitude_ref = 2;   // out of range: no GPSAltitudeRef
    e.has_thumbnail = 1;  // with length 0: no JPEGInterchangeFormatLength
    Bytes b(256, 0xAA);
    const uint32_t size = __eko_CreateExif(b.data(), &e);
    ASSERT_EQ(size, 171u);
    EXPECT_EQ(tekoj::exif_block_size(&e), size);
    EXPECT_EQ(b[size], 0xAA);
    uint32_t next = 0;
    const Ifd ifd0 = read_ifd(b.data(), size, 8, &next);
    EXPECT_EQ(tags(ifd0), (std::set<uint32_t>{0x010F, 0x011A, 0x8769, 0x8825}));
    EXPECT_EQ(ifd0.at(0x011A).value, 65u);
    EXPECT_EQ(le32(&b[65]), 72u);
    EXPECT_EQ(tags(read_ifd(b.data(), size, ifd0.at(0x8769).value)), (std::set<uint32_t>{0x920A, 0xA403}));
    EXPECT_EQ(tags(read_ifd(b.data(), size, ifd0.at(0x8825).value)), std::set<uint32_t>{0x0002});
    const Ifd ifd1 = read_ifd(b.data(), size, next);
    EXPECT_EQ(tags(ifd1), std::set<uint32_t>{0x0201});
    EXPECT_EQ(ifd1.at(0x0201).value, size);
}

TEST(ExifBlock, DateStampLeavesTheSharedLocaltimeStorageAlone) {
    std::tm t{};
    t.tm_year = 127, t.tm_mon = 2, t.tm_mday = 5, t.tm_hour = 9, t.tm_min = 7, t.tm_sec = 3;
    char text[20];
    tekoj::format_exif_date(t, text);
    EXPECT_STREQ(text, "2027:03:05 09:07:03");
    // Hold the process-wide localtime() result: a stamp must not overwrite it.
    const std::time_t epoch = 0;
    const std::tm* shared = std::localtime(&epoch);
    const int shared_year = shared->tm_year;
    ExifInfo e{};
    e.stamp_date_time = 1;
    Bytes b(128, 0);
    const Entry date = read_ifd(b.data(), __eko_CreateExif(b.data(), &e), 8).at(0x0132);
    EXPECT_EQ(shared->tm_year, shared_year);
    EXPECT_EQ(date.count, 20u);
    EXPECT_EQ(std::string(reinterpret_cast<const char*>(&b[date.value])).size(), 19u);
}
