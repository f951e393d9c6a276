// Failures from outside: every allocation of every entry point, of the EXIF
// path and of the incremental interface made to fail in turn, and files that
// refuse bytes (a short write, a full disc). Each failure returns the defined
// result with its code, leaks no block, leaves no file open and leaves the
// caller's variables as the header says; the first call let through gives
// the normal stream.
#include <TekoJEncoderInternal.h>

#include "incremental/incremental_support.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <iostream>
#include <string>

using namespace tekoj_test;

namespace {

const std::string kPath = temp_path("faults.jpg");

}  // namespace

TEST(AllocationFailure, EveryPointOfEveryEntryPointFailsCleanly) {
    struct Sweep {
        std::string what;
        std::function<Bytes(int64_t)> run;  // the stream, empty when the call failed
        bool whole_image;                   // one call: its code must be the allocation's
    };
    std::vector<Sweep> sweeps;
    // Whole images large enough that memory targets grow while coding.
    const Bytes rgb = noise(image_size(EKO_FORMAT_RGB888, 96, 90), 77), grey = noise(96 * 90, 78);
    const ImageInfo images[] = {image_info(rgb.data(), 96, 90, EKO_FORMAT_RGB888),
                                image_info(grey.data(), 96, 90, EKO_FORMAT_GREY)};
    for (const ImageInfo& info : images)
        for (int m = 0; m < kMembers; ++m)
            for (int32_t start : {0, 100}) {
                if (start != 0 && m != kToBuffer) continue;  // only that member enlarges a short block first
                sweeps.push_back({member_name(m) + " format " + std::to_string(info.format) + " block " +
                                      std::to_string(start),
                                  [&info, m, start](int64_t n) {
                                      const Call c = call_member(m, info, 90, kPath, start, n);
                                      return c.result == 1 ? c.out : Bytes{};
                                  },
                                  true});
            }
    // EXIF: an APP1 segment longer than a work buffer, the date stamp, GPS
    // and a thumbnail, on every target.
    const std::string make(3000, 'M'), model(1500, 'm');
    const Bytes thumb = encode_to_memory(images[0], 50);
    GpsInfo gps{};
    gps.processing_method = "GPS";
    ExifInfo exif{};
    exif.make = make.c_str(), exif.model = model.c_str(), exif.stamp_date_time = 1, exif.gps = &gps;
    exif.has_thumbnail = 1, exif.thumb_length = uint32_t(thumb.size()), exif.thumb_data = thumb.data();
    ImageInfo with_exif = images[0];
    with_exif.exif_info = &exif;
    for (int m : {kToBuffer, kToFile, kToStream})
        sweeps.push_back({"EXIF " + member_name(m), [&, m](int64_t n) {
                              const Call c = call_member(m, with_exif, 90, kPath, 0, n);
                              return c.result == 1 ? c.out : Bytes{};
                          }, true});
    // MCU-row interface, row driver and column-split on every target; ten
    // MCU rows whose 4096-byte row buffers must grow.
    const Bytes yuv = noise(image_size(EKO_FORMAT_YUV420, 128, 160), 79);
    const ImageInfo planar = image_info(yuv.data(), 128, 160, EKO_FORMAT_YUV420);
    const EncoderSettings s = settings(800);
    std::vector<int16_t> coefficients = coefficients_of(encode(planar, {.settings = &s}));
    for (const uint32_t sink : {EKO_OUTPUT_MEMORY, EKO_OUTPUT_FILE, EKO_OUTPUT_STREAM})
        for (const Mode mode : {Mode::Bands, Mode::Rows, Mode::Columns})
            sweeps.push_back({"incremental sink " + std::to_string(sink) + " mode " + std::to_string(int(mode)),
                              [&, sink, mode](int64_t n) {
                                  return encode(planar, {&s, mode, sink, coefficients, [](EncoderContext*, Stage) {}, n});
                              }, false});

    int64_t points = 0;
    for (const Sweep& sweep : sweeps) {
        SCOPED_TRACE(sweep.what);
        const Bytes expected = without_date(sweep.run(-1));
        ASSERT_GT(expected.size(), 6144u);
        for (int64_t n = 0;; ++n) {
            SCOPED_TRACE("allocation " + std::to_string(n) + " fails");
            NoLeak no_leak;
            const Bytes got = sweep.run(n);
            if (!failure_injected()) {  // fewer allocations than n: the call ran through
                EXPECT_EQ(without_date(got), expected);
                EXPECT_GT(n, 10);  // creation alone allocates more than ten blocks
                break;
            }
            ++points;
            EXPECT_TRUE(got.empty());
            if (sweep.whole_image) { EXPECT_EQ(eko_GetLastError(), uint32_t(EKO_ERR_ALLOC)); }
        }
    }
    std::cout << "[ points   ] " << points << " allocation failure points in " << sweeps.size() << " sweeps\n";
    std::remove(kPath.c_str());
}

