// The APP1 segment in whole-image streams: the golden case and a thumbnail on
// every target, every tag read back by exiftool and exiv2, long strings,
// refused descriptions and allocation failures.
#include "exif/exif_block.h"
#include "exif/exif_test_helpers.h"
#include "support/fault_os_layer.h"

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdio>
#include <regex>

using namespace exif_test;
using namespace tekoj_test;

namespace {

// The description of the golden case "exif-rgb888-48x32-q75" (cases.json).
struct GoldenDescription {
    ExifInfo e{};
    GpsInfo g{};
    GoldenDescription() {
        e.make = "Example Optics", e.model = "EX-1", e.orientation = 1, e.resolution_unit = 2;
        e.x_resolution = e.y_resolution = {300, 1}, e.ycbcr_positioning = 1, e.exposure_time = {1, 60};
        e.flash = 1, e.focal_length = {35, 1}, e.iso_speed = 100, e.f_number = {56, 10}, e.gps = &g;
        g.latitude_ref[0] = 'S', g.longitude_ref[0] = 'W', g.altitude_ref = 1, g.altitude = {12, 1};
        g.latitude[0] = {33, 1}, g.latitude[1] = {52, 1}, g.latitude[2] = {0, 1};
        g.longitude[0] = {151, 1}, g.longitude[1] = {12, 1}, g.longitude[2] = {3000, 100};
        g.time_stamp[0] = {23, 1}, g.time_stamp[1] = g.time_stamp[2] = {59, 1}, g.processing_method = "GPS";
    }
};

// Every field the library reads, with a thumbnail encoded by the library.
struct FullDescription : GoldenDescription {
    Bytes thumb;
    explicit FullDescription(uint32_t stamp) {
        const Bytes small = photo_rgb(160, 120, 9);
        thumb = encode_to_memory(image_info(small.data(), 160, 120, EKO_FORMAT_RGB888), 80);
        e.make = "TekoJ Test Camera", e.model = "TJ-9 Mark II", e.orientation = 6, e.stamp_date_time = stamp;
        e.exposure_time = {1, 250}, e.f_number = {28, 10}, e.iso_speed = 400, e.flash = 25, e.white_balance = 1;
        e.has_thumbnail = 1, e.thumb_width = 160, e.thumb_height = 120, e.thumb_compression = 6;
        e.thumb_x_resolution = e.thumb_y_resolution = {72, 1};
        e.thumb_length = static_cast<uint32_t>(thumb.size()), e.thumb_data = thumb.data();
        g.latitude_ref[0] = 'N', g.longitude_ref[0] = 'E', g.altitude_ref = 0, g.altitude = {35, 1};
        g.latitude[2] = {2412, 100}, g.longitude[0] = {2, 1}, g.processing_method = "HYBRID-FIX";
    }
};

struct Piece {
    const uint8_t* data;
    Bytes bytes;
};
uint32_t collect(void* pieces, const uint8_t* data, uint32_t count) {
    static_cast<std::vector<Piece>*>(pieces)->push_back({data, Bytes(data, data + count)});
    return count;
}

// One encode to target 0 memory, 1 file, 2 stream; empty on failure.
Bytes encode(const ImageInfo& info, int target, std::vector<Piece>* pieces) {
    const std::string path = temp_path("exif.jpg");
    pieces->clear();
    if (target == 0) return encode_to_memory(info, 75);
    if (target == 1) return eko_enc_jpeg_to_file(&info, path.c_str(), 75) == 1 ? read_file(path) : Bytes{};
    Bytes out;
    if (eko_enc_jpeg_to_stream(&info, collect, 75, pieces) != 1) return out;
    for (const Piece& p : *pieces) out.insert(out.end(), p.bytes.begin(), p.bytes.end());
    return out;
}

uint32_t app1_length(const Bytes& jpeg) { return jpeg.size() < 24 ? 0 : (jpeg[22] << 8 | jpeg[23]); }
const uint8_t* tiff_of(const Bytes& jpeg) { return jpeg.data() + 30; }  // after SOI, APP0 and 10 APP1 bytes

// IFD0 (tag 0), IFD1 (tag 1) or the sub-IFD an IFD0 entry points at.
Ifd ifd_of(const Bytes& jpeg, uint32_t tag) {
    uint32_t next = 0;
    const Ifd ifd0 = read_ifd(tiff_of(jpeg), app1_length(jpeg) - 8, 8, &next);
    const uint32_t at = tag == 1 ? next : ifd0.count(tag) ? ifd0.at(tag).value : 0;
    return tag == 0 ? ifd0 : read_ifd(tiff_of(jpeg), app1_length(jpeg) - 8, at);
}

std::string run(const std::string& command) {
    std::string out;
    FILE* p = popen(command.c_str(), "r");
    char chunk[4096];
    for (size_t n; p != nullptr && (n = fread(chunk, 1, sizeof chunk, p)) > 0;) out.append(chunk, n);
    if (p != nullptr) pclose(p);
    return out;
}

}  // namespace

