// The tekoj tool run as a user runs it: on small generated files of every
// input kind and on wrong ones. Each run checks the exit status, that
// messages name the file and stay off standard output, that a failed run
// leaves no output file, and that what it writes decodes with libjpeg-turbo
// to the right size, sampling and colours.
//
// Arguments: the command that runs the tool (an emulator may come first).
#include <gtest/gtest.h>
#include <png.h>
#include <turbojpeg.h>

#include <cmath>
#include <cstdlib>
#include <cstring>
#include <dirent.h>
#include <fcntl.h>
#include <fstream>
#include <signal.h>
#include <iterator>
#include <sys/resource.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

namespace {

std::vector<std::string> g_tool;  // the command that runs tekoj
std::string g_dir;                // scratch folder, the tool's working directory

using Bytes = std::vector<uint8_t>;

std::string read_text(const std::string& path) {
    std::ifstream f(path, std::ios::binary);
    return std::string(std::istreambuf_iterator<char>(f), std::istreambuf_iterator<char>());
}

void write_file(const std::string& name, const std::string& bytes) {
    std::ofstream(g_dir + "/" + name, std::ios::binary) << bytes;
}

struct Result {
    int status = -1;
    std::string out, err;
};

// Runs the tool in the scratch folder with `input` on standard input;
// `file_limit` > 0 caps the size of any file it writes (RLIMIT_FSIZE).
Result run(const std::vector<std::string>& args, const std::string& input = "", rlim_t file_limit = 0) {
    write_file(".stdin", input);
    const pid_t pid = fork();
    if (pid == 0) {
        if (chdir(g_dir.c_str()) != 0) _exit(127);
        const int in = open(".stdin", O_RDONLY), out = open(".stdout", O_WRONLY | O_CREAT | O_TRUNC, 0644),
                  err = open(".stderr", O_WRONLY | O_CREAT | O_TRUNC, 0644);
        dup2(in, 0), dup2(out, 1), dup2(err, 2);
        if (file_limit > 0) {
            signal(SIGXFSZ, SIG_IGN);  // a write beyond the limit then fails with EFBIG
            const rlimit limit{file_limit, file_limit};
            setrlimit(RLIMIT_FSIZE, &limit);
        }
        std::vector<std::string> all = g_tool;
        all.insert(all.end(), args.begin(), args.end());
        std::vector<char*> argv;
        for (std::string& a : all) argv.push_back(a.data());
        argv.push_back(nullptr);
        execvp(argv[0], argv.data());
        _exit(127);
    }
    Result r;
    int wstatus = 0;
    waitpid(pid, &wstatus, 0);
    r.status = WIFEXITED(wstatus) ? WEXITSTATUS(wstatus) : 128 + WTERMSIG(wstatus);
    r.out = read_text(g_dir + "/.stdout");
    r.err = read_text(g_dir + "/.stderr");
    return r;
}

// Files in the scratch folder's "out" subfolder, which each case empties first.
std::vector<std::string> outputs() {
    std::vector<std::string> names;
    if (DIR* d = opendir((g_dir + "/out").c_str())) {
        while (dirent* e = readdir(d))
            if (e->d_name[0] != '.') names.push_back(e->d_name);
        closedir(d);
    }
    return names;
}

void clear_outputs() {
    for (const std::string& n : outputs()) unlink((g_dir + "/out/" + n).c_str());
}

struct Decoded {
    int width = 0, height = 0, subsampling = -1;
    Bytes rgb;
};

Decoded decode(const std::string& jpeg) {
    Decoded d;
    tjhandle tj = tjInitDecompress();
    int colourspace = 0;
    auto* data = reinterpret_cast<const unsigned char*>(jpeg.data());
    if (tjDecompressHeader3(tj, data, jpeg.size(), &d.width, &d.height, &d.subsampling, &colourspace) == 0) {
        d.rgb.resize(static_cast<size_t>(d.width) * d.height * 3);
        if (tjDecompress2(tj, data, jpeg.size(), d.rgb.data(), d.width, 0, d.height, TJPF_RGB, 0) != 0) d.rgb.clear();
    }
    tjDestroy(tj);
    return d;
}

// ---------------------------------------------------------------------------
// Test images: W x H in four flat quadrants, so that a swapped plane, a wrong
// row stride or a lost band shows as a wrong colour in some quadrant.

constexpr int W = 46, H = 37;  // odd height: a partial last band
struct Rgb {
    int r, g, b;
};
const Rgb kQuadrants[4] = {{200, 60, 30}, {30, 160, 220}, {240, 230, 40}, {60, 90, 60}};
const Rgb kSecondFrame[4] = {{20, 20, 200}, {20, 200, 20}, {200, 20, 20}, {250, 250, 250}};

const Rgb& colour(const Rgb* q, int x, int y) { return q[(y >= H / 2) * 2 + (x >= W / 2)]; }
int luma(const Rgb& c) { return static_cast<int>(std::lround(0.299 * c.r + 0.587 * c.g + 0.114 * c.b)); }
int cb(const Rgb& c) { return static_cast<int>(std::lround(128 - 0.168736 * c.r - 0.331264 * c.g + 0.5 * c.b)); }
int cr(const Rgb& c) { return static_cast<int>(std::lround(128 + 0.5 * c.r - 0.418688 * c.g - 0.081312 * c.b)); }

std::string pnm(char type, int maxval, const std::string& comment) {
    const bool rgb = type == '3' || type == '6', ascii = type <= '3';
    std::string s = std::string("P") + type + "\n" + comment + std::to_string(W) + " " + std::to_string(H) + "\n" +
                    std::to_string(maxval) + "\n";
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) {
            const Rgb& c = colour(kQuadrants, x, y);
            const int grey = luma(c);
            for (int v : rgb ? std::vector<int>{c.r, c.g, c.b} : std::vector<int>{grey}) {
                const int scaled = v * maxval / 255;
                if (ascii) {
                    s += std::to_string(scaled) + (x % 8 == 7 ? "\n" : " ");
                } else if (maxval > 255) {
                    s += static_cast<char>(scaled >> 8), s += static_cast<char>(scaled & 255);
                } else {
                    s += static_cast<char>(scaled);
                }
            }
        }
    return s;
}

