// The C++ interface: what it adds over the C calls (row strides, the extra
// YUV layouts, sinks, error translation, EXIF lifetimes, the thumbnail).
// The encoder's own output is pinned elsewhere; here the wrapper's streams
// are compared with the C entry points' streams for the same pixels.
#include <TekoJEncoder.hpp>

#include "support/test_support.h"

#include <gtest/gtest.h>

#include <cstdio>
#include <cstring>
#include <string>

namespace {

using tekoj::ImageView;
using tekoj::PixelFormat;
using tekoj_test::Bytes;

// Copies tight rows into rows of `stride` bytes, the padding filled with
// bytes that would show if they were read.
Bytes pad_rows(const uint8_t* tight, size_t row, size_t rows, size_t stride) {
    Bytes out(stride * rows, 0xA5);
    for (size_t r = 0; r < rows; ++r) std::memcpy(&out[r * stride], tight + r * row, row);
    return out;
}

struct Planes {
    Bytes y, u, v;  // tight
};

Planes yuv420_planes(int w, int h, uint32_t seed) {
    const Bytes i420 = tekoj_test::rgb_to_yuv420(tekoj_test::photo_rgb(w, h, seed), w, h);
    const size_t ys = size_t(w) * h, cs = size_t((w + 1) / 2) * ((h + 1) / 2);
    return {Bytes(i420.begin(), i420.begin() + ys), Bytes(i420.begin() + ys, i420.begin() + ys + cs),
            Bytes(i420.begin() + ys + cs, i420.end())};
}

// The planes as NV21 or NV12 (chroma rows of `stride` bytes after the tight
// luma plane), or as YUYV or UYVY rows of `stride` bytes, each luma row with
// the chroma of its pair's upper row; padding shows as 0x5A.
Bytes yuv_layout(const Planes& p, int w, int h, PixelFormat f, size_t stride) {
    const size_t cw = (w + 1) / 2, ch = (h + 1) / 2;
    if (f == PixelFormat::nv21 || f == PixelFormat::nv12) {
        Bytes out = p.y;
        out.resize(p.y.size() + stride * ch, 0x5A);
        for (size_t r = 0; r < ch; ++r)
            for (size_t x = 0; x < cw; ++x) {
                uint8_t* pair = &out[p.y.size() + r * stride + 2 * x];
                pair[f == PixelFormat::nv12] = p.v[r * cw + x];
                pair[f == PixelFormat::nv21] = p.u[r * cw + x];
            }
        return out;
    }
    Bytes out(stride * h, 0x5A);
    for (int r = 0; r < h; ++r)
        for (int x = 0; x + 1 < w; x += 2) {
            const uint8_t y0 = p.y[r * w + x], y1 = p.y[r * w + x + 1];
            const uint8_t u = p.u[(r / 2) * cw + x / 2], v = p.v[(r / 2) * cw + x / 2];
            const uint8_t yuyv[4] = {y0, u, y1, v}, uyvy[4] = {u, y0, v, y1};
            std::memcpy(&out[r * stride + 2 * x], f == PixelFormat::yuyv ? yuyv : uyvy, 4);
        }
    return out;
}

Bytes c_api_stream(const void* data, int w, int h, uint32_t format, uint32_t quality) {
    return tekoj_test::encode_to_memory(tekoj_test::image_info(data, w, h, format), quality);
}

TEST(CppApi, StridedViewsGiveTheCallsStreamForEveryCFormat) {
    struct Case {
        PixelFormat format;
        uint32_t code;
        int w, h;
    };
    const Case cases[] = {
        {PixelFormat::rgb888, EKO_FORMAT_RGB888, 37, 35},     {PixelFormat::rgb565, EKO_FORMAT_RGB565, 33, 17},
        {PixelFormat::rgba8888, EKO_FORMAT_RGBA8888, 18, 40}, {PixelFormat::bgra8888, EKO_FORMAT_BGRA8888, 64, 16},
        {PixelFormat::grey, EKO_FORMAT_GREY, 31, 19},         {PixelFormat::i420, EKO_FORMAT_YUV420, 45, 33},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(testing::Message() << int(c.format) << " " << c.w << "x" << c.h);
        const Bytes rgb = tekoj_test::photo_rgb(c.w, c.h, 3);
        const Bytes tight = tekoj_test::rgb_to_format(rgb, c.w, c.h, c.code);
        const Bytes expected = c_api_stream(tight.data(), c.w, c.h, c.code, 80);
        ASSERT_FALSE(expected.empty());
        tekoj::Encoder enc;
        enc.quality(80);
        EXPECT_EQ(enc.encode(ImageView(tight.data(), c.w, c.h, c.format)), expected);
        if (c.format == PixelFormat::i420) {
            const Planes p = yuv420_planes(c.w, c.h, 3);
            const size_t cw = (c.w + 1) / 2, ch = (c.h + 1) / 2;
            const Bytes y = pad_rows(p.y.data(), c.w, c.h, c.w + 7);
            const Bytes u = pad_rows(p.u.data(), cw, ch, cw + 3);
            const Bytes v = pad_rows(p.v.data(), cw, ch, cw + 5);
            EXPECT_EQ(enc.encode(ImageView::planar(c.w, c.h, y.data(), c.w + 7, u.data(), cw + 3, v.data(), cw + 5)),
                      expected);
        } else {
            const size_t row = ImageView::row_bytes(c.format, c.w);
            const Bytes padded = pad_rows(tight.data(), row, c.h, row + 13);
            EXPECT_EQ(enc.encode(ImageView(padded.data(), c.w, c.h, c.format, row + 13)), expected);
        }
    }
}

// NV21/NV12 give the stream of the same planes handed over as I420; YUYV and
// UYVY that of I420 whose chroma is the even rows' (the 4:2:0 reader keeps
// the upper row of each pair).
TEST(CppApi, SemiPlanarAndPacked422MatchTheirPlanarEquivalent) {
    for (const int w : {2, 34, 47}) {
        for (const int h : {1, 16, 23}) {
            SCOPED_TRACE(testing::Message() << w << "x" << h);
            const Planes p = yuv420_planes(w, h, uint32_t(w * h));
            const size_t cw = (w + 1) / 2;
            const Bytes expected =
                c_api_stream(tekoj_test::rgb_to_yuv420(tekoj_test::photo_rgb(w, h, uint32_t(w * h)), w, h).data(), w, h,
                             EKO_FORMAT_YUV420, 70);
            tekoj::Encoder enc;
            enc.quality(70);

            const size_t ystride = w + 9, cstride = 2 * cw + 6;
            const Bytes y = pad_rows(p.y.data(), w, h, ystride);
            for (const PixelFormat f : {PixelFormat::nv21, PixelFormat::nv12}) {
                const Bytes padded = yuv_layout(p, w, h, f, cstride), tight = yuv_layout(p, w, h, f, 2 * cw);
                EXPECT_EQ(enc.encode(ImageView::semi_planar(f, w, h, y.data(), ystride, &padded[p.y.size()], cstride)),
                          expected);
                // One block, Android style: chroma rows as long as luma rows.
                EXPECT_EQ(enc.encode(ImageView(tight.data(), w, h, f)), expected);
            }
            if (w % 2 != 0) continue;  // packed 4:2:2 holds whole pixel pairs only
            for (const PixelFormat f : {PixelFormat::yuyv, PixelFormat::uyvy})
                EXPECT_EQ(enc.encode(ImageView(yuv_layout(p, w, h, f, 2 * w + 4).data(), w, h, f, 2 * w + 4)), expected);
        }
    }
}

// Every sink receives the stream; a sink that refuses or throws stops the
// encode, as do a file that cannot be created and a full device.
TEST(CppApi, SinksReceiveTheSameStreamAndFailingOnesStopTheEncode) {
    const Bytes rgb = tekoj_test::photo_rgb(300, 200, 9);
    const ImageView view(rgb.data(), 300, 200, PixelFormat::rgb888);
    tekoj::Encoder enc;
    enc.quality(95);
    const Bytes whole = enc.encode(view);
    EXPECT_TRUE(tekoj_test::decode_jpeg(whole).ok);

    Bytes pieces;
    size_t largest = 0, calls = 0;
    enc.encode_to(view, [&](const uint8_t* data, size_t size) {
        pieces.insert(pieces.end(), data, data + size);
        largest = std::max(largest, size), ++calls;
    });
    EXPECT_TRUE(pieces == whole && calls > 1 && largest <= 4096);
    const std::string path = tekoj_test::temp_path("cpp_sink.jpg");
    enc.encode_to_file(view, path);
    EXPECT_EQ(tekoj_test::read_file(path), whole);
    std::remove(path.c_str());
    const tekoj::Result r = enc.try_encode(view);
    EXPECT_TRUE(r && r.bytes == whole);

    size_t after_refusal = 0;
    bool refused = false;
    auto refusing = [&](const uint8_t*, size_t) {
        after_refusal += refused, refused = true;
        return false;
    };
    try {
        enc.encode_to(view, refusing);
        ADD_FAILURE() << "no exception";
    } catch (const tekoj::Error& e) {
        EXPECT_EQ(e.code(), uint32_t(EKO_ERR_WRITE));
    }
    EXPECT_EQ(after_refusal, 0u);
    struct Full {};
    auto throwing = [](const uint8_t*, size_t) { throw Full{}; };
    EXPECT_THROW(enc.encode_to(view, throwing), Full);
    EXPECT_EQ(enc.try_encode_to(view, throwing), uint32_t(EKO_ERR_WRITE));
    EXPECT_EQ(enc.try_encode_to_file(view, "/nonexistent-dir/out.jpg"), uint32_t(EKO_ERR_OPEN));
    if (tekoj_test::file_exists("/dev/full")) { EXPECT_THROW(enc.encode_to_file(view, "/dev/full"), tekoj::Error); }
    EXPECT_EQ(enc.try_encode_to_file(ImageView(nullptr, 4, 4, PixelFormat::grey), path), uint32_t(EKO_ERR_ARGUMENT));
    EXPECT_FALSE(tekoj_test::file_exists(path));
}

TEST(CppApi, RefusalsBecomeErrorsWithCodeAndMessage) {
    const Bytes rgb = tekoj_test::photo_rgb(40, 30);
    struct Case {
        const char* what;
        ImageView view;
        uint32_t code;
    };
    const Case cases[] = {
        {"null pixels", ImageView(nullptr, 40, 30, PixelFormat::rgb888), EKO_ERR_ARGUMENT},
        {"stride shorter than a row", ImageView(rgb.data(), 40, 30, PixelFormat::rgb888, 119), EKO_ERR_ARGUMENT},
        {"width 0", ImageView(rgb.data(), 0, 30, PixelFormat::rgb888), EKO_ERR_DIMENSIONS},
        {"height 50000", ImageView(rgb.data(), 1, 50000, PixelFormat::grey), EKO_ERR_DIMENSIONS},
        {"null chroma plane", ImageView::planar(40, 30, rgb.data(), 40, nullptr, 20, rgb.data(), 20),
         EKO_ERR_ARGUMENT},
        {"short interleaved chroma", ImageView::semi_planar(PixelFormat::nv21, 41, 30, rgb.data(), 41, rgb.data(), 41),
         EKO_ERR_ARGUMENT},
    };
    tekoj::Encoder enc;
    for (const Case& c : cases) {
        SCOPED_TRACE(c.what);
        try {
            enc.encode(c.view);
            ADD_FAILURE() << "no exception";
        } catch (const tekoj::Error& e) {
            EXPECT_EQ(e.code(), c.code);
            EXPECT_NE(std::string(e.what()).find(std::string(tekoj::error_message(c.code))), std::string::npos);
        }
        const tekoj::Result r = enc.try_encode(c.view);
        EXPECT_EQ(r.error, c.code);
        EXPECT_TRUE(r.bytes.empty());
    }
    void (*no_sink)(const uint8_t*, size_t) = nullptr;
    EXPECT_EQ(enc.try_encode_to(ImageView(rgb.data(), 40, 30, PixelFormat::rgb888), no_sink),
              uint32_t(EKO_ERR_ARGUMENT));
    EXPECT_THROW(enc.quality(0), tekoj::Error);
    EXPECT_THROW(enc.quality(101), tekoj::Error);
}

Bytes app1_of(const Bytes& jpeg) { return tekoj_test::segment(jpeg, 0xE1); }

bool contains(const Bytes& hay, const std::string& needle) {
    return std::search(hay.begin(), hay.end(), needle.begin(), needle.end()) != hay.end();
}

TEST(CppApi, ExifStringsAreCopiedIntoTheEncoder) {
    const Bytes grey(64 * 48, 90);
    tekoj::Encoder enc;
    {
        tekoj::Exif exif;
        exif.make = std::string("Maker-") + std::to_string(42);
        exif.model = "Model Z";
        exif.orientation = 6;
        tekoj::Gps gps;
        gps.latitude = {{{52, 1}, {31, 1}, {0, 1}}};
        gps.processing_method = "NETWORK";
        exif.gps = gps;
        enc.exif(exif);
    }  // the description and its strings are gone
    const tekoj::Encoder copy = enc;
    enc.exif(tekoj::Exif{});
    const Bytes app1 = app1_of(copy.encode(ImageView(grey.data(), 64, 48, PixelFormat::grey)));
    ASSERT_FALSE(app1.empty());
    EXPECT_TRUE(contains(app1, "Maker-42"));
    EXPECT_TRUE(contains(app1, "Model Z"));
    EXPECT_TRUE(contains(app1, "NETWORK"));
    EXPECT_FALSE(contains(app1_of(enc.encode(ImageView(grey.data(), 64, 48, PixelFormat::grey))), "Maker-42"));
}

// The thumbnail: the JPEG behind IFD1 inside APP1, decodable, of the fitted
// size, and the segment within its 16-bit length even for a demanding one.
TEST(CppApi, ThumbnailIsMadeByTheLibraryAndFitsTheSegment) {
    struct Case {
        PixelFormat format;
        int w, h;
        tekoj::Thumbnail thumb;
        int tw, th;
    };
    const Case cases[] = {
        {PixelFormat::rgb888, 640, 480, {}, 160, 120},
        {PixelFormat::yuyv, 320, 400, {}, 96, 120},
        {PixelFormat::nv21, 300, 100, {100, 100, 90}, 100, 33},
        {PixelFormat::grey, 90, 60, {}, 90, 60},
        {PixelFormat::rgb565, 1200, 900, {600, 450, 100}, 600, 450},
    };
    for (const Case& c : cases) {
        SCOPED_TRACE(testing::Message() << int(c.format) << " " << c.w << "x" << c.h);
        const Bytes rgb = tekoj_test::photo_rgb(c.w, c.h, 5);
        Bytes pixels = c.format == PixelFormat::rgb888 ? rgb
                       : c.format == PixelFormat::rgb565 ? tekoj_test::rgb_to_format(rgb, c.w, c.h, EKO_FORMAT_RGB565)
                       : c.format == PixelFormat::grey   ? tekoj_test::rgb_to_grey(rgb, c.w, c.h)
                                                         : yuv_layout(yuv420_planes(c.w, c.h, 5), c.w, c.h, c.format,
                                                                      c.format == PixelFormat::nv21 ? c.w : 2 * c.w);
        tekoj::Encoder enc;
        enc.thumbnail(c.thumb);
        const Bytes jpeg = enc.encode(ImageView(pixels.data(), c.w, c.h, c.format));
        ASSERT_TRUE(tekoj_test::decode_jpeg(jpeg).ok);
        const Bytes app1 = app1_of(jpeg);
        ASSERT_FALSE(app1.empty());
        EXPECT_LE(app1.size(), 65535u + 2);
        const uint8_t soi[3] = {0xFF, 0xD8, 0xFF};
        const auto at = std::search(app1.begin(), app1.end(), soi, soi + 3);
        ASSERT_NE(at, app1.end());
        const auto thumb = tekoj_test::decode_jpeg(Bytes(at, app1.end()));
        ASSERT_TRUE(thumb.ok) << thumb.message;
        EXPECT_EQ(thumb.width, c.tw);
        EXPECT_EQ(thumb.height, c.th);
        if (c.format != PixelFormat::grey) continue;
        // The thumbnail shows the image: grey in, the same grey level out.
        double sum = 0;
        for (size_t i = 0; i < thumb.pixels.size(); i += 3) sum += thumb.pixels[i];
        double src = 0;
        for (uint8_t v : pixels) src += v;
        EXPECT_NEAR(sum / (thumb.pixels.size() / 3), src / pixels.size(), 3.0);
    }
}

}  // namespace