TEST(ExifApp1, GoldenCaseAndThumbnailOnEveryTarget) {
    const Bytes input = read_file(golden_path("exif-rgb888-48x32-q75.in"));
    const Bytes expected = read_file(golden_path("exif-rgb888-48x32-q75.expected"));
    ASSERT_EQ(input.size(), 48u * 32 * 3);
    GoldenDescription golden;
    FullDescription full(0);
    ImageInfo info = image_info(input.data(), 48, 32, EKO_FORMAT_RGB888);
    std::vector<Piece> pieces;
    const uint32_t size = static_cast<uint32_t>(tekoj::exif_block_size(&full.e));
    for (int target = 0; target < 3; ++target) {
        info.exif_info = &golden.e;
        EXPECT_TRUE(encode(info, target, &pieces) == expected) << target;
        info.exif_info = &full.e;
        const Bytes out = encode(info, target, &pieces);
        ASSERT_EQ(app1_length(out), 8 + size + full.thumb.size()) << target;
        EXPECT_EQ(ifd_of(out, 1).at(0x0201).value, size);
        const Bytes embedded(tiff_of(out) + size, tiff_of(out) + size + full.thumb.size());
        EXPECT_TRUE(embedded == full.thumb) << target;
        const Decoded main = decode_jpeg(out), thumb = decode_jpeg(embedded);
        EXPECT_TRUE(main.ok && !main.warning && main.width == 48 && main.height == 32) << main.message;
        EXPECT_TRUE(thumb.ok && !thumb.warning && thumb.width == 160 && thumb.height == 120) << thumb.message;
    }
    // The stream callback received the caller's own thumbnail, in one piece.
    const auto at_thumb = [&](const Piece& p) { return p.data == full.thumb.data() && p.bytes == full.thumb; };
    EXPECT_EQ(std::count_if(pieces.begin(), pieces.end(), at_thumb), 1);
}

