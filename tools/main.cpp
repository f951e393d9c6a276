// tekoj: encodes PNG, PNM, Y4M and raw YUV images to baseline JPEG with
// libTekoJEncoder. Messages go to standard error only; standard output
// carries nothing but JPEG data (or the help and version texts).
#include "tool.h"

#include <TekoJEncoder.h>

#include <cmath>
#include <cstdio>
#include <cstring>
#include <set>
#include <unistd.h>

namespace {

using namespace tool;

const char* const kUsage =
    "Usage: tekoj [OPTION]... INPUT OUTPUT.jpg\n"
    "       tekoj [OPTION]... -o DIR INPUT...\n"
    "       tekoj [OPTION]... --sample OUTPUT.jpg\n";

const char* const kHelp =
    "Encodes images to baseline JPEG with libTekoJEncoder.\n"
    "\n"
    "INPUT is a PNG, a PNM (P2, P3, P5, P6, maxval up to 65535) or a Y4M file\n"
    "(4:2:0 or mono), recognised by its content, or raw YUV when --size is given.\n"
    "'-' as INPUT reads standard input, as OUTPUT writes standard output.\n"
    "With -o, each INPUT is written to DIR/NAME.jpg. Large images are coded band\n"
    "by band, so memory follows the width (planar YUV is read a frame at a time,\n"
    "interlaced PNG whole).\n"
    "\n"
    "  -q, --quality N          quality 1 to 100 (default 85)\n"
    "      --grey               code a greyscale JPEG\n"
    "      --sampling S         chroma sampling 420 (default), 422 or 444; 422 and\n"
    "                           444 need RGB input, 422 also takes yuyv and uyvy\n"
    "      --background RRGGBB  colour that PNG transparency is laid on\n"
    "                           (default ffffff, white)\n"
    "      --size WxH           the input is raw YUV of this size\n"
    "      --pixel-format F     raw layout: i420 (default), nv21, nv12, yuyv, uyvy\n"
    "                           or grey\n"
    "      --frame N            frame to code of a Y4M or raw input, from 0\n"
    "  -o, --output-dir DIR     write every INPUT to DIR\n"
    "  -v, --verbose            report each file written\n"
    "\n"
    "EXIF (any of these adds an EXIF segment):\n"
    "      --make TEXT          camera maker\n"
    "      --model TEXT         camera model\n"
    "      --orientation N      1 to 8 (1: upright)\n"
    "      --datestamp          the current local date and time\n"
    "      --gps LAT,LON[,ALT]  decimal degrees, south and west negative;\n"
    "                           altitude in metres\n"
    "      --thumbnail          a copy down-scaled to at most 160x120\n"
    "\n"
    "      --threads N          threads per image, 1 to 64 (default: one per core\n"
    "                           for Y4M and raw YUV 4:2:0 and grey frames, one\n"
    "                           otherwise); with N above 1, RGB 4:2:0 and grey\n"
    "                           row inputs are read whole first. Same bytes for\n"
    "                           every N. Not with --thumbnail\n"
    "      --sample OUTPUT      encode the built-in 1024x768 sample image\n"
    "  -h, --help               show this help\n"
    "      --version            show the library version\n"
    "\n"
    "Exit status: 0 success, 1 a file failed, 2 usage error.\n";

struct UsageError {
    std::string message;
};

struct Arguments {
    Options encode;
    ReadOptions read;
    std::vector<std::string> files;
    std::string output_dir, sample;
    bool help = false, version = false, verbose = false;
};

uint32_t parse_number(const std::string& option, const std::string& text, int64_t lo, int64_t hi) {
    int64_t v = 0;
    if (!parse_integer(text, lo, hi, v))
        throw UsageError{option + " takes a whole number from " + std::to_string(lo) + " to " + std::to_string(hi) +
                         ", not '" + text + "'"};
    return static_cast<uint32_t>(v);
}

double parse_real(const std::string& option, const std::string& text, double limit) {
    char* end = nullptr;
    const double v = std::strtod(text.c_str(), &end);
    if (text.empty() || *end != '\0' || !std::isfinite(v) || std::fabs(v) > limit)
        throw UsageError{option + ": '" + text + "' is not a number from -" + std::to_string(static_cast<int>(limit)) +
                         " to " + std::to_string(static_cast<int>(limit))};
    return v;
}

std::vector<std::string> split(const std::string& text, char separator) {
    std::vector<std::string> parts(1);
    for (char c : text) {
        if (c == separator) {
            parts.emplace_back();
        } else {
            parts.back() += c;
        }
    }
    return parts;
}

Arguments parse(int argc, char** argv) {
    Arguments a;
    bool options_done = false;
    for (int i = 1; i < argc; ++i) {
        std::string arg = argv[i];
        if (options_done || arg == "-" || arg[0] != '-') {
            a.files.push_back(arg);
            continue;
        }
        if (arg == "--") {
            options_done = true;
            continue;
        }
        std::string value;
        bool inline_value = false;
        if (arg.compare(0, 2, "--") == 0 && arg.find('=') != std::string::npos) {
            value = arg.substr(arg.find('=') + 1);
            arg = arg.substr(0, arg.find('='));
            inline_value = true;
        }
        auto take = [&]() -> std::string {
            if (inline_value) return value;
            if (i + 1 >= argc) throw UsageError{arg + " needs a value"};
            return argv[++i];
        };
        auto flag = [&]() {
            if (inline_value) throw UsageError{arg + " takes no value"};
        };
        Options& e = a.encode;
        if (arg == "-h" || arg == "--help") {
            flag(), a.help = true;
        } else if (arg == "--version") {
            flag(), a.version = true;
        } else if (arg == "-v" || arg == "--verbose") {
            flag(), a.verbose = true;
        } else if (arg == "-q" || arg == "--quality") {
            e.quality = parse_number(arg, take(), 1, 100);
        } else if (arg == "--grey" || arg == "--gray") {
            flag(), e.grey = true;
        } else if (arg == "--sampling") {
            const std::string s = take();
            if (s != "420" && s != "422" && s != "444") throw UsageError{"--sampling takes 420, 422 or 444, not '" + s + "'"};
            e.sampling = static_cast<uint32_t>(std::stoul(s));
        } else if (arg == "--background") {
            std::string s = take();
            if (!s.empty() && s[0] == '#') s.erase(0, 1);
            if (s.size() != 6 || s.find_first_not_of("0123456789abcdefABCDEF") != std::string::npos)
                throw UsageError{"--background takes a colour as RRGGBB in hexadecimal, not '" + s + "'"};
            for (int c = 0; c < 3; ++c) a.read.background[c] = static_cast<uint8_t>(std::stoul(s.substr(2 * c, 2), nullptr, 16));
        } else if (arg == "--size") {
            const std::string s = take();
            const std::vector<std::string> wh = split(s, 'x');
            if (wh.size() != 2) throw UsageError{"--size takes WIDTHxHEIGHT, such as 640x480, not '" + s + "'"};
            a.read.raw_width = parse_number("--size width", wh[0], 1, 49999);
            a.read.raw_height = parse_number("--size height", wh[1], 1, 49999);
        } else if (arg == "--pixel-format") {
            const std::string s = take();
            static const std::pair<const char*, Layout> names[] = {{"i420", Layout::I420}, {"nv21", Layout::Nv21},
                                                                   {"nv12", Layout::Nv12}, {"yuyv", Layout::Yuyv},
                                                                   {"uyvy", Layout::Uyvy}, {"grey", Layout::Grey}};
            bool found = false;
            for (const auto& [name, layout] : names)
                if (s == name) a.read.raw_layout = layout, found = true;
            if (!found) throw UsageError{"--pixel-format takes i420, nv21, nv12, yuyv, uyvy or grey, not '" + s + "'"};
        } else if (arg == "--frame") {
            a.read.frame = parse_number(arg, take(), 0, 0x7FFFFFFF);
        } else if (arg == "-o" || arg == "--output-dir") {
            a.output_dir = take();
        } else if (arg == "--make" || arg == "--model") {
            const std::string s = take();
            if (s.empty() || s.size() > 255) throw UsageError{arg + " takes 1 to 255 characters"};
            (arg == "--make" ? e.make : e.model) = s;
        } else if (arg == "--orientation") {
            e.orientation = parse_number(arg, take(), 1, 8);
        } else if (arg == "--datestamp") {
            flag(), e.datestamp = true;
        } else if (arg == "--gps") {
            const std::vector<std::string> parts = split(take(), ',');
            if (parts.size() < 2 || parts.size() > 3) throw UsageError{"--gps takes LATITUDE,LONGITUDE[,ALTITUDE]"};
            e.gps = true;
            e.latitude = parse_real("--gps latitude", parts[0], 90);
            e.longitude = parse_real("--gps longitude", parts[1], 180);
            e.has_altitude = parts.size() == 3;
            if (e.has_altitude) e.altitude = parse_real("--gps altitude", parts[2], 100000);
        } else if (arg == "--thumbnail") {
            flag(), e.thumbnail = true;
        } else if (arg == "--threads") {
            e.threads = parse_number(arg, take(), 1, 64), e.threads_given = true;
        } else if (arg == "--sample") {
            a.sample = take();
        } else {
            throw UsageError{"unknown option " + arg};
        }
    }
    if (a.help || a.version) return a;
    if (a.read.raw_layout != Layout::I420 && a.read.raw_width == 0) throw UsageError{"--pixel-format needs --size"};
    if (is_packed(a.read.raw_layout) && a.read.raw_width % 2 != 0)
        throw UsageError{"--pixel-format yuyv and uyvy need an even width"};
    if (!a.sample.empty()) {
        if (!a.files.empty() || !a.output_dir.empty()) throw UsageError{"--sample takes no other input or output"};
    } else if (!a.output_dir.empty()) {
        if (a.files.empty()) throw UsageError{"no INPUT given"};
        for (const std::string& f : a.files)
            if (f == "-") throw UsageError{"standard input has no name to give its output in " + a.output_dir};
    } else if (a.files.size() != 2) {
        throw UsageError{a.files.size() < 2 ? "give an INPUT and an OUTPUT (or -o DIR)" : "several inputs need -o DIR"};
    }
    return a;
}

// DIR/NAME.jpg for an input path DIR2/NAME.EXT.
std::string output_name(const std::string& dir, const std::string& input) {
    std::string name = input.substr(input.find_last_of('/') + 1);
    const size_t dot = name.find_last_of('.');
    if (dot != std::string::npos && dot > 0) name.erase(dot);
    return (dir.empty() || dir.back() == '/' ? dir : dir + "/") + name + ".jpg";
}

// A progress bar on standard error while it is a terminal.
class Progress {
public:
    explicit Progress(size_t files) : files_(files), shown_(isatty(STDERR_FILENO) != 0) {}
    void show(size_t index, const std::string& name, double fraction) {
        if (!shown_) return;
        const int percent = static_cast<int>((index + fraction) * 100 / files_);
        if (percent == last_ && fraction < 1) return;
        last_ = percent;
        const int width = 30, filled = percent * width / 100;
        std::fprintf(stderr, "\r[%.*s%*s] %3d%%  %zu/%zu %.40s\033[K", filled, "##############################",
                     width - filled, "", percent, index + 1, files_, name.c_str());
        visible_ = true;
    }
    void clear() {
        if (visible_) std::fputs("\r\033[K", stderr);
        visible_ = false;
        last_ = -1;
    }

private:
    size_t files_;
    bool shown_, visible_ = false;
    int last_ = -1;
};

const char* sampling_name(uint32_t s) { return s == 444 ? "4:4:4" : s == 422 ? "4:2:2" : s == 420 ? "4:2:0" : "grey"; }

// Codes one file; failures name the file they concern.
void run(const Arguments& a, const std::string& input, const std::string& output, Progress& progress, size_t index) {
    if (output == "-" && isatty(STDOUT_FILENO)) throw Failure("standard output", "is a terminal; not writing JPEG data to it");
    std::unique_ptr<Input> in;
    std::unique_ptr<Source> source;
    if (a.sample.empty()) {
        in = std::make_unique<Input>(input);
        source = open_source(*in, a.read);
    } else {
        source = sample_source();
    }
    Output out(output);
    const Summary s = encode(*source, a.encode, out, [&](double f) { progress.show(index, input, f); });
    out.commit();
    progress.clear();
    if (a.verbose || !a.sample.empty()) {
        std::fprintf(stderr, "tekoj: wrote %s: %llu bytes, %ux%u %s, quality %u, %s", out.name().c_str(),
                     static_cast<unsigned long long>(out.size()), source->width, source->height,
                     source->description.c_str(), a.encode.quality, sampling_name(s.sampling));
        if (s.thumbnail_width != 0) std::fprintf(stderr, ", thumbnail %ux%u", s.thumbnail_width, s.thumbnail_height);
        std::fputc('\n', stderr);
    }
}

}  // namespace

