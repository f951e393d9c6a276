// Exact bytes of the TIFF field writers and of the EXIF block. Buffers start
// filled with 0xAA, so a byte a writer leaves alone, or writes too far, shows.
#include "exif/exif_block.h"
#include "exif/exif_test_helpers.h"

#include <gtest/gtest.h>

using namespace exif_test;

TEST(TiffWriters, EachWriterFillsOneEntryAndItsDataArea) {
    Bytes b(96, 0xAA);
    uint8_t* const p = b.data();
    uint32_t o = 38;
    // Entry at 0, data area from offset 38: the entry, the data and the offset
    // after it are checked, then the buffer is restored for the next writer.
    const auto check = [&](const uint8_t* end, const std::string& entry, const std::string& data) {
        EXPECT_EQ(end, p + 12) << entry;
        EXPECT_EQ(Bytes(p, p + 13), hex(entry + " AA"));
        EXPECT_EQ(Bytes(p + 38, p + 39 + hex(data).size()), hex(data + " AA")) << entry;
        EXPECT_EQ(o, 38 + hex(data).size()) << entry;
        std::fill(b.begin(), b.end(), 0xAA), o = 38;
    };
    const uint8_t bytes[6] = {7, 1, 2, 3, 4, 5};
    check(__eko_WriteSHORTTag(p, p, 0x0112, 1), "1201 0300 01000000 01000000", "");
    check(__eko_WriteRATIONALTag(p, p, &o, 0x011A, 72, 1), "1A01 0500 01000000 26000000", "48000000 01000000");
    // Short values stand inline, zero-padded; short strings also in the data area.
    check(__eko_WriteASCIITag(p, p, &o, 0x010F, "XY"), "0F01 0200 03000000 58590000", "585900");
    check(__eko_WriteASCIITag(p, p, &o, 0x010F, "XYZ"), "0F01 0200 04000000 58595A00", "58595A00");  // 4 bytes: inline
    check(__eko_WriteASCIITag(p, p, &o, 0x010F, "WXYZ"), "0F01 0200 05000000 26000000", "5758595A00");
    check(__eko_WriteASCIITag(p, p, &o, 0x0110, "ABCDEFGHI"), "1001 0200 0A000000 26000000", "414243444546474849 00");
    check(__eko_WriteASCIITag(p, p, &o, 0x0110, ""), "1001 0200 01000000 00000000", "00");
    check(__eko_WriteBYTESTag(p, p, &o, 5, bytes, 1), "0500 0100 01000000 07000000", "");
    check(__eko_WriteBYTESTag(p, p, &o, 5, bytes, 4), "0500 0100 04000000 07010203", "");
    check(__eko_WriteBYTESTag(p, p, &o, 5, bytes, 5), "0500 0100 05000000 26000000", "07010203 04");
    check(__eko_WriteBYTESTag(p, p, &o, 5, bytes, 6), "0500 0100 06000000 26000000", "07010203 0405");
    check((__eko_WriteUNDEFINEDTag(p, p, &o, 0x1B, bytes, 3), p + 12), "1B00 0700 03000000 07010200", "");
    check((__eko_WriteUNDEFINEDTag(p, p, &o, 0x1B, nullptr, 9), p + 12), "1B00 0700 00000000 00000000", "");
    EXPECT_TRUE(__eko_GetStringSize(nullptr) == 1 && __eko_GetStringSize("") == 1 && __eko_GetStringSize("abc") == 4);
}

// Whole blocks: an empty description (44 bytes), an empty GPS record (74
// bytes), and entries that follow the description: a latitude reference that
// is no hemisphere, an altitude reference out of range and a thumbnail of
// length 0 leave their entries out, one non-zero word of a rational is
// enough, and the three bytes of "XY" put the resolution at an odd offset.
TEST(ExifBlock, ExactBlocks) {
    ExifInfo empty{}, with_gps{}, odd{}, four{};
    four.make = "XYZ";  // with its NUL exactly the four bytes that stand in the entry
    GpsInfo g{}, h{};
    with_gps.gps = &g;
    odd.make = "XY", odd.x_resolution = {72, 1}, odd.focal_length = {0, 10}, odd.has_thumbnail = 1, odd.gps = &h;
    h.latitude_ref[0] = 'X', h.latitude[2] = {5, 1}, h.altitude_ref = 2;
    const std::string head = "49492A00 08000000 ", white_balance = "03A4 0300 01000000 00000000 00000000 ";
    using Case = std::pair<const ExifInfo*, std::string>;
    for (const auto& [e, text] :
         {Case{&empty, head + "0100 6987 0400 01000000 1A000000 00000000 0100 " + white_balance},
          Case{&with_gps, head + "0200 6987 0400 01000000 26000000 2588 0400 01000000 38000000 00000000 0100 " +
                              white_balance + "0100 0500 0100 01000000 00000000 00000000 "},
          Case{&odd, head + "0400 0F01 0200 03000000 58590000 1A01 0500 01000000 41000000 6987 0400 01000000 49000000 "
                            "2588 0400 01000000 6F000000 99000000 585900 48000000 01000000 0200 0A92 0500 01000000 "
                            "67000000 " + white_balance + "00000000 0A000000 0100 0200 0500 03000000 81000000 00000000 "
                            "00000000 00000000 00000000 00000000 05000000 01000000 0100 0102 0400 01000000 AB000000 "
                            "00000000 "},
          Case{&four, head + "0200 0F01 0200 04000000 58595A00 6987 0400 01000000 2A000000 00000000 58595A00 0100 " +
                          white_balance}}) {
        const Bytes want = hex(text + "AA");
        Bytes b(256, 0xAA);
        ASSERT_EQ(__eko_CreateExif(b.data(), e), want.size() - 1);  // 44, 74, 171 and 60
        EXPECT_EQ(Bytes(b.begin(), b.begin() + want.size()), want);
        EXPECT_EQ(tekoj::exif_block_size(e), want.size() - 1);
    }
}

// The stamp is the local time now, and taking it leaves the process-wide
// localtime() result alone.
TEST(ExifBlock, DateStampIsNowAndThreadSafe) {
    const std::time_t epoch = 0, before = std::time(nullptr);
    const std::tm* shared = std::localtime(&epoch);
    const int shared_year = shared->tm_year;
    ExifInfo e{};
    e.stamp_date_time = 1;
    Bytes b(128, 0);
    const Entry date = read_ifd(b.data(), __eko_CreateExif(b.data(), &e), 8).at(0x0132);
    EXPECT_EQ(shared->tm_year, shared_year);
    const char* stamp = reinterpret_cast<const char*>(&b[date.value]);
    std::tm when{};
    ASSERT_TRUE(date.count == 20 && strptime(stamp, "%Y:%m:%d %H:%M:%S", &when) == stamp + 19) << stamp;
    when.tm_isdst = -1;
    EXPECT_NEAR(std::difftime(std::mktime(&when), before), 0.0, 2.0) << stamp;
}