// Planar or packed YUV frames of the quadrant image.
std::string yuv(const std::string& layout, const Rgb* q = kQuadrants) {
    const int cw = (W + 1) / 2, ch = (H + 1) / 2;
    std::string y, u, v, s;
    for (int j = 0; j < H; ++j)
        for (int i = 0; i < W; ++i) y += static_cast<char>(luma(colour(q, i, j)));
    for (int j = 0; j < ch; ++j)
        for (int i = 0; i < cw; ++i) u += static_cast<char>(cb(colour(q, 2 * i, 2 * j))), v += static_cast<char>(cr(colour(q, 2 * i, 2 * j)));
    if (layout == "i420") return y + u + v;
    if (layout == "grey") return y;
    if (layout == "nv21" || layout == "nv12") {
        s = y;
        for (size_t i = 0; i < u.size(); ++i) s += layout == "nv21" ? std::string{v[i], u[i]} : std::string{u[i], v[i]};
        return s;
    }
    for (int j = 0; j < H; ++j)  // yuyv, uyvy
        for (int i = 0; i < W; i += 2) {
            const Rgb& c = colour(q, i, j);
            const char y0 = y[j * W + i], y1 = y[j * W + i + 1], cu = static_cast<char>(cb(c)), cv = static_cast<char>(cr(c));
            s += layout == "yuyv" ? std::string{y0, cu, y1, cv} : std::string{cu, y0, cv, y1};
        }
    return s;
}

