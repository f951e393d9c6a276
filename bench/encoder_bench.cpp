// Encoder speed against libjpeg-turbo's TurboJPEG API at the same settings:
// 4:2:0 (from RGB888, RGBA8888, BGRA8888 and planar YUV), grey; qualities 75 and 90; fast
// integer DCT. Prints megapixels per second of both and their ratio, then the
// peak resident memory that an encode to a file adds.
//
//   tekoj_bench [--threads N] [image.jpg|image.ppm] [repetitions]
//     with N > 1 adds the row-parallel encode: MP/s, speedup over our
//     single-threaded and libjpeg-turbo's encode, and CPU time over ours
//     (what the threads cost in work, whatever the machine's load)
//   tekoj_bench --rss [--threads N] [--tall] [image]   memory of an encode to a file
//   tekoj_bench --rows [image]                per-row times, simulated scaling
//
// Set JSIMD_FORCENONE=1 to compare against libjpeg-turbo without its SIMD.
#include <TekoJEncoderInternal.h>
#include <turbojpeg.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>
#include <ctime>
#include <functional>
#include <random>
#include <thread>
#include <string>
#include <vector>

namespace {

using Clock = std::chrono::steady_clock;

struct Image {
    int width = 0, height = 0;
    std::vector<uint8_t> rgb, yuv, grey, rgba, bgra;
};

bool load(const std::string& path, Image& img) {
    FILE* f = std::fopen(path.c_str(), "rb");
    if (f == nullptr) return false;
    std::vector<uint8_t> jpeg;
    uint8_t chunk[65536];
    size_t n;
    while ((n = std::fread(chunk, 1, sizeof chunk, f)) > 0) jpeg.insert(jpeg.end(), chunk, chunk + n);
    std::fclose(f);
    tjhandle h = tjInitDecompress();
    int subsamp, cs;
    if (tjDecompressHeader3(h, jpeg.data(), jpeg.size(), &img.width, &img.height, &subsamp, &cs) != 0) return false;
    img.rgb.resize(static_cast<size_t>(img.width) * img.height * 3);
    const int rc = tjDecompress2(h, jpeg.data(), jpeg.size(), img.rgb.data(), img.width, 0, img.height, TJPF_RGB, 0);
    tjDestroy(h);
    return rc == 0;
}

// Planar 4:2:0 and grey versions of the RGB image (BT.601, full range).
void derive(Image& img) {
    const int w = img.width, hgt = img.height, cw = (w + 1) / 2, ch = (hgt + 1) / 2;
    img.grey.resize(static_cast<size_t>(w) * hgt);
    img.rgba.resize(static_cast<size_t>(w) * hgt * 4);
    img.bgra.resize(img.rgba.size());
    for (size_t i = 0; i < static_cast<size_t>(w) * hgt; ++i) {
        const uint8_t* p = &img.rgb[3 * i];
        const uint8_t rgba[4] = {p[0], p[1], p[2], 255}, bgra[4] = {p[2], p[1], p[0], 255};
        std::memcpy(&img.rgba[4 * i], rgba, 4);
        std::memcpy(&img.bgra[4 * i], bgra, 4);
    }
    img.yuv.resize(static_cast<size_t>(w) * hgt + 2 * static_cast<size_t>(cw) * ch);
    uint8_t* u = img.yuv.data() + static_cast<size_t>(w) * hgt;
    uint8_t* v = u + static_cast<size_t>(cw) * ch;
    for (int y = 0; y < hgt; ++y)
        for (int x = 0; x < w; ++x) {
            const uint8_t* p = &img.rgb[(static_cast<size_t>(y) * w + x) * 3];
            const int yy = (77 * p[0] + 150 * p[1] + 29 * p[2]) >> 8;
            img.grey[static_cast<size_t>(y) * w + x] = static_cast<uint8_t>(yy);
            img.yuv[static_cast<size_t>(y) * w + x] = static_cast<uint8_t>(yy);
            if ((x & 1) == 0 && (y & 1) == 0) {
                u[static_cast<size_t>(y / 2) * cw + x / 2] = static_cast<uint8_t>(128 + ((-43 * p[0] - 85 * p[1] + 128 * p[2]) >> 8));
                v[static_cast<size_t>(y / 2) * cw + x / 2] = static_cast<uint8_t>(128 + ((128 * p[0] - 107 * p[1] - 21 * p[2]) >> 8));
            }
        }
}

// CPU time of the whole process (every thread), in seconds.
double process_cpu() {
    timespec ts{};
    clock_gettime(CLOCK_PROCESS_CPUTIME_ID, &ts);
    return static_cast<double>(ts.tv_sec) + static_cast<double>(ts.tv_nsec) * 1e-9;
}

// The best of the runs of one encoder: least wall time and least CPU time
// (summed over threads, which other processes inflate far less than wall
// time), in seconds; `bytes` is the stream size.
struct Best {
    double wall = 1e30, cpu = 1e30;
    size_t bytes = 0;
    void run(const std::function<size_t()>& encode) {
        const auto t0 = Clock::now();
        const double c0 = process_cpu();
        bytes = encode();
        cpu = std::min(cpu, process_cpu() - c0);
        wall = std::min(wall, std::chrono::duration<double>(Clock::now() - t0).count());
    }
};

// The memory block both of our encodes start from: room for the stream, as
// a caller that knows its frames gives it.
uint32_t block_size(const Image& img) { return static_cast<uint32_t>(img.rgb.size() / 4 + 65536); }

size_t ours(const Image& img, uint32_t format, const void* data, uint32_t quality) {
    ImageInfo info{};
    info.width = img.width;
    info.height = img.height;
    info.data = data;
    info.format = format;
    int32_t length = static_cast<int32_t>(block_size(img));
    uint8_t* block = static_cast<uint8_t*>(DORVATEKO_OsMalloc(static_cast<uint32_t>(length)));
    if (eko_enc_jpeg_to_buffer(&info, &block, &length, quality) != 1) {
        std::fprintf(stderr, "encode failed (error %u)\n", eko_GetLastError());
        std::exit(1);
    }
    DORVATEKO_OsFree(block);
    return static_cast<size_t>(length);
}

// The same encode through the row-parallel calls, `threads` workers taking
// rows from a shared counter; to a memory block as ours() gets, or to `file`
// when given.
size_t parallel(const Image& img, uint32_t format, const void* data, uint32_t quality, uint32_t threads,
                const char* file = nullptr) {
    ImageInfo info{};
    info.width = img.width;
    info.height = img.height;
    info.data = data;
    info.format = format;
    OutputRequest request{EKO_OUTPUT_FILE, nullptr, nullptr, 0};
    if (file != nullptr)
        request.file = DORVATEKO_OsFopen(file, "wb");
    else
        request = {EKO_OUTPUT_MEMORY, nullptr, static_cast<uint8_t*>(DORVATEKO_OsMalloc(block_size(img))), block_size(img)};
    const EncodeOptions options{quality, nullptr, 0};
    EkoParallelEncode* e = eko_enc_jpeg_parallel_create(&info, &request, &options, nullptr, nullptr, nullptr, threads);
    const uint32_t rows = eko_enc_jpeg_parallel_row_count(e);
    std::atomic<uint32_t> next{0};
    auto work = [&](uint32_t worker) {
        for (uint32_t k; (k = next.fetch_add(1)) < rows;) eko_enc_jpeg_parallel_rows(e, worker, k, 1);
    };
    std::vector<std::thread> pool;
    for (uint32_t t = 1; t < threads; ++t) pool.emplace_back(work, t);
    work(0);
    for (auto& t : pool) t.join();
    uint8_t* block = nullptr;
    uint32_t length = 0;
    if (eko_enc_jpeg_parallel_finish(e, &block, &length) != 1) {
        std::fprintf(stderr, "parallel encode failed (error %u)\n", eko_GetLastError());
        std::exit(1);
    }
    if (request.file != nullptr) DORVATEKO_OsFclose(request.file);
    DORVATEKO_OsFree(block);
    return length;
}

size_t turbo(tjhandle h, const Image& img, int mode, int quality) {
    unsigned char* out = nullptr;
    unsigned long size = 0;
    int rc;
    if (mode == 0 || mode >= 3) {
        const uint8_t* px = mode == 0 ? img.rgb.data() : mode == 3 ? img.rgba.data() : img.bgra.data();
        rc = tjCompress2(h, px, img.width, 0, img.height, mode == 0 ? TJPF_RGB : mode == 3 ? TJPF_RGBA : TJPF_BGRA, &out,
                         &size, TJSAMP_420, quality, TJFLAG_FASTDCT);
    } else if (mode == 1) {
        rc = tjCompressFromYUV(h, img.yuv.data(), img.width, 1, img.height, TJSAMP_420, &out, &size, quality,
                               TJFLAG_FASTDCT);
    } else {
        rc = tjCompress2(h, img.grey.data(), img.width, 0, img.height, TJPF_GRAY, &out, &size, TJSAMP_GRAY, quality,
                         TJFLAG_FASTDCT);
    }
    if (rc != 0) {
        std::fprintf(stderr, "libjpeg-turbo: %s\n", tjGetErrorStr2(h));
        std::exit(1);
    }
    tjFree(out);
    return size;
}

// Reads a "Vm..." line of /proc/self/status, in KiB.
long status_kib(const char* key) {
    FILE* f = std::fopen("/proc/self/status", "r");
    if (f == nullptr) return -1;
    char line[256];
    long value = -1;
    while (std::fgets(line, sizeof line, f) != nullptr)
        if (std::strncmp(line, key, std::strlen(key)) == 0) value = std::atol(line + std::strlen(key) + 1);
    std::fclose(f);
    return value;
}

// Starts a fresh peak of the resident set (VmHWM).
void reset_peak() {
    if (FILE* f = std::fopen("/proc/self/clear_refs", "w")) {
        std::fputs("5", f);
        std::fclose(f);
    }
}

}  // namespace

