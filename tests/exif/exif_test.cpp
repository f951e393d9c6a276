// The APP1 segment in whole-image streams: the golden case and a full
// description with a thumbnail on every target, read back by exiftool and
// exiv2; long strings and refused descriptions. Exact bytes of the TIFF
// field writers and of the EXIF block: buffers start filled with 0xAA, so a
// byte a writer leaves alone, or writes too far, shows.
#include "exif/exif_block.h"
#include "exif/exif_test_helpers.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdlib>

using namespace exif_test;
using namespace tekoj_test;

namespace {

// The description of the golden case "exif-rgb888-48x32-q75" (cases.json) or,
// when full, every field the library reads and a thumbnail it encoded itself.
// GpsInfo in order: reserved, latitude reference and value, the same for
// longitude, altitude reference, reserved, altitude, time, reserved, method.
struct Description {
    ExifInfo e{};
    GpsInfo g{0, "S", {{33, 1}, {52, 1}, {0, 1}}, "W", {{151, 1}, {12, 1}, {3000, 100}}, 1, {}, {12, 1},
              {{23, 1}, {59, 1}, {59, 1}}, 0, "GPS"};
    Bytes thumb;
    explicit Description(bool full) {
        e.make = "Example Optics", e.model = "EX-1", e.orientation = 1, e.resolution_unit = 2;
        e.x_resolution = e.y_resolution = {300, 1}, e.ycbcr_positioning = 1, e.exposure_time = {1, 60};
        e.flash = 1, e.focal_length = {35, 1}, e.iso_speed = 100, e.f_number = {56, 10}, e.gps = &g;
        if (!full) return;
        thumb = encode_to_memory(image_info(photo_rgb(160, 120, 9).data(), 160, 120, EKO_FORMAT_RGB888), 80);
        e.make = "TekoJ Test Camera", e.model = "TJ-9 Mark II", e.orientation = 6, e.stamp_date_time = 1;
        e.exposure_time = {1, 250}, e.f_number = {28, 10}, e.iso_speed = 400, e.flash = 25, e.white_balance = 1;
        e.has_thumbnail = 1, e.thumb_width = 160, e.thumb_height = 120, e.thumb_compression = 6;
        e.thumb_x_resolution = e.thumb_y_resolution = {72, 1}, e.thumb_length = static_cast<uint32_t>(thumb.size());
        e.thumb_data = thumb.data();
        g = GpsInfo{0, "N", {{33, 1}, {52, 1}, {2412, 100}}, "E", {{2, 1}, {12, 1}, {3000, 100}}, 0, {}, {35, 1},
                    {{23, 1}, {59, 1}, {59, 1}}, 0, "HYBRID-FIX"};
    }
};

ImageInfo with_exif(const ExifInfo* exif, const Bytes& rgb48x32) {
    ImageInfo info = image_info(rgb48x32.data(), 48, 32, EKO_FORMAT_RGB888);
    info.exif_info = exif;
    return info;
}

// One encode to target 0 memory (a block the library allocates), 1 file,
// 2 stream; empty on failure.
constexpr int kMembersByTarget[3] = {kToBuffer, kToFile, kToStream};
Call encode(const ImageInfo& info, int target) {
    return call_member(kMembersByTarget[target], info, 75, temp_path("exif.jpg"));
}

uint32_t app1_length(const Bytes& jpeg) { return jpeg.size() < 24 ? 0 : (jpeg[22] << 8 | jpeg[23]); }
const uint8_t* tiff_of(const Bytes& jpeg) { return jpeg.data() + 30; }  // after SOI, APP0 and 10 APP1 bytes

// IFD0 (tag 0), IFD1 (tag 1) or the sub-IFD an IFD0 entry points at.
Ifd ifd_of(const Bytes& jpeg, uint32_t tag) {
    uint32_t next = 0;
    const Ifd ifd0 = read_ifd(tiff_of(jpeg), app1_length(jpeg) - 8, 8, &next);
    return tag == 0 ? ifd0 : read_ifd(tiff_of(jpeg), app1_length(jpeg) - 8, tag == 1 ? next : ifd0.at(tag).value);
}

std::string run(const std::string& command) {  // its standard output
    const std::string path = temp_path("tool.txt");
    EXPECT_NE(std::system((command + " > " + path).c_str()), -1) << command;
    const Bytes text = read_file(path);
    return std::string(text.begin(), text.end());
}

}  // namespace