int main(int argc, char** argv) {
    if (argc < 2) {
        std::fputs(kUsage, stderr);
        std::fputs("Try 'tekoj --help' for more.\n", stderr);
        return 2;
    }
    Arguments a;
    try {
        a = parse(argc, argv);
    } catch (const UsageError& e) {
        std::fprintf(stderr, "tekoj: %s\nTry 'tekoj --help' for more.\n", e.message.c_str());
        return 2;
    }
    if (a.help) {
        std::fputs(kUsage, stdout);
        std::fputs(kHelp, stdout);
        return std::fflush(stdout) == 0 ? 0 : 1;
    }
    if (a.version) {
        const uint32_t v = eko_GetVersion();
        std::printf("tekoj (libTekoJEncoder) %u.%u.%u\n", v / 10000, v / 100 % 100, v % 100);
        return std::fflush(stdout) == 0 ? 0 : 1;
    }

    std::vector<std::pair<std::string, std::string>> jobs;
    if (!a.sample.empty()) {
        jobs.emplace_back("built-in sample", a.sample);
    } else if (a.output_dir.empty()) {
        jobs.emplace_back(a.files[0], a.files[1]);
    } else {
        std::set<std::string> names;
        for (const std::string& f : a.files) {
            jobs.emplace_back(f, output_name(a.output_dir, f));
            if (!names.insert(jobs.back().second).second) {
                std::fprintf(stderr, "tekoj: two inputs would both be written to %s\n", jobs.back().second.c_str());
                return 2;
            }
        }
    }

    remove_temporaries_on_signals();
    Progress progress(jobs.size());
    int status = 0;
    for (size_t i = 0; i < jobs.size(); ++i) {
        const auto& [input, output] = jobs[i];
        try {
            run(a, input, output, progress, i);
        } catch (const Failure& f) {
            progress.clear();
            const std::string& file = f.file.empty() ? (input == "-" ? std::string("standard input") : input) : f.file;
            std::fprintf(stderr, "tekoj: %s: %s\n", file.c_str(), f.what());
            status = 1;
        } catch (const std::bad_alloc&) {
            progress.clear();
            std::fprintf(stderr, "tekoj: %s: out of memory\n", input.c_str());
            status = 1;
        }
    }
    return status;
}