int rss_only(const Image& img, uint32_t threads, int stack);
int row_times(const Image& img);

int main(int argc, char** argv) {
    bool rss = false, rows = false;
    uint32_t threads = 1;
    int stack = 1;
    for (;;) {
        if (argc > 1 && std::strcmp(argv[1], "--rss") == 0) {
            rss = true;
        } else if (argc > 1 && std::strcmp(argv[1], "--rows") == 0) {
            rows = true;
        } else if (argc > 1 && std::strcmp(argv[1], "--tall") == 0) {
            stack = 2;
        } else if (argc > 2 && std::strcmp(argv[1], "--threads") == 0) {
            threads = static_cast<uint32_t>(std::max(1, std::atoi(argv[2])));
            --argc;
            ++argv;
        } else {
            break;
        }
        --argc;
        ++argv;
    }
    const std::string path = argc > 1 ? argv[1] : std::string(TEKOJ_IMAGES_DIR) + "/elephants-3840x2160.jpg";
    const int reps = argc > 2 ? std::atoi(argv[2]) : 5;
    Image img;
    if (!load(path, img)) {
        std::printf("benchmark image %s not found: skipped\n", path.c_str());
        return 0;
    }
    if (rss) return rss_only(img, threads, stack);
    if (rows) return row_times(img);
    derive(img);
    const double mp = img.width * static_cast<double>(img.height) / 1e6;
    const char* simd = std::getenv("JSIMD_FORCENONE");
    double load[3] = {0, 0, 0};
    getloadavg(load, 3);
    std::printf("%s: %dx%d (%.2f MP), best of %d, libjpeg-turbo SIMD %s, load average %.2f\n", path.c_str(),
                img.width, img.height, mp, reps, simd != nullptr && std::strcmp(simd, "1") == 0 ? "off" : "on", load[0]);
    std::printf("%-14s %4s %12s %12s %9s %10s %10s", "input", "q", "TekoJ MP/s", "turbo MP/s", "ratio", "TekoJ KiB",
                "turbo KiB");
    if (threads > 1) std::printf("  x%-2u MP/s  /TekoJ  /turbo     cpu", threads);
    std::printf("\n");
    tjhandle h = tjInitCompress();
    struct Case {
        const char* name;
        uint32_t format;
        const void* data;
        int mode;
    };
    const Case cases[] = {{"RGB888 4:2:0", EKO_FORMAT_RGB888, img.rgb.data(), 0},
                          {"RGBA8888 4:2:0", EKO_FORMAT_RGBA8888, img.rgba.data(), 3},
                          {"BGRA8888 4:2:0", EKO_FORMAT_BGRA8888, img.bgra.data(), 4},
                          {"YUV 4:2:0", EKO_FORMAT_YUV420, img.yuv.data(), 1},
                          {"grey", EKO_FORMAT_GREY, img.grey.data(), 2}};
    for (const Case& c : cases) {
        for (int q : {75, 90}) {
            // The encoders take turns, so that a change of load on the
            // machine falls on all of them.
            Best o, t, p;
            for (int i = 0; i < reps; ++i) {
                o.run([&] { return ours(img, c.format, c.data, static_cast<uint32_t>(q)); });
                t.run([&] { return turbo(h, img, c.mode, q); });
                if (threads > 1) p.run([&] { return parallel(img, c.format, c.data, static_cast<uint32_t>(q), threads); });
            }
            std::printf("%-14s %4d %12.1f %12.1f %9.2f %10zu %10zu", c.name, q, mp / o.wall, mp / t.wall,
                        t.wall / o.wall, o.bytes / 1024, t.bytes / 1024);
            if (threads > 1) {
                if (p.bytes != o.bytes) std::printf("  (size differs!)");
                std::printf("  %9.1f %7.2f %7.2f %7.2f", mp / p.wall, o.wall / p.wall, t.wall / p.wall, p.cpu / o.cpu);
            }
            std::printf("\n");
        }
    }
    tjDestroy(h);
    std::printf("(run with --rss for the memory of an encode to a file)\n");
    return 0;
}

