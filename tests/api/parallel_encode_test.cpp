// Row-parallel encoding: for every format, size, thread count and output
// kind the stream equals the single-threaded one; the callback gets it in
// order, one call at a time; failures anywhere leak nothing.
#include <TekoJEncoder.hpp>

#include "incremental/incremental_support.h"
#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <atomic>
#include <random>
#include <thread>

using namespace tekoj_test;

namespace {

struct Collector {
    Bytes bytes;
    std::atomic<int> inside{0};
    bool overlapped = false, oversized = false;
};

uint32_t collect(void* arg, const uint8_t* data, uint32_t count) {
    auto* c = static_cast<Collector*>(arg);
    if (c->inside.fetch_add(1) != 0) c->overlapped = true;
    if (count > 4096) c->oversized = true;
    c->bytes.insert(c->bytes.end(), data, data + count);
    c->inside.fetch_sub(1);
    return count;
}

// Threads take rows from a shared counter, `chunk` at a time.
bool drive(EkoParallelEncode* e, uint32_t threads, uint32_t chunk = 1) {
    const uint32_t rows = eko_enc_jpeg_parallel_row_count(e);
    std::atomic<uint32_t> next{0};
    std::atomic<bool> ok{true};
    std::vector<std::thread> pool;
    for (uint32_t t = 0; t < threads; ++t)
        pool.emplace_back([&, t] {
            for (uint32_t k; (k = next.fetch_add(chunk)) < rows;)
                if (!eko_enc_jpeg_parallel_rows(e, t, k, std::min(chunk, rows - k))) ok = false;
        });
    for (auto& th : pool) th.join();
    return ok;
}

const std::string kPath = temp_path("parallel.jpg");

// One parallel encode to `kind`; empty on failure or a broken callback.
Bytes parallel(const ImageInfo& info, uint32_t kind, uint32_t threads, uint32_t quality = 75,
               const EncoderSettings* settings = nullptr, uint32_t chunk = 1, uint8_t* given = nullptr,
               uint32_t given_size = 0) {
    Collector sink;
    OutputRequest request{kind, nullptr, given, given_size};
    if (kind == EKO_OUTPUT_FILE) request.file = DORVATEKO_OsFopen(kPath.c_str(), "wb");
    const EncodeOptions options{quality, nullptr, 0};
    EkoParallelEncode* e =
        eko_enc_jpeg_parallel_create(&info, &request, &options, settings, collect, &sink, threads);
    if (e == nullptr) {
        if (request.file != nullptr) DORVATEKO_OsFclose(request.file);
        return {};
    }
    const bool driven = drive(e, threads, chunk);
    uint8_t* block = nullptr;
    uint32_t length = 0;
    const bool finished = eko_enc_jpeg_parallel_finish(e, &block, &length) == 1;
    Bytes out;
    if (kind == EKO_OUTPUT_MEMORY) out.assign(block, block + length);
    DORVATEKO_OsFree(block);
    if (request.file != nullptr) DORVATEKO_OsFclose(request.file), out = read_file(kPath);
    if (kind == EKO_OUTPUT_STREAM) out = sink.bytes;
    if (!driven || !finished || sink.overlapped || sink.oversized) out.clear();
    return out;
}

constexpr uint32_t kFormats[] = {EKO_FORMAT_RGB565,   EKO_FORMAT_RGB888,  EKO_FORMAT_YUV420,
                                 EKO_FORMAT_GREY,     EKO_FORMAT_RGBA8888, EKO_FORMAT_BGRA8888};
constexpr uint32_t kKinds[] = {EKO_OUTPUT_MEMORY, EKO_OUTPUT_FILE, EKO_OUTPUT_STREAM};

}  // namespace

TEST(Parallel, SameStreamForEveryThreadCountFormatSizeAndOutput) {
    std::mt19937 random(11);
    for (const uint32_t format : kFormats) {
        for (uint32_t threads = 1; threads <= 8; ++threads) {
            const int w = 1 + int(random() % 300), h = 1 + int(random() % 200);
            const Bytes rgb = photo_rgb(w, h, threads);
            const Bytes pixels = rgb_to_format(rgb, w, h, format);
            const ImageInfo info = image_info(pixels.data(), w, h, format);
            const uint32_t quality = 20 + random() % 80;
            const Bytes reference = encode_to_memory(info, quality);
            ASSERT_FALSE(reference.empty());
            const uint32_t kind = kKinds[threads % 3];
            EXPECT_EQ(parallel(info, kind, threads, quality, nullptr, 1 + threads % 3), reference)
                << "format " << format << " " << w << "x" << h << " threads " << threads << " kind " << kind;
        }
    }
}