TEST(ExifReaders, ExiftoolAndExiv2ReadBackEveryTag) {
    if (run("command -v exiftool && command -v exiv2").find("exiv2") == std::string::npos)
        GTEST_SKIP() << "exiftool or exiv2 missing";
    FullDescription d(1);
    const Bytes photo = photo_rgb(64, 48);
    ImageInfo info = image_info(photo.data(), 64, 48, EKO_FORMAT_RGB888);
    info.exif_info = &d.e;
    const std::string path = temp_path("exif_readers.jpg");
    const std::time_t before = std::time(nullptr);
    ASSERT_EQ(eko_enc_jpeg_to_file(&info, path.c_str(), 75), 1u);
    const Bytes jpeg = read_file(path);
    const auto at = [&](uint32_t ifd, uint32_t tag) { return std::to_string(ifd_of(jpeg, ifd).at(tag).value); };
    const std::string date(reinterpret_cast<const char*>(tiff_of(jpeg) + ifd_of(jpeg, 0).at(0x0132).value));
    std::tm when{};
    ASSERT_TRUE(strptime(date.c_str(), "%Y:%m:%d %H:%M:%S", &when)) << date;
    when.tm_isdst = -1;
    EXPECT_LE(std::abs(std::difftime(std::mktime(&when), before)), 2.0) << date;

    // exiftool, numeric values by group. The method is stored without the
    // character-code prefix exiftool looks for: its one allowed complaint.
    const std::string length = std::to_string(d.thumb.size());
    std::string want = "IFD0:Make=\"TekoJ Test Camera\"|IFD0:Model=\"TJ-9 Mark II\"|IFD0:Orientation=6|"
                       "IFD0:XResolution=300|IFD0:YResolution=300|IFD0:ResolutionUnit=2|IFD0:ModifyDate=\"" + date +
                       "\"|IFD0:YCbCrPositioning=1|ExifIFD:ExposureTime=0.004|ExifIFD:FNumber=2.8|ExifIFD:ISO=400|"
                       "ExifIFD:Flash=25|ExifIFD:FocalLength=35|ExifIFD:WhiteBalance=1|GPS:GPSLatitudeRef=\"N\"|"
                       "GPS:GPSLatitude=33.8733666666667|GPS:GPSLongitudeRef=\"E\"|GPS:GPSLongitude=2.20833333333333|"
                       "GPS:GPSAltitudeRef=0|GPS:GPSAltitude=35|GPS:GPSTimeStamp=\"23:59:59\"|"
                       "GPS:GPSProcessingMethod=\"HYBRID-FIX\"|IFD1:ImageWidth=160|IFD1:ImageHeight=120|"
                       "IFD1:Compression=6|IFD1:XResolution=72|IFD1:YResolution=72|IFD1:ThumbnailOffset=" +
                       std::to_string(30 + ifd_of(jpeg, 1).at(0x0201).value) + "|IFD1:ThumbnailLength=" + length +
                       "|IFD1:ThumbnailImage=\"(Binary data " + length + " bytes, use -b option to extract)\"|"
                       "ExifTool:Warning=\"Invalid EXIF text encoding for GPSProcessingMethod\"|";
    const std::string json = run("exiftool -a -j -n -G1 -IFD0:all -ExifIFD:all -GPS:all -IFD1:all -Warning " + path);
    std::string got;
    const std::regex pair("\"([A-Za-z0-9]+:[A-Za-z0-9]+)\": (\"[^\"]*\"|[^,\\n]+)");
    for (std::sregex_iterator it(json.begin(), json.end(), pair), end; it != end; ++it)
        got += (*it)[1].str() + "=" + (*it)[2].str() + "|";
    EXPECT_EQ(got, want);
    const std::string thumb = run("exiftool -b -ThumbnailImage " + path + " 2>/dev/null");
    EXPECT_TRUE(Bytes(thumb.begin(), thumb.end()) == d.thumb);

    // exiv2: type, count and raw value of every entry, and nothing else.
    want = "Image.Make Ascii 18 TekoJ Test Camera|Image.Model Ascii 13 TJ-9 Mark II|Image.Orientation Short 1 6|"
           "Image.XResolution Rational 1 300/1|Image.YResolution Rational 1 300/1|Image.ResolutionUnit Short 1 2|"
           "Image.DateTime Ascii 20 " + date + "|Image.YCbCrPositioning Short 1 1|Image.ExifTag Long 1 " +
           at(0, 0x8769) + "|Photo.ExposureTime Rational 1 1/250|Photo.FNumber Rational 1 28/10|"
           "Photo.ISOSpeedRatings Short 1 400|Photo.Flash Short 1 25|Photo.FocalLength Rational 1 35/1|"
           "Photo.WhiteBalance Short 1 1|Image.GPSTag Long 1 " + at(0, 0x8825) +
           "|GPSInfo.GPSLatitudeRef Ascii 2 N|GPSInfo.GPSLatitude Rational 3 33/1 52/1 2412/100|"
           "GPSInfo.GPSLongitudeRef Ascii 2 E|GPSInfo.GPSLongitude Rational 3 2/1 12/1 3000/100|"
           "GPSInfo.GPSAltitudeRef Byte 1 0|GPSInfo.GPSAltitude Rational 1 35/1|"
           "GPSInfo.GPSTimeStamp Rational 3 23/1 59/1 59/1|GPSInfo.GPSProcessingMethod Undefined 11|"
           "Thumbnail.ImageWidth Short 1 160|Thumbnail.ImageLength Short 1 120|Thumbnail.Compression Short 1 6|"
           "Thumbnail.XResolution Rational 1 72/1|Thumbnail.YResolution Rational 1 72/1|"
           "Thumbnail.JPEGInterchangeFormat Long 1 " + at(1, 0x0201) +
           "|Thumbnail.JPEGInterchangeFormatLength Long 1 " + length + "|";
    // One line per entry, "Exif." dropped, spaces folded; exiv2 takes the
    // method's first 8 bytes for a character code, so only its type and count.
    got = std::regex_replace(run("exiv2 -PEkycv " + path + " 2>&1"), std::regex("Exif\\."), "");
    got = std::regex_replace(std::regex_replace(got, std::regex(" +"), " "), std::regex(" ?\n"), "|");
    EXPECT_EQ(std::regex_replace(got, std::regex("(Method Undefined 11)[^|]*"), "$1"), want);
}

