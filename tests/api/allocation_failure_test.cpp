// Failing allocations and short file writes: every entry point returns 0,
// reports the reason, leaks no block, closes its file and leaves the caller's
// variables as its failure rows say; the first call that is let through
// gives the normal stream.
#include <TekoJEncoder.h>

#include "support/fault_os_layer.h"
#include "support/test_support.h"

#include <gtest/gtest.h>

#include <filesystem>
#include <functional>
#include <string>

using namespace tekoj_test;

namespace {

size_t open_descriptors() {
    size_t n = 0;
    for ([[maybe_unused]] const auto& e : std::filesystem::directory_iterator("/proc/self/fd")) ++n;
    return n;
}

uint32_t append(void* arg, const uint8_t* data, uint32_t count) {
    static_cast<Bytes*>(arg)->insert(static_cast<Bytes*>(arg)->end(), data, data + count);
    return count;
}

Bytes noise(size_t n, uint32_t seed) {
    Bytes b(n);
    for (auto& v : b) v = static_cast<uint8_t>((seed = seed * 1664525u + 1013904223u) >> 24);
    return b;
}

// One output kind: runs the encode, checks the caller's variables after a
// failure and frees what the caller owns; returns the result and the stream.
struct Kind {
    const char* name;
    std::function<uint32_t(const ImageInfo&, Bytes&)> run;
};

const std::string kPath = temp_path("alloc_failure.jpg");

// The allocation to fail, armed by each kind right before its entry point so
// that the kind's own set-up allocations are not counted.
int64_t g_fail_at = -1;
void arm() {
    reset_counters();
    fail_allocation(g_fail_at);
}

// The memory kinds: a block of `start` bytes (none for 0) in the caller's
// variables. After a failure the variables hold null and 0, except when the
// very first step, growing a small block to 2048, fails: the caller's block
// is then untouched and still the caller's.
uint32_t memory(const ImageInfo& info, Bytes& out, int32_t start, int member) {
    uint8_t* const block = start ? static_cast<uint8_t*>(DORVATEKO_OsMalloc(start)) : nullptr;
    uint8_t* buffer = block;
    int32_t length = start;
    OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, block, static_cast<uint32_t>(start)};
    const EncodeOptions options{90, nullptr, 0};
    arm();
    const uint32_t r = member == 0   ? eko_enc_jpeg_to_buffer(&info, &buffer, &length, 90)
                       : member == 1 ? eko_enc_jpeg_to_buffer_ex(&info, &buffer, &length, &options)
                                     : eko_enc_jpeg_to_buffer_full_buffer(&info, &request, 90);
    if (member == 2) {
        buffer = request.buffer;
        length = static_cast<int32_t>(request.capacity);
    }
    if (r == 1) out.assign(buffer, buffer + length);
    if (r == 0 && !(block != nullptr && buffer == block && length == start)) {
        EXPECT_EQ(buffer, nullptr);
        EXPECT_EQ(length, 0);
    }
    DORVATEKO_OsFree(buffer);
    return r;
}

std::vector<Kind> kinds() {
    return {
        {"buffer, null block", [](const ImageInfo& i, Bytes& out) { return memory(i, out, 0, 0); }},
        {"buffer, 100-byte block", [](const ImageInfo& i, Bytes& out) { return memory(i, out, 100, 0); }},
        {"buffer_ex, null block", [](const ImageInfo& i, Bytes& out) { return memory(i, out, 0, 1); }},
        {"buffer full buffer, null block", [](const ImageInfo& i, Bytes& out) { return memory(i, out, 0, 2); }},
        {"file by name", [](const ImageInfo& info, Bytes& out) {
             arm();
             const uint32_t r = eko_enc_jpeg_to_file(&info, kPath.c_str(), 90);
             out = read_file(kPath);
             return r;
         }},
        {"file by handle", [](const ImageInfo& info, Bytes& out) {
             OutputRequest request{EKO_OUTPUT_FILE, DORVATEKO_OsFopen(kPath.c_str(), "wb"), nullptr, 0};
             arm();
             const uint32_t r = eko_enc_jpeg_to_file_full_buffer(&info, &request, 90);
             out = read_file(kPath);
             return r;
         }},
        {"stream", [](const ImageInfo& info, Bytes& out) {
             arm();
             return eko_enc_jpeg_to_stream(&info, append, 90, &out);
         }},
    };
}

}  // namespace