TEST(Parallel, ExifSettingsAndTallImages) {
    // A tall image whose rows outnumber the window (16 rows per worker)
    // many times over.
    const Bytes tall = photo_rgb(72, 8000, 3);
    ImageInfo info = image_info(tall.data(), 72, 8000, EKO_FORMAT_RGB888);
    for (const uint32_t kind : kKinds) EXPECT_EQ(parallel(info, kind, 3), encode_to_memory(info, 75));

    // EXIF with a thumbnail, which a file or stream target gets in one piece.
    Bytes thumb = encode_to_memory(image_info(photo_rgb(64, 48, 9).data(), 64, 48, EKO_FORMAT_RGB888), 80);
    ExifInfo exif{};
    exif.make = "Parallel", exif.model = "P-2", exif.has_thumbnail = 1, exif.thumb_width = 64;
    exif.thumb_height = 48, exif.thumb_compression = 6, exif.thumb_data = thumb.data();
    exif.thumb_length = uint32_t(thumb.size());
    const Bytes rgb = photo_rgb(100, 90, 4);
    info = image_info(rgb.data(), 100, 90, EKO_FORMAT_RGB888);
    info.exif_info = &exif;
    EXPECT_EQ(parallel(info, EKO_OUTPUT_MEMORY, 4), encode_to_memory(info, 75));

    // Settings: own tables, and no DRI (rows then depend on each other and
    // are coded one after another, whatever the thread count).
    info.exif_info = nullptr;
    for (const uint32_t dri : {1u, 0u}) {
        const EncoderSettings s = settings(0, dri, 2, 2, 60);
        const Bytes reference = encode(info, {.settings = &s});
        ASSERT_FALSE(reference.empty());
        for (const uint32_t kind : kKinds) EXPECT_EQ(parallel(info, kind, 4, 60, &s), reference) << dri;
    }
}