TEST(ExifApp1, GoldenCaseAndFullDescriptionOnEveryTargetReadBackByExiftoolAndExiv2) {
    const Bytes input = read_file(golden_path("exif-rgb888-48x32-q75.in"));
    const Bytes expected = read_file(golden_path("exif-rgb888-48x32-q75.expected"));
    const Description golden(false), full(true);
    const uint32_t size = static_cast<uint32_t>(tekoj::exif_block_size(&full.e));
    for (int target : {0, 2, 1}) {  // the file written last stays for the readers
        EXPECT_TRUE(encode(with_exif(&golden.e, input), target).out == expected) << target;
        const Call call = encode(with_exif(&full.e, input), target);
        const Bytes& out = call.out;
        ASSERT_EQ(app1_length(out), 8 + size + full.thumb.size()) << target;
        const size_t at = 30 + ifd_of(out, 1).at(0x0201).value;  // where IFD1 puts the thumbnail
        EXPECT_TRUE(at + full.thumb.size() <= out.size() && std::equal(full.thumb.begin(), full.thumb.end(), &out[at]));
        const Decoded main = decode_jpeg(out), thumb = decode_jpeg(full.thumb);
        EXPECT_TRUE(main.ok && !main.warning && main.width == 48 && main.height == 32) << main.message;
        EXPECT_TRUE(thumb.ok && !thumb.warning && thumb.width == 160 && thumb.height == 120) << thumb.message;
        // The stream callback received the caller's own thumbnail, in one piece.
        EXPECT_EQ(std::count(call.pieces.begin(), call.pieces.end(), std::pair{full.thumb.data(), full.thumb}), target == 2);
    }
    const std::string path = temp_path("exif.jpg"), length = std::to_string(full.thumb.size());
    const Bytes jpeg = read_file(path);
    const auto at = [&](uint32_t ifd, uint32_t tag) { return std::to_string(ifd_of(jpeg, ifd).at(tag).value); };
    const std::string date(reinterpret_cast<const char*>(tiff_of(jpeg) + ifd_of(jpeg, 0).at(0x0132).value));

    // exiftool: numeric values in entry order (exiv2 below names the entries).
    // The method is stored without the character-code prefix exiftool looks
    // for: its one allowed complaint.
    EXPECT_EQ(run("exiftool -a -n -s3 -IFD0:all -ExifIFD:all -GPS:all -IFD1:all -Warning " + path),
              "TekoJ Test Camera\nTJ-9 Mark II\n6\n300\n300\n2\n" + date + "\n1\n0.004\n2.8\n400\n25\n35\n1\nN\n"
              "33.8733666666667\nE\n2.20833333333333\n0\n35\n23:59:59\nHYBRID-FIX\n160\n120\n6\n72\n72\n" +
                  std::to_string(30 + ifd_of(jpeg, 1).at(0x0201).value) + "\n" + length + "\n(Binary data " + length +
                  " bytes, use -b option to extract)\nInvalid EXIF text encoding for GPSProcessingMethod\n");

    // exiv2: type, count and raw value of every entry, and nothing else.
    const std::string want =
        "Image.Make Ascii 18 TekoJ Test Camera|Image.Model Ascii 13 TJ-9 Mark II|Image.Orientation Short 1 6|"
        "Image.XResolution Rational 1 300/1|Image.YResolution Rational 1 300/1|Image.ResolutionUnit Short 1 2|"
        "Image.DateTime Ascii 20 " + date + "|Image.YCbCrPositioning Short 1 1|Image.ExifTag Long 1 " +
        at(0, 0x8769) + "|Photo.ExposureTime Rational 1 1/250|Photo.FNumber Rational 1 28/10|Photo.ISOSpeedRatings "
        "Short 1 400|Photo.Flash Short 1 25|Photo.FocalLength Rational 1 35/1|Photo.WhiteBalance Short 1 1|Image."
        "GPSTag Long 1 " + at(0, 0x8825) + "|GPSInfo.GPSLatitudeRef Ascii 2 N|GPSInfo.GPSLatitude Rational 3 33/1 "
        "52/1 2412/100|GPSInfo.GPSLongitudeRef Ascii 2 E|GPSInfo.GPSLongitude Rational 3 2/1 12/1 3000/100|GPSInfo."
        "GPSAltitudeRef Byte 1 0|GPSInfo.GPSAltitude Rational 1 35/1|GPSInfo.GPSTimeStamp Rational 3 23/1 59/1 59/1|"
        "GPSInfo.GPSProcessingMethod Undefined 11|Thumbnail.ImageWidth Short 1 160|Thumbnail.ImageLength Short 1 "
        "120|Thumbnail.Compression Short 1 6|Thumbnail.XResolution Rational 1 72/1|Thumbnail.YResolution Rational 1 "
        "72/1|Thumbnail.JPEGInterchangeFormat Long 1 " + at(1, 0x0201) + "|Thumbnail.JPEGInterchangeFormatLength "
        "Long 1 " + length + "|";
    // One line per entry, "Exif." dropped, spaces folded; exiv2 takes the
    // method's first 8 bytes for a character code, so only its type and count.
    const std::string fold = R"(sed 's/^Exif\.//; s/  */ /g; s/ *$//; s/\(Method Undefined 11\).*/\1/' | tr '\n' '|')";
    EXPECT_EQ(run("exiv2 -PEkycv " + path + " 2>&1 | " + fold), want);
}