// When a worker that holds its core `on` seconds out of every `on + off`
// from `phase` on, and starts `work` seconds of work at `t`, is done.
double sliced_finish(double t, double work, double on, double off, double phase) {
    if (off <= 0) return t + work;
    const double period = on + off;
    // Core time held since `phase`, at t and at the end.
    const double k = std::floor((t - phase) / period);
    const double held = k * on + std::min(t - phase - k * period, on) + work;
    const double periods = std::floor(held / on);
    return phase + periods * period + (held - periods * on);
}

int rss_only(const Image& img, uint32_t threads, int stack) {
    // Memory for file output is bounded by the width: what an encode adds to
    // the peak resident set, beyond the caller's own pixels (`stack` copies
    // of the image one above the other show that height adds nothing).
    const char* out = "/tmp/tekoj_bench_out.jpg";
    {
        Image tall = img;
        tall.height = img.height * stack;
        for (int k = 1; k < stack; ++k) tall.rgb.insert(tall.rgb.end(), img.rgb.begin(), img.rgb.end());
        ImageInfo info{};
        info.width = tall.width;
        info.height = tall.height;
        info.data = tall.rgb.data();
        info.format = EKO_FORMAT_RGB888;
        const long before = status_kib("VmRSS:");
        reset_peak();
        if (threads > 1) {
            parallel(tall, EKO_FORMAT_RGB888, tall.rgb.data(), 75, threads, out);
        } else if (eko_enc_jpeg_to_file(&info, out, 75) != 1) {
            return 1;
        }
        std::remove(out);
        const long peak = status_kib("VmHWM:");
        std::printf("peak resident memory added by a %dx%d RGB encode to a file, %u thread(s): %ld KiB (resident "
                    "before %ld KiB)\n",
                    tall.width, tall.height, threads, peak - before, before);
    }
    return 0;
}