TEST(Parallel, MisuseIsRefusedAndFailuresLeakNothing) {
    FaultScope scope;
    const int64_t live = live_blocks();
    const Bytes rgb = photo_rgb(64, 64, 5);
    const ImageInfo info = image_info(rgb.data(), 64, 64, EKO_FORMAT_RGB888);
    const EncodeOptions options{75, nullptr, 0};
    OutputRequest memory{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
    const OutputRequest stream{EKO_OUTPUT_STREAM, nullptr, nullptr, 0};
    EXPECT_EQ(eko_enc_jpeg_parallel_create(&info, &memory, &options, nullptr, nullptr, nullptr, 0), nullptr);
    EXPECT_EQ(eko_enc_jpeg_parallel_create(&info, &memory, &options, nullptr, nullptr, nullptr, 65), nullptr);
    EXPECT_EQ(eko_enc_jpeg_parallel_create(&info, &stream, &options, nullptr, nullptr, nullptr, 2), nullptr);
    EXPECT_EQ(eko_GetLastError(), uint32_t(EKO_ERR_ARGUMENT));

    uint8_t* block = nullptr;
    uint32_t length = 1;
    // A row coded twice fails the encode; later calls and finish say so.
    EkoParallelEncode* e = eko_enc_jpeg_parallel_create(&info, &memory, &options, nullptr, nullptr, nullptr, 2);
    ASSERT_NE(e, nullptr);
    EXPECT_EQ(eko_enc_jpeg_parallel_row_count(e), 4u);
    EXPECT_EQ(eko_enc_jpeg_parallel_rows(e, 2, 0, 1), 0u);  // no such worker
    EXPECT_EQ(eko_enc_jpeg_parallel_rows(e, 0, 3, 2), 0u);  // past the last row
    EXPECT_EQ(eko_enc_jpeg_parallel_rows(e, 0, 0, 2), 1u);
    EXPECT_EQ(eko_enc_jpeg_parallel_rows(e, 1, 1, 1), 0u);
    EXPECT_EQ(eko_GetLastError(), uint32_t(EKO_ERR_STATE));
    EXPECT_EQ(eko_enc_jpeg_parallel_rows(e, 0, 2, 2), 0u);
    EXPECT_EQ(eko_enc_jpeg_parallel_finish(e, &block, &length), 0u);
    EXPECT_TRUE(block == nullptr && length == 0);
    // Finishing with rows missing fails too.
    e = eko_enc_jpeg_parallel_create(&info, &memory, &options, nullptr, nullptr, nullptr, 1);
    ASSERT_NE(e, nullptr);
    EXPECT_EQ(eko_enc_jpeg_parallel_rows(e, 0, 0, 3), 1u);
    EXPECT_EQ(eko_enc_jpeg_parallel_finish(e, &block, &length), 0u);
    EXPECT_EQ(live_blocks(), live);

    // Every allocation in turn fails, with four threads racing: each run
    // either fails or gives the stream, and leaks nothing. Noise makes the
    // row buffers and the memory block grow while rows are coded.
    Bytes noise(160 * 96 * 3);
    std::mt19937 random(3);
    for (auto& b : noise) b = uint8_t(random());
    const ImageInfo noisy = image_info(noise.data(), 160, 96, EKO_FORMAT_RGB888);
    const Bytes reference = encode_to_memory(noisy, 95);
    reset_counters();
    ASSERT_EQ(parallel(noisy, EKO_OUTPUT_MEMORY, 4, 95), reference);
    const int64_t allocations = allocation_count();
    for (const uint32_t kind : kKinds) {
        for (int64_t n = 0; n <= allocations; ++n) {
            reset_counters();
            fail_allocation(n);
            const Bytes out = parallel(noisy, kind, 4, 95);
            fail_allocation(-1);
            EXPECT_TRUE(out.empty() || out == reference) << kind << " " << n;
            EXPECT_EQ(live_blocks(), live) << kind << " " << n;
        }
    }
    // A file that refuses bytes part-way.
    fail_writes_after(5000);
    EXPECT_TRUE(parallel(noisy, EKO_OUTPUT_FILE, 3, 95).empty());
    fail_writes_after(-1);
    EXPECT_EQ(live_blocks(), live);
}

TEST(Parallel, MemoryBlockGrowsAheadOfTheRows) {
    // Growing half again at a time copies a long stream over and over on the
    // worker handing rows on; growing ahead of the rows still to come takes
    // a few growths (the header's among them). Flat rows before noisy ones
    // make the first estimates wrong.
    FaultScope scope;
    for (const int flat : {0, 500, 1500}) {
        Bytes rgb = photo_rgb(96, 2400, 7);
        std::mt19937 random(flat);
        for (size_t i = size_t(flat) * 96 * 3; i < rgb.size(); ++i) rgb[i] = uint8_t(rgb[i] ^ (random() & 0x3F));
        const ImageInfo info = image_info(rgb.data(), 96, 2400, EKO_FORMAT_RGB888);
        const Bytes reference = encode_to_memory(info, 85);
        reset_counters();
        ASSERT_EQ(parallel(info, EKO_OUTPUT_MEMORY, 2, 85), reference);
        const int64_t growing = allocation_count();
        reset_counters();
        const uint32_t roomy = uint32_t(reference.size() + 4096);
        uint8_t* block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(roomy));
        ASSERT_EQ(parallel(info, EKO_OUTPUT_MEMORY, 2, 85, nullptr, 1, block, roomy), reference);
        const int64_t growths = growing - (allocation_count() - 1);
        EXPECT_LE(growths, 5) << flat;  // half again at a time: 7 to 9
    }
}

TEST(Parallel, CppLayerWithThreadsOrAnExecutor) {
    const Bytes rgb = photo_rgb(90, 70, 6);
    const tekoj::ImageView view(rgb.data(), 90, 70, tekoj::PixelFormat::rgb888);
    tekoj::Encoder encoder;
    encoder.quality(80);
    const Bytes reference = encoder.encode(view);
    EXPECT_EQ(reference, encode_to_memory(image_info(rgb.data(), 90, 70, EKO_FORMAT_RGB888), 80));
    EXPECT_EQ(encoder.threads(3).encode(view), reference);
    EXPECT_EQ(encoder.threads(0).encode(view), reference);
    std::vector<std::thread> pool;
    encoder.threads(4, [&](std::function<void()> job) { pool.emplace_back(std::move(job)); });
    EXPECT_EQ(encoder.encode(view), reference);
    for (auto& t : pool) t.join();
    encoder.threads(2).encode_to_file(view, kPath);
    EXPECT_EQ(read_file(kPath), reference);
    // A sink that stops the stream fails the parallel encode too.
    EXPECT_EQ(encoder.try_encode_to(view, [](const uint8_t*, size_t) { return false; }), uint32_t(EKO_ERR_WRITE));
}