std::string png(uint32_t format, const Rgb* q = kQuadrants) {
    png_image image{};
    image.version = PNG_IMAGE_VERSION;
    image.width = W;
    image.height = H;
    image.format = format;
    const int channels = PNG_IMAGE_SAMPLE_CHANNELS(format), size = PNG_IMAGE_SAMPLE_COMPONENT_SIZE(format);
    std::vector<uint16_t> wide(static_cast<size_t>(W) * H * channels);
    Bytes narrow(wide.size());
    for (int y = 0; y < H; ++y)
        for (int x = 0; x < W; ++x) {
            const Rgb& c = colour(q, x, y);
            // Alpha: the lower right quadrant fully transparent.
            const int values[4] = {c.r, c.g, c.b, (x >= W / 2 && y >= H / 2) ? 0 : 255};
            const int grey[2] = {luma(c), values[3]};
            for (int k = 0; k < channels; ++k) {
                const int v = channels <= 2 ? grey[k] : values[k];
                narrow[(static_cast<size_t>(y) * W + x) * channels + k] = static_cast<uint8_t>(v);
                wide[(static_cast<size_t>(y) * W + x) * channels + k] = static_cast<uint16_t>(v * 257);
            }
        }
    // A palette image: one index byte per pixel into the four colours.
    uint8_t palette[12];
    Bytes indices;
    if (format & PNG_FORMAT_FLAG_COLORMAP) {
        image.colormap_entries = 4;
        for (int k = 0; k < 4; ++k)
            palette[3 * k] = uint8_t(q[k].r), palette[3 * k + 1] = uint8_t(q[k].g), palette[3 * k + 2] = uint8_t(q[k].b);
        for (int y = 0; y < H; ++y)
            for (int x = 0; x < W; ++x) indices.push_back(static_cast<uint8_t>(&colour(q, x, y) - q));
    }
    png_alloc_size_t bytes = 0;
    const void* pixels = !indices.empty() ? indices.data() : size == 2 ? static_cast<const void*>(wide.data()) : narrow.data();
    const void* map = indices.empty() ? nullptr : palette;
    png_image_write_to_memory(&image, nullptr, &bytes, 0, pixels, 0, map);
    std::string out(bytes, '\0');
    png_image_write_to_memory(&image, out.data(), &bytes, 0, pixels, 0, map);
    return out;
}

class Tool : public ::testing::Test {
protected:
    static void SetUpTestSuite() {
        char dir[] = "/tmp/tekoj-tool-test-XXXXXX";
        ASSERT_NE(mkdtemp(dir), nullptr);
        g_dir = dir;
        mkdir((g_dir + "/out").c_str(), 0755);
        mkdir((g_dir + "/subdir").c_str(), 0755);
        write_file("rgb.png", png(PNG_FORMAT_RGB));
        write_file("rgba.png", png(PNG_FORMAT_RGBA));
        write_file("palette.png", png(PNG_FORMAT_RGB_COLORMAP));
        write_file("grey16.png", png(PNG_FORMAT_LINEAR_Y));
        const std::string whole = png(PNG_FORMAT_RGB);
        write_file("truncated.png", whole.substr(0, whole.size() / 2));
        write_file("comments.ppm", pnm('6', 255, "# written by a camera\n# second comment\n"));
        write_file("ascii.ppm", pnm('3', 255, ""));
        write_file("wide.ppm", pnm('6', 65535, "# 16 bits\n"));
        write_file("grey.pgm", pnm('5', 1000, ""));
        write_file("ascii.pgm", pnm('2', 255, "# plain\n"));
        const std::string header = "YUV4MPEG2 W" + std::to_string(W) + " H" + std::to_string(H) + " F25:1 Ip A1:1 C420jpeg\n";
        write_file("two.y4m", header + "FRAME\n" + yuv("i420") + "FRAME\n" + yuv("i420", kSecondFrame));
        write_file("c444.y4m", "YUV4MPEG2 W8 H8 C444\nFRAME\n" + std::string(192, '\x80'));
        for (const char* layout : {"i420", "nv21", "nv12", "yuyv", "uyvy", "grey"}) write_file(std::string("frame.") + layout, yuv(layout));
        write_file("short.i420", yuv("i420").substr(0, 100));
        // A header whose sizes once wrapped a 32-bit product, and one over the limit.
        write_file("wrap.ppm", "P6\n43691 32768\n255\n" + std::string(1000, '\x55'));
        write_file("wide-limit.ppm", "P6\n60000 10\n255\n");
        write_file("text.txt", "hello\n");
    }
    static void TearDownTestSuite() { (void)!system(("rm -rf " + g_dir).c_str()); }
    void SetUp() override { clear_outputs(); }
};

