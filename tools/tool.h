// tekoj, the command-line encoder: failures, byte input and output, image
// sources that hand over their pixels a few rows at a time, and the encode
// driver that codes them band by band.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <stdexcept>
#include <string>
#include <vector>

namespace tool {

// What went wrong with one file. `file` names the file when the failure is
// about a particular one (the input, the output); otherwise the caller
// reports it against the input.
struct Failure : std::runtime_error {
    Failure(std::string file_name, const std::string& what) : std::runtime_error(what), file(std::move(file_name)) {}
    std::string file;
};
[[noreturn]] void fail(const std::string& what);
// Appends the reason of the last system error (errno).
[[noreturn]] void fail_system(const std::string& file, const std::string& what);

// Parses all of `text` as a decimal integer within [lo, hi]; false otherwise.
bool parse_integer(const std::string& text, int64_t lo, int64_t hi, int64_t& value);

// Buffered reading of a file or, for "-", of standard input.
class Input {
public:
    explicit Input(const std::string& path);
    ~Input();
    Input(const Input&) = delete;
    Input& operator=(const Input&) = delete;

    const std::string& name() const { return name_; }
    // Fewer bytes than asked only at the end of the file.
    size_t read(void* dst, size_t count);
    // Fails with "file ends early" when the file is shorter.
    void read_exact(void* dst, size_t count);
    // The byte `ahead` places on (below 16), without consuming it; -1 at the end.
    int peek(size_t ahead = 0);
    int get();
    void skip(uint64_t count);

private:
    bool fill(size_t wanted);
    std::string name_;
    int fd_ = -1;
    std::vector<uint8_t> buffer_;
    size_t pos_ = 0, end_ = 0;
    bool at_end_ = false;
};

// Makes SIGINT, SIGTERM and SIGHUP remove the temporary of an Output first.
void remove_temporaries_on_signals();

// An output file that appears only once it is complete: a regular file is
// written to a temporary beside it and renamed over it by commit(); anything
// left uncommitted is removed. Standard output ("-") and existing special
// files (devices, pipes) are written directly.
class Output {
public:
    explicit Output(const std::string& path);
    ~Output();
    Output(const Output&) = delete;
    Output& operator=(const Output&) = delete;

    void write(const void* data, size_t count);
    void commit();
    uint64_t size() const { return size_; }
    const std::string& name() const { return name_; }

private:
    void flush();
    std::string name_, path_, temporary_;
    int fd_ = -1;
    std::vector<uint8_t> buffer_;
    size_t pending_ = 0;
    uint64_t size_ = 0;
    bool committed_ = false;
};

// ---------------------------------------------------------------------------
// Image sources

enum class Layout {
    Rgb,   // rows of R, G, B bytes
    Grey,  // rows of one byte per pixel
    Yuyv,  // rows of Y0 U Y1 V groups (even width)
    Uyvy,  // rows of U Y0 V Y1 groups (even width)
    I420,  // whole frame: Y plane, U plane, V plane
    Nv21,  // whole frame: Y plane, then interleaved V/U
    Nv12   // whole frame: Y plane, then interleaved U/V
};

inline bool is_frame(Layout l) { return l == Layout::I420 || l == Layout::Nv21 || l == Layout::Nv12; }
inline bool is_packed(Layout l) { return l == Layout::Yuyv || l == Layout::Uyvy; }
inline uint32_t row_bytes(Layout l, uint32_t width) {
    return width * (l == Layout::Rgb ? 3u : l == Layout::Grey ? 1u : 2u);
}

struct Source {
    virtual ~Source() = default;
    uint32_t width = 0, height = 0;
    Layout layout = Layout::Rgb;
    std::string description;      // e.g. "PNG", "PPM", "Y4M frame 0"
    std::vector<uint8_t> frame;   // frame layouts: the whole frame, chroma rows of (width + 1) / 2 samples
    // Row layouts: the next `count` rows, packed, at `dst`.
    virtual void read_rows(uint8_t* dst, uint32_t count) = 0;
};

struct ReadOptions {
    uint8_t background[3] = {255, 255, 255};  // what PNG transparency is laid on
    uint32_t raw_width = 0, raw_height = 0;   // non-zero: the input is raw YUV
    Layout raw_layout = Layout::I420;
    uint64_t frame = 0;                       // Y4M and raw: frame to code, from 0
};

// Recognises the input by its first bytes (or takes it as raw with a size).
std::unique_ptr<Source> open_source(Input& in, const ReadOptions& options);
std::unique_ptr<Source> open_png(Input& in, const uint8_t background[3]);
std::unique_ptr<Source> sample_source();
// Fails unless both sides lie in the encoder's range, 1 to 49999.
void check_dimensions(uint64_t width, uint64_t height);

// ---------------------------------------------------------------------------
// Encoding

struct Options {
    uint32_t quality = 85;
    bool grey = false;
    uint32_t sampling = 420;  // 420, 422 or 444
    std::string make, model;
    uint32_t orientation = 0;  // 0: not recorded
    bool datestamp = false;
    bool gps = false;
    double latitude = 0, longitude = 0, altitude = 0;
    bool has_altitude = false;
    bool thumbnail = false;
    uint32_t threads = 0;         // 0: one per core
    bool threads_given = false;   // --threads was given
};

struct Summary {
    bool grey = false;
    uint32_t sampling = 420;
    uint32_t thumbnail_width = 0, thumbnail_height = 0;
};

// Codes `source` band by band into `out` (which it does not commit).
// `progress` receives the fraction of rows done after every band.
Summary encode(Source& source, const Options& options, Output& out, const std::function<void(double)>& progress);

}  // namespace tool