// Coding time of each MCU row (one worker, to memory), their spread, and the
// speedup that P workers taking rows in order can reach when a row may run
// at most a window of 2P or 16P rows ahead of the first row not yet handed
// on: with the cores to themselves, and sharing them with other processes.
int row_times(const Image& img) {
    ImageInfo info{};
    info.width = img.width;
    info.height = img.height;
    info.data = img.rgb.data();
    info.format = EKO_FORMAT_RGB888;
    std::vector<double> best;
    for (int rep = 0; rep < 5; ++rep) {
        const OutputRequest request{EKO_OUTPUT_MEMORY, nullptr, nullptr, 0};
        const EncodeOptions options{75, nullptr, 0};
        EkoParallelEncode* e = eko_enc_jpeg_parallel_create(&info, &request, &options, nullptr, nullptr, nullptr, 1);
        const uint32_t rows = eko_enc_jpeg_parallel_row_count(e);
        best.resize(rows, 1e30);
        for (uint32_t k = 0; k < rows; ++k) {
            const auto t0 = Clock::now();
            eko_enc_jpeg_parallel_rows(e, 0, k, 1);
            best[k] = std::min(best[k], std::chrono::duration<double>(Clock::now() - t0).count());
        }
        uint8_t* block = nullptr;
        uint32_t length = 0;
        eko_enc_jpeg_parallel_finish(e, &block, &length);
        DORVATEKO_OsFree(block);
    }
    std::vector<double> sorted = best;
    std::sort(sorted.begin(), sorted.end());
    double sum = 0;
    for (double t : best) sum += t;
    const size_t n = sorted.size();
    std::printf("%zu rows (RGB888 q75), ms per row: min %.3f  median %.3f  p90 %.3f  max %.3f  mean %.3f\n", n,
                sorted[0] * 1e3, sorted[n / 2] * 1e3, sorted[n * 9 / 10] * 1e3, sorted[n - 1] * 1e3, sum / n * 1e3);
    // Each worker takes the next row when free, if that row lies within the
    // window; rows are handed on in order as soon as they are done. Workers
    // hold their core `on` seconds out of every `on + off` (off 0: always),
    // from random phases, as when other processes share the cores; the
    // speedup is over one worker sliced the same way.
    auto simulate = [&](uint32_t p, uint32_t window, double on, double off) {
        std::mt19937 random(p * 131 + window);
        std::uniform_real_distribution<double> phase_of(0.0, on + off);
        double total = 0;
        const int trials = off > 0 ? 200 : 1;
        for (int trial = 0; trial < trials; ++trial) {
            std::vector<double> free_at(p, 0.0), phase(p), done(n, 0.0);
            for (double& f : phase) f = phase_of(random);
            double handed_at = 0;  // time at which the rows before `handed` were all done
            size_t handed = 0;
            for (size_t k = 0; k < n; ++k) {
                const size_t w = std::min_element(free_at.begin(), free_at.end()) - free_at.begin();
                double start = free_at[w];
                if (k >= window) {
                    while (handed <= k - window) handed_at = std::max(handed_at, done[handed++]);
                    start = std::max(start, handed_at);
                }
                done[k] = sliced_finish(start, best[k], on, off, phase[w]);
                free_at[w] = done[k];
            }
            total += sliced_finish(0, sum, on, off, phase[0]) / *std::max_element(done.begin(), done.end());
        }
        return total / trials;
    };
    for (uint32_t p : {2u, 4u, 8u})
        for (uint32_t depth : {2u, 16u})
            std::printf("  %u workers, window %2u: speedup %.2f (ideal %.2f); sharing cores, 3 ms of 6: %.2f\n", p,
                        p * depth, simulate(p, p * depth, 1, 0), std::min<double>(p, sum / sorted[n - 1]),
                        simulate(p, p * depth, 3e-3, 3e-3));
    return 0;
}