// Colours at the quadrant centres, against `q` (or its grey).
void expect_quadrants(const Decoded& d, const Rgb* q, bool grey, const std::string& what) {
    ASSERT_EQ(d.rgb.size(), static_cast<size_t>(W) * H * 3) << what;
    for (int k = 0; k < 4; ++k) {
        const int x = (k & 1) ? 3 * W / 4 : W / 4, y = (k & 2) ? 3 * H / 4 : H / 4;
        const uint8_t* p = &d.rgb[(static_cast<size_t>(y) * W + x) * 3];
        const int want[3] = {grey ? luma(q[k]) : q[k].r, grey ? luma(q[k]) : q[k].g, grey ? luma(q[k]) : q[k].b};
        for (int c = 0; c < 3; ++c) EXPECT_NEAR(p[c], want[c], 10) << what << ", quadrant " << k << ", channel " << c;
    }
}

TEST_F(Tool, EncodesEveryInputKind) {
    const Rgb white_corner[4] = {kQuadrants[0], kQuadrants[1], kQuadrants[2], {255, 255, 255}};
    const Rgb black_corner[4] = {kQuadrants[0], kQuadrants[1], kQuadrants[2], {0, 0, 0}};
    const std::string size = std::to_string(W) + "x" + std::to_string(H);
    struct Case {
        std::vector<std::string> args;  // the output path comes last
        int subsampling;
        const Rgb* colours;
    } cases[] = {
        {{"rgb.png"}, TJSAMP_420, kQuadrants},
        {{"rgba.png"}, TJSAMP_420, white_corner},
        {{"--background", "000000", "rgba.png"}, TJSAMP_420, black_corner},
        {{"grey16.png"}, TJSAMP_GRAY, kQuadrants},
        {{"palette.png"}, TJSAMP_420, kQuadrants},
        {{"comments.ppm"}, TJSAMP_420, kQuadrants},
        {{"ascii.ppm"}, TJSAMP_420, kQuadrants},
        {{"wide.ppm"}, TJSAMP_420, kQuadrants},
        {{"grey.pgm"}, TJSAMP_GRAY, kQuadrants},
        {{"ascii.pgm"}, TJSAMP_GRAY, kQuadrants},
        {{"--sampling", "422", "rgb.png"}, TJSAMP_422, kQuadrants},
        {{"--sampling", "444", "comments.ppm"}, TJSAMP_444, kQuadrants},
        {{"--grey", "rgb.png"}, TJSAMP_GRAY, kQuadrants},
        {{"two.y4m"}, TJSAMP_420, kQuadrants},
        {{"--frame", "1", "two.y4m"}, TJSAMP_420, kSecondFrame},
        {{"--size", size, "frame.i420"}, TJSAMP_420, kQuadrants},
        {{"--size", size, "--pixel-format", "nv21", "frame.nv21"}, TJSAMP_420, kQuadrants},
        {{"--size", size, "--pixel-format", "nv12", "frame.nv12"}, TJSAMP_420, kQuadrants},
        {{"--size", size, "--pixel-format", "yuyv", "frame.yuyv"}, TJSAMP_420, kQuadrants},
        {{"--size", size, "--pixel-format", "uyvy", "--sampling", "422", "frame.uyvy"}, TJSAMP_422, kQuadrants},
        {{"--size", size, "--pixel-format", "grey", "frame.grey"}, TJSAMP_GRAY, kQuadrants},
        {{"--grey", "--size", size, "--pixel-format", "nv12", "frame.nv12"}, TJSAMP_GRAY, kQuadrants},
    };
    for (const Case& c : cases) {
        std::vector<std::string> args = c.args;
        args.push_back("out/a.jpg");
        const std::string what = ::testing::PrintToString(args);
        const Result r = run(args);
        ASSERT_EQ(r.status, 0) << what << ": " << r.err;
        EXPECT_EQ(r.out + r.err, "") << what;
        EXPECT_EQ(outputs(), std::vector<std::string>{"a.jpg"}) << what;
        const Decoded d = decode(read_text(g_dir + "/out/a.jpg"));
        EXPECT_EQ(d.subsampling, c.subsampling) << what;
        expect_quadrants(d, c.colours, c.subsampling == TJSAMP_GRAY, what);
    }
}

