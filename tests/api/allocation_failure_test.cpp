// Failing allocations and short file writes: every entry point returns 0,
// reports the reason, leaks no block, closes its file and leaves the caller's
// variables as its failure rows say; the first call that is let through
// gives the normal stream.
#include <TekoJEncoderInternal.h>

#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <string>

using namespace tekoj_test;

namespace {

size_t open_descriptors() {
    using std::filesystem::directory_iterator;
    return size_t(std::distance(directory_iterator("/proc/self/fd"), directory_iterator{}));
}

// Checks when it goes that no block leaked and no file stayed open meanwhile.
struct NoLeak {
    FaultScope scope;
    int64_t live = live_blocks();
    size_t fds = open_descriptors();
    ~NoLeak() {
        EXPECT_EQ(live_blocks(), live);
        EXPECT_EQ(open_descriptors(), fds);
    }
};

uint32_t append(void* arg, const uint8_t* data, uint32_t count) {
    static_cast<Bytes*>(arg)->insert(static_cast<Bytes*>(arg)->end(), data, data + count);
    return count;
}

Bytes noise(size_t n, uint32_t seed) {
    Bytes b(n);
    for (auto& v : b) v = static_cast<uint8_t>((seed = seed * 1664525u + 1013904223u) >> 24);
    return b;
}

const std::string kPath = temp_path("alloc_failure.jpg");

// Kinds: 0 buffer with a null block, 1 buffer with a 100-byte block, 2
// buffer_ex, 3 buffer full buffer, 4 file by name, 5 file by handle, 6 stream.
// Encodes through one output kind with the n-th allocation of the entry point
// failing (its own set-up not counted) and frees what the caller owns. After
// a failure the memory kinds' variables hold null and 0, except when the very
// first step, growing a small block to 2048, fails: the caller's block is then
// untouched and still the caller's.
uint32_t run_kind(int kind, const ImageInfo& info, Bytes& out, int64_t n) {
    const int32_t start = kind == 1 ? 100 : 0;
    uint8_t* const block = start ? static_cast<uint8_t*>(DORVATEKO_OsMalloc(start)) : nullptr;
    uint8_t* buffer = block;
    int32_t length = start;
    OutputRequest request{uint32_t(kind == 5 ? EKO_OUTPUT_FILE : EKO_OUTPUT_MEMORY),
                          kind == 5 ? DORVATEKO_OsFopen(kPath.c_str(), "wb") : nullptr, nullptr, 0};
    const EncodeOptions options{90, nullptr, 0};
    reset_counters();
    fail_allocation(n);
    uint32_t r = 0;
    switch (kind) {
        case 0: case 1: r = eko_enc_jpeg_to_buffer(&info, &buffer, &length, 90); break;
        case 2: r = eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options); break;
        case 3: r = eko_enc_jpeg_to_buffer_full_buffer(&info, &request, 90); break;
        case 4: r = eko_enc_jpeg_to_file(&info, kPath.c_str(), 90); break;
        case 5: r = eko_enc_jpeg_to_file_full_buffer(&info, &request, 90); break;
        default: r = eko_enc_jpeg_to_stream(&info, append, 90, &out);
    }
    fail_allocation(-1);
    if (kind == 3) buffer = request.buffer, length = static_cast<int32_t>(request.capacity);
    if (kind == 4 || kind == 5) out = read_file(kPath);
    if (kind <= 3 && r == 1) out.assign(buffer, buffer + length);
    if (kind <= 3 && r == 0) { EXPECT_TRUE((block && buffer == block && length == start) || (!buffer && !length)); }
    DORVATEKO_OsFree(buffer);
    return r;
}

}  // namespace

TEST(AllocationFailure, EveryFailingAllocationFailsTheCallWithoutALeak) {
    for (uint32_t format : {EKO_FORMAT_RGB888, EKO_FORMAT_GREY}) {
        const Bytes px = noise(image_size(format, 96, 90), 77);
        const ImageInfo info = image_info(px.data(), 96, 90, format);
        const Bytes expected = encode_to_memory(info, 90);
        ASSERT_GT(expected.size(), 6144u);  // memory targets must grow while coding
        for (int kind = 0; kind < 7; ++kind) {
            SCOPED_TRACE("kind " + std::to_string(kind) + ", format " + std::to_string(format));
            uint32_t r = 0;
            int64_t n = 0;
            for (; r == 0 && n < 1000; ++n) {
                SCOPED_TRACE("allocation " + std::to_string(n) + " fails");
                NoLeak no_leak;
                eko_SetError(EKO_OK);
                Bytes out;
                r = run_kind(kind, info, out, n);
                if (r == 0) { EXPECT_EQ(eko_GetLastError(), uint32_t(EKO_ERR_ALLOC)); }
                else { EXPECT_EQ(out, expected); }
            }
            EXPECT_EQ(r, 1u);
            EXPECT_GT(n, 10);  // creation alone allocates more than ten blocks
        }
    }
    std::remove(kPath.c_str());
}

TEST(ShortWrite, AFileThatRefusesBytesFailsTheCall) {
    const Bytes px = noise(image_size(EKO_FORMAT_YUV420, 128, 96), 3);
    const ImageInfo info = image_info(px.data(), 128, 96, EKO_FORMAT_YUV420);
    const Bytes expected = encode_to_memory(info, 95);
    const int64_t n = static_cast<int64_t>(expected.size());
    ASSERT_GT(n, 3 * 4096);
    for (int64_t budget : {int64_t{0}, int64_t{1}, int64_t{628}, int64_t{4095}, int64_t{4096}, int64_t{4097}, n - 1, n}) {
        for (int by_handle = 0; by_handle < 2; ++by_handle) {
            SCOPED_TRACE("budget " + std::to_string(budget) + (by_handle ? " by handle" : " by name"));
            NoLeak no_leak;
            fail_writes_after(budget);
            eko_SetError(EKO_OK);
            OutputRequest request{EKO_OUTPUT_FILE, by_handle ? DORVATEKO_OsFopen(kPath.c_str(), "wb") : nullptr, nullptr, 0};
            const uint32_t r = by_handle ? eko_enc_jpeg_to_file_full_buffer(&info, &request, 95)
                                         : eko_enc_jpeg_to_file(&info, kPath.c_str(), 95);
            EXPECT_EQ(r, budget >= n ? 1u : 0u);
            EXPECT_EQ(eko_GetLastError(), budget >= n ? 0u : uint32_t(EKO_ERR_WRITE));
            if (budget >= n) { EXPECT_EQ(read_file(kPath), expected); }
        }
    }
    std::remove(kPath.c_str());
}