TEST(WriteFailure, AShortWriteOrAFullDiscFailsEveryFileTarget) {
    // A stream smaller than the C library's file buffer reaches a full disc
    // only when the file is closed; a large one already while writing.
    const Bytes small = noise(8 * 8, 5), large = noise(image_size(EKO_FORMAT_YUV420, 128, 96), 3);
    const ImageInfo images[] = {image_info(small.data(), 8, 8, EKO_FORMAT_GREY),
                                image_info(large.data(), 128, 96, EKO_FORMAT_YUV420)};
    for (const ImageInfo& info : images) {
        const Bytes expected = encode_to_memory(info, 95);
        const int64_t n = int64_t(expected.size());
        for (int m = kToFile; m <= kToFileExFull; ++m) {
            SCOPED_TRACE(member_name(m) + " " + std::to_string(n) + " bytes");
            {
                NoLeak no_leak;
                const Call c = call_member(m, info, 95, "/dev/full");
                EXPECT_TRUE(c.result == 0 && eko_GetLastError() == EKO_ERR_WRITE);
            }
            // The file takes `budget` bytes, then every write comes up short.
            for (int64_t budget : {int64_t{0}, int64_t{1}, int64_t{628}, int64_t{4095}, int64_t{4096}, n - 1, n}) {
                NoLeak no_leak;
                fail_writes_after(budget);
                const Call c = call_member(m, info, 95, kPath);
                EXPECT_EQ(c.result, budget >= n ? 1u : 0u) << budget;
                EXPECT_EQ(eko_GetLastError(), budget >= n ? 0u : uint32_t(EKO_ERR_WRITE)) << budget;
                if (budget >= n) { EXPECT_EQ(c.out, expected); }
            }
        }
        // The MCU-row interface writes into the caller's open file and the
        // caller closes it: a large stream fails while coding and hands back
        // nothing; a small one fails only at the caller's close.
        SCOPED_TRACE("MCU rows " + std::to_string(n) + " bytes");
        NoLeak no_leak;
        void* file = DORVATEKO_OsFopen("/dev/full", "wb");
        const OutputRequest request{EKO_OUTPUT_FILE, file, nullptr, 0};
        const EncodeOptions options{95, nullptr, 0};
        EncoderContext* ctx = eko_jpeg_enc_mcu_init(&info, &request, &options, nullptr);
        ASSERT_NE(ctx, nullptr);
        const bool is_small = info.width == 8;
        Bytes band(size_t(info.width) * 32, 0x80);
        uint32_t next = 0, coded = 0;
        for (int row = 0; row < info.height; row += info.format == EKO_FORMAT_GREY ? 8 : 16) {
            std::copy_n(static_cast<const uint8_t*>(info.data) + size_t(row) * info.width,
                        size_t(info.width) * (is_small ? 8 : 16), band.begin());
            coded += eko_jpeg_enc_muc_process(ctx, band.data(), &next);
        }
        uint8_t* buffer = &band[0];
        uint32_t length = 7;
        eko_jpeg_enc_mcu_finish(ctx, &buffer, &length);
        const uint32_t finish_error = eko_GetLastError();
        const int closed = DORVATEKO_OsFclose(file);
        if (is_small) {
            EXPECT_TRUE(coded == 1 && length == n && finish_error == EKO_OK && closed != 0);
        } else {
            EXPECT_TRUE(coded < 6 && buffer == nullptr && length == 0 && finish_error == EKO_ERR_WRITE);
        }
    }
    std::remove(kPath.c_str());
}