TEST_F(Tool, StandardStreamsAndSeveralFiles) {
    // Standard input to standard output: nothing but the JPEG on stdout.
    Result r = run({"-q", "90", "-", "-"}, read_text(g_dir + "/rgb.png"));
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.err, "");
    expect_quadrants(decode(r.out), kQuadrants, false, "stdin to stdout");

    // Several inputs into a folder: one missing file fails alone.
    r = run({"-o", "out", "rgb.png", "missing.ppm", "two.y4m"});
    EXPECT_EQ(r.status, 1);
    EXPECT_NE(r.err.find("missing.ppm: cannot open: No such file or directory"), std::string::npos) << r.err;
    EXPECT_EQ(r.out, "");
    std::vector<std::string> names = outputs();
    std::sort(names.begin(), names.end());
    EXPECT_EQ(names, (std::vector<std::string>{"rgb.jpg", "two.jpg"}));

    // The built-in sample, with EXIF and a thumbnail: the summary on stderr.
    r = run({"--sample", "out/s.jpg", "--make", "Tekoj", "--gps", "48.85,-2.29,35", "--thumbnail", "--datestamp"});
    ASSERT_EQ(r.status, 0) << r.err;
    EXPECT_EQ(r.out, "");
    EXPECT_NE(r.err.find("out/s.jpg"), std::string::npos) << r.err;
    EXPECT_NE(r.err.find("1024x768"), std::string::npos) << r.err;
    const std::string jpeg = read_text(g_dir + "/out/s.jpg");
    EXPECT_EQ(decode(jpeg).width, 1024);
    ASSERT_GT(jpeg.size(), 40u);
    EXPECT_EQ(jpeg.substr(20, 2), "\xFF\xE1");  // APP1 right after APP0
    EXPECT_EQ(jpeg.substr(24, 6), std::string("Exif\0\0", 6));
    // The thumbnail: the second SOI, a JPEG of at most 160x120 inside APP1.
    const size_t thumb = jpeg.find("\xFF\xD8\xFF", 2);
    const size_t app1_end = 22 + (static_cast<uint8_t>(jpeg[22]) << 8 | static_cast<uint8_t>(jpeg[23]));
    ASSERT_LT(thumb, app1_end);
    const Decoded t = decode(jpeg.substr(thumb, app1_end - thumb));
    EXPECT_EQ(t.width, 160);
    EXPECT_EQ(t.height, 120);
}