// Strings far longer than a work buffer fill the segment to its last byte
// (with a thumbnail as filler) on every target. One byte more, a thumbnail without
// data or a make too long on its own are refused, leaving no APP1 segment.
TEST(ExifApp1, LongStringsFitAndOversizedOrBrokenDescriptionsAreRefused) {
    const Bytes photo = photo_rgb(48, 32);
    const std::string make(60000, 'M'), model(3000, 'm'), method(1500, 'p'), huge(65600, 'H');
    ExifInfo e{};
    GpsInfo g{};
    e.make = make.c_str(), e.model = model.c_str(), e.gps = &g, g.processing_method = method.c_str();
    e.has_thumbnail = e.thumb_length = 1;
    const Bytes filler(65535 - 8 - tekoj::exif_block_size(&e), 0x5A);
    e.thumb_length = static_cast<uint32_t>(filler.size()), e.thumb_data = filler.data();
    const ImageInfo info = with_exif(&e, photo);
    for (int target = 0; target < 3; ++target) {
        const Bytes out = encode(info, target).out;
        ASSERT_EQ(app1_length(out), 65535u) << target;
        EXPECT_STREQ(reinterpret_cast<const char*>(tiff_of(out) + ifd_of(out, 0).at(0x010F).value), e.make);
        EXPECT_TRUE(decode_jpeg(out).ok) << target;
    }
    const auto refused = [&](uint32_t code) {
        for (int target = 0; target < 3; ++target) {
            eko_SetError(EKO_OK);
            const Call c = encode(info, target);
            EXPECT_TRUE(c.out.empty() && eko_GetLastError() == code) << target << " " << code;
            for (const auto& [at, bytes] : c.pieces) EXPECT_FALSE(bytes.size() > 21 && bytes[21] == 0xE1);
        }
    };
    e.thumb_length += 1;
    refused(EKO_ERR_TOO_LARGE);
    e.thumb_data = nullptr;
    refused(EKO_ERR_ARGUMENT);
    e.has_thumbnail = 0, e.make = huge.c_str();
    refused(EKO_ERR_TOO_LARGE);
}

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