TEST(AllocationFailure, EveryFailingAllocationFailsTheCallWithoutALeak) {
    struct Image {
        uint32_t format;
        int w, h;
    };
    // Noise large enough that memory targets must grow while coding.
    const Image images[] = {{EKO_FORMAT_RGB888, 96, 80}, {EKO_FORMAT_GREY, 100, 90}};
    for (const Image& im : images) {
        const Bytes px = noise(image_size(im.format, im.w, im.h), 77);
        const ImageInfo info = image_info(px.data(), im.w, im.h, im.format);
        const Bytes expected = encode_to_memory(info, 90);
        ASSERT_GT(expected.size(), 6144u);
        for (const Kind& kind : kinds()) {
            SCOPED_TRACE(std::string(kind.name) + ", format " + std::to_string(im.format));
            bool succeeded = false;
            int failures = 0;
            for (int64_t n = 0; n < 1000 && !succeeded; ++n) {
                SCOPED_TRACE("allocation " + std::to_string(n) + " fails");
                FaultScope scope;
                const int64_t live = live_blocks();
                const size_t fds = open_descriptors();
                eko_SetError(EKO_OK);
                g_fail_at = n;
                Bytes out;
                const uint32_t r = kind.run(info, out);
                fail_allocation(-1);
                EXPECT_EQ(live_blocks(), live);
                EXPECT_EQ(open_descriptors(), fds);
                if (r == 1) {
                    succeeded = true;
                    EXPECT_EQ(out, expected);
                } else {
                    ++failures;
                    ASSERT_EQ(r, 0u);
                    EXPECT_EQ(eko_GetLastError(), static_cast<uint32_t>(EKO_ERR_ALLOC));
                }
            }
            EXPECT_TRUE(succeeded);
            EXPECT_GE(failures, 10);  // creation alone allocates more than ten blocks
        }
    }
    std::remove(kPath.c_str());
}

TEST(ShortWrite, AFileThatRefusesBytesFailsTheCall) {
    const Bytes px = noise(image_size(EKO_FORMAT_YUV420, 128, 96), 3);
    const ImageInfo info = image_info(px.data(), 128, 96, EKO_FORMAT_YUV420);
    const Bytes expected = encode_to_memory(info, 95);
    ASSERT_GT(expected.size(), 3 * 4096u);
    const int64_t n = static_cast<int64_t>(expected.size());
    for (int64_t budget : {int64_t{0}, int64_t{1}, int64_t{628}, int64_t{4095}, int64_t{4096}, int64_t{4097},
                           int64_t{9000}, n - 2, n - 1, n}) {
        for (int by_handle = 0; by_handle < 2; ++by_handle) {
            SCOPED_TRACE("budget " + std::to_string(budget) + (by_handle ? " by handle" : " by name"));
            FaultScope scope;
            const int64_t live = live_blocks();
            const size_t fds = open_descriptors();
            fail_writes_after(budget);
            eko_SetError(EKO_OK);
            uint32_t r;
            if (by_handle) {
                OutputRequest request{EKO_OUTPUT_FILE, DORVATEKO_OsFopen(kPath.c_str(), "wb"), nullptr, 0};
                r = eko_enc_jpeg_to_file_full_buffer(&info, &request, 95);
            } else {
                r = eko_enc_jpeg_to_file(&info, kPath.c_str(), 95);
            }
            EXPECT_EQ(r, budget >= n ? 1u : 0u);
            if (budget < n) {
                EXPECT_EQ(eko_GetLastError(), static_cast<uint32_t>(EKO_ERR_WRITE));
            }
            if (budget >= n) {
                EXPECT_EQ(read_file(kPath), expected);
            }
            EXPECT_EQ(live_blocks(), live);
            EXPECT_EQ(open_descriptors(), fds);
        }
    }
    std::remove(kPath.c_str());
}