TEST(ExifApp1, LongStringsFitAndOversizedOrBrokenDescriptionsAreRefused) {
    const Bytes photo = photo_rgb(48, 32);
    ImageInfo info = image_info(photo.data(), 48, 32, EKO_FORMAT_RGB888);
    const std::string make(60000, 'M'), model(3000, 'm'), method(1500, 'p'), huge(65600, 'H');
    ExifInfo e{};
    GpsInfo g{};
    e.make = make.c_str(), e.model = model.c_str(), e.gps = &g, g.processing_method = method.c_str();
    info.exif_info = &e;
    std::vector<Piece> pieces;
    const uint32_t bare = static_cast<uint32_t>(tekoj::exif_block_size(&e));
    e.has_thumbnail = e.thumb_length = 1;  // adds IFD1 with its length entry
    const uint32_t with_ifd1 = static_cast<uint32_t>(tekoj::exif_block_size(&e));
    const Bytes filler(65535 - 8 - with_ifd1, 0x5A);  // fills the segment to its last byte
    for (uint32_t thumb : {0u, static_cast<uint32_t>(filler.size())}) {
        e.has_thumbnail = thumb != 0, e.thumb_length = thumb, e.thumb_data = filler.data();
        for (int target = 0; target < 3; ++target) {
            const Bytes out = encode(info, target, &pieces);
            ASSERT_EQ(app1_length(out), 8 + (thumb ? with_ifd1 : bare) + thumb) << target;
            EXPECT_STREQ(reinterpret_cast<const char*>(tiff_of(out) + ifd_of(out, 0).at(0x010F).value), e.make);
            EXPECT_TRUE(decode_jpeg(out).ok) << target;
        }
    }
    const auto refused = [&](uint32_t code) {
        for (int target = 0; target < 3; ++target) {
            eko_SetError(EKO_OK);
            EXPECT_TRUE(encode(info, target, &pieces).empty()) << target;
            EXPECT_EQ(eko_GetLastError(), code) << target;
            for (const Piece& p : pieces) EXPECT_FALSE(p.bytes.size() > 21 && p.bytes[21] == 0xE1);
        }
    };
    e.thumb_length = static_cast<uint32_t>(filler.size()) + 1;  // one byte over the length field
    refused(EKO_ERR_TOO_LARGE);
    e.thumb_data = nullptr;
    refused(EKO_ERR_ARGUMENT);
    e.has_thumbnail = 0, e.make = huge.c_str();
    refused(EKO_ERR_TOO_LARGE);
}

TEST(ExifApp1, AllocationFailureAtEveryIndexFailsCleanly) {
    FullDescription d(1);
    const std::string make(5000, 'M');  // longer than a work buffer: staged
    d.e.make = make.c_str();
    const Bytes photo = photo_rgb(64, 48);
    ImageInfo info = image_info(photo.data(), 64, 48, EKO_FORMAT_RGB888);
    info.exif_info = &d.e;
    std::vector<Piece> pieces;
    for (int target = 0; target < 3; ++target) {
        const auto once = [&] {
            if (target != 0) return !encode(info, target, &pieces).empty();
            // Memory: keep the caller's block, which a refused creation leaves to us.
            uint8_t* block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(2048));
            uint8_t* out = block;
            int32_t length = 2048;
            const int64_t with_block = live_blocks();
            const bool ok = eko_enc_jpeg_to_buffer(&info, &out, &length, 75) == 1;
            DORVATEKO_OsFree(ok ? out : live_blocks() == with_block ? block : nullptr);
            return ok;
        };
        FaultScope scope;
        const int64_t live = live_blocks();
        ASSERT_TRUE(once()) << target;
        const int64_t own = target == 0 ? 1 : 0;  // the caller's block is not the library's
        const int64_t allocations = allocation_count() - own;
        for (int64_t i = 0; i < allocations; ++i) {
            reset_counters();
            fail_allocation(i + own);
            EXPECT_FALSE(once()) << target << " " << i;
            EXPECT_EQ(live_blocks(), live) << target << " " << i;
        }
    }
}