TEST_F(Tool, RefusesWrongInputAndUsage) {
    struct Case {
        std::vector<std::string> args;
        int status;
        std::string message;  // part of standard error
        rlim_t file_limit = 0;
    } cases[] = {
        {{}, 2, "Usage: tekoj"},
        {{"missing.png", "out/a.jpg"}, 1, "missing.png: cannot open: No such file or directory"},
        {{"truncated.png", "out/a.jpg"}, 1, "truncated.png: not a valid PNG"},
        {{"subdir", "out/a.jpg"}, 1, "subdir: is a directory"},
        {{"text.txt", "out/a.jpg"}, 1, "text.txt: not a PNG, PNM or Y4M image"},
        {{"c444.y4m", "out/a.jpg"}, 1, "c444.y4m: Y4M colour space C444 is not supported"},
        {{"wrap.ppm", "out/a.jpg"}, 1, "wrap.ppm: file ends early"},
        {{"wide-limit.ppm", "out/a.jpg"}, 1, "wide-limit.ppm: image is 60000x10 pixels"},
        {{"--size", "46x37", "short.i420", "out/a.jpg"}, 1, "short.i420: file ends early"},
        {{"--sampling", "444", "two.y4m", "out/a.jpg"}, 1, "two.y4m: 4:2:0 YUV input is coded 4:2:0"},
        {{"rgb.png", "nowhere/a.jpg"}, 1, "nowhere/a.jpg: cannot create: No such file or directory"},
        {{"rgb.png", "out/a.jpg"}, 1, "out/a.jpg: cannot write: File too large", 100},
        {{"--size", "46", "frame.i420", "out/a.jpg"}, 2, "--size takes WIDTHxHEIGHT"},
        {{"--size", "0x37", "frame.i420", "out/a.jpg"}, 2, "--size width takes a whole number from 1 to 49999, not '0'"},
        {{"--size", "45x37", "--pixel-format", "yuyv", "frame.yuyv", "out/a.jpg"}, 2, "need an even width"},
        {{"-q", "abc", "rgb.png", "out/a.jpg"}, 2, "-q takes a whole number from 1 to 100, not 'abc'"},
        {{"-q", "-5", "rgb.png", "out/a.jpg"}, 2, "not '-5'"},
        {{"--quality=101", "rgb.png", "out/a.jpg"}, 2, "not '101'"},
        {{"--orientation", "9", "rgb.png", "out/a.jpg"}, 2, "--orientation takes a whole number from 1 to 8"},
        {{"--gps", "91,0", "rgb.png", "out/a.jpg"}, 2, "--gps latitude"},
        {{"rgb.png"}, 2, "give an INPUT and an OUTPUT"},
        {{"rgb.png", "two.y4m", "out/a.jpg"}, 2, "several inputs need -o DIR"},
        {{"--frobnicate", "rgb.png", "out/a.jpg"}, 2, "unknown option --frobnicate"},
    };
    std::vector<Case> all(std::begin(cases), std::end(cases));
    struct stat st{};
    if (stat("/dev/full", &st) == 0 && S_ISCHR(st.st_mode))
        all.push_back({{"rgb.png", "/dev/full"}, 1, "/dev/full: cannot write: No space left on device"});
    for (const Case& c : all) {
        const std::string what = ::testing::PrintToString(c.args);
        const Result r = run(c.args, "", c.file_limit);
        EXPECT_EQ(r.status, c.status) << what << ": " << r.err;
        EXPECT_NE(r.err.find(c.message), std::string::npos) << what << ": " << r.err;
        EXPECT_EQ(r.out, "") << what;
        EXPECT_EQ(outputs(), std::vector<std::string>{}) << what;
        clear_outputs();
    }
    // Help and version go to standard output and succeed.
    for (const char* option : {"--help", "--version"}) {
        const Result r = run({option});
        EXPECT_EQ(r.status, 0) << option;
        EXPECT_EQ(r.err, "") << option;
        EXPECT_NE(r.out.find(option == std::string("--help") ? "default ffffff, white" : "libTekoJEncoder"), std::string::npos);
    }
}

TEST_F(Tool, EncodesARealPhotograph) {
    const std::string photo = TEKOJ_IMAGES_DIR "/astronaut-512x512.png";
    if (access(photo.c_str(), R_OK) != 0) GTEST_SKIP() << photo << " missing";
    const Result r = run({photo, "out/a.jpg"});
    ASSERT_EQ(r.status, 0) << r.err;
    const Decoded d = decode(read_text(g_dir + "/out/a.jpg"));
    EXPECT_EQ(d.width, 512);
    EXPECT_EQ(d.height, 512);
    // Threads change no byte: RGB and grey rows read whole, a 4:2:0 frame.
    const std::string size = std::to_string(W) + "x" + std::to_string(H);
    for (const std::vector<std::string>& input : std::vector<std::vector<std::string>>{
             {photo}, {"--grey", photo}, {"grey.pgm"}, {"--size", size, "frame.i420"}}) {
        std::vector<std::string> one = input, three = input;
        one.insert(one.end(), {"--threads", "1", "out/1.jpg"});
        three.insert(three.end(), {"--threads", "3", "out/3.jpg"});
        ASSERT_EQ(run(one).status, 0);
        ASSERT_EQ(run(three).status, 0);
        EXPECT_EQ(read_text(g_dir + "/out/1.jpg"), read_text(g_dir + "/out/3.jpg")) << input.back();
    }
}

}  // namespace

int main(int argc, char** argv) {
    ::testing::InitGoogleTest(&argc, argv);
    for (int i = 1; i < argc; ++i) g_tool.push_back(argv[i]);
    if (g_tool.empty()) {
        std::fprintf(stderr, "usage: %s TOOL-COMMAND...\n", argv[0]);
        return 2;
    }
    return RUN_ALL_TESTS();
}
