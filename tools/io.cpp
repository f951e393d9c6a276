// Byte input and output of the tool. Both go straight to file descriptors so
// that every failure can be reported with the system's reason, and so that
// standard input and output behave like any other file.
#include "tool.h"

#include <cerrno>
#include <csignal>
#include <cstdlib>
#include <cstring>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

namespace tool {
namespace {

// The temporary being written, for the signal handler: an interrupted run
// leaves no half-written file behind either.
char interrupted_temporary[4096];
volatile sig_atomic_t temporary_set = 0;

void remember_temporary(const std::string& path) {
    temporary_set = 0;
    if (path.size() >= sizeof interrupted_temporary) return;
    std::memcpy(interrupted_temporary, path.c_str(), path.size() + 1);
    temporary_set = 1;
}

void on_signal(int signal_number) {
    if (temporary_set != 0) ::unlink(interrupted_temporary);
    std::signal(signal_number, SIG_DFL);
    std::raise(signal_number);
}

}  // namespace

void remove_temporaries_on_signals() {
    for (int s : {SIGINT, SIGTERM, SIGHUP}) std::signal(s, on_signal);
}

void fail(const std::string& what) { throw Failure("", what); }

void fail_system(const std::string& file, const std::string& what) {
    throw Failure(file, what + ": " + std::strerror(errno));
}

bool parse_integer(const std::string& text, int64_t lo, int64_t hi, int64_t& value) {
    if (text.empty() || text.size() > 20) return false;
    errno = 0;
    char* end = nullptr;
    const long long v = std::strtoll(text.c_str(), &end, 10);
    if (errno != 0 || *end != '\0' || v < lo || v > hi) return false;
    value = v;
    return true;
}

// ---------------------------------------------------------------------------

Input::Input(const std::string& path) : buffer_(1 << 16) {
    if (path == "-") {
        name_ = "standard input";
        fd_ = STDIN_FILENO;
        return;
    }
    name_ = path;
    fd_ = ::open(path.c_str(), O_RDONLY | O_CLOEXEC);
    if (fd_ < 0) fail_system(name_, "cannot open");
    struct stat st{};
    if (::fstat(fd_, &st) == 0 && S_ISDIR(st.st_mode)) {
        ::close(fd_);
        fd_ = -1;
        throw Failure(name_, "is a directory, not an image file");
    }
}

Input::~Input() {
    if (fd_ > STDERR_FILENO) ::close(fd_);
}

// Makes at least `wanted` bytes available unless the file ends first.
bool Input::fill(size_t wanted) {
    if (end_ - pos_ >= wanted) return true;
    if (pos_ > 0) {
        std::memmove(buffer_.data(), buffer_.data() + pos_, end_ - pos_);
        end_ -= pos_;
        pos_ = 0;
    }
    while (end_ < wanted && !at_end_) {
        const ssize_t n = ::read(fd_, buffer_.data() + end_, buffer_.size() - end_);
        if (n < 0) {
            if (errno == EINTR) continue;
            fail_system(name_, "cannot read");
        }
        if (n == 0) at_end_ = true;
        end_ += static_cast<size_t>(n);
    }
    return end_ >= wanted;
}

size_t Input::read(void* dst, size_t count) {
    auto* out = static_cast<uint8_t*>(dst);
    size_t done = 0;
    while (done < count) {
        if (pos_ == end_) {
            // Large reads bypass the buffer.
            if (count - done >= buffer_.size() && !at_end_) {
                const ssize_t n = ::read(fd_, out + done, count - done);
                if (n < 0) {
                    if (errno == EINTR) continue;
                    fail_system(name_, "cannot read");
                }
                if (n == 0) at_end_ = true;
                done += static_cast<size_t>(n);
                if (n == 0) break;
                continue;
            }
            if (!fill(1)) break;
        }
        const size_t n = std::min(count - done, end_ - pos_);
        std::memcpy(out + done, buffer_.data() + pos_, n);
        pos_ += n;
        done += n;
    }
    return done;
}

void Input::read_exact(void* dst, size_t count) {
    if (read(dst, count) != count) throw Failure(name_, "file ends early (truncated?)");
}

int Input::peek(size_t ahead) { return fill(ahead + 1) ? buffer_[pos_ + ahead] : -1; }

int Input::get() {
    if (!fill(1)) return -1;
    return buffer_[pos_++];
}

void Input::skip(uint64_t count) {
    const size_t buffered = end_ - pos_;
    if (count <= buffered) {
        pos_ += static_cast<size_t>(count);
        return;
    }
    count -= buffered;
    pos_ = end_ = 0;
    if (!at_end_ && ::lseek(fd_, static_cast<off_t>(count), SEEK_CUR) >= 0) {
        // lseek goes past the end without complaint; the next read finds it.
        return;
    }
    std::vector<uint8_t> scratch(1 << 16);
    while (count > 0) {
        const size_t n = read(scratch.data(), static_cast<size_t>(std::min<uint64_t>(count, scratch.size())));
        if (n == 0) throw Failure(name_, "file ends early (truncated?)");
        count -= n;
    }
}

// ---------------------------------------------------------------------------

Output::Output(const std::string& path) : buffer_(1 << 16) {
    if (path == "-") {
        name_ = "standard output";
        fd_ = STDOUT_FILENO;
        return;
    }
    name_ = path_ = path;
    struct stat st{};
    if (::stat(path.c_str(), &st) == 0) {
        if (S_ISDIR(st.st_mode)) throw Failure(name_, "is a directory");
        if (!S_ISREG(st.st_mode)) {
            // A device or a pipe cannot be replaced by renaming; write it directly.
            fd_ = ::open(path.c_str(), O_WRONLY | O_TRUNC | O_CLOEXEC);
            if (fd_ < 0) fail_system(name_, "cannot open for writing");
            path_.clear();
            return;
        }
    }
    temporary_ = path + ".tekoj-XXXXXX";
    fd_ = ::mkostemp(temporary_.data(), O_CLOEXEC);
    if (fd_ < 0) {
        temporary_.clear();
        fail_system(name_, "cannot create");
    }
    remember_temporary(temporary_);
    // mkstemp makes the file private; give it the mode a plain creation would.
    const mode_t mask = ::umask(0);
    ::umask(mask);
    ::fchmod(fd_, 0666 & ~mask);
}

Output::~Output() {
    if (fd_ > STDERR_FILENO) ::close(fd_);
    if (!committed_ && !temporary_.empty()) ::unlink(temporary_.c_str());
    if (!temporary_.empty()) temporary_set = 0;
}

void Output::flush() {
    size_t done = 0;
    while (done < pending_) {
        const ssize_t n = ::write(fd_, buffer_.data() + done, pending_ - done);
        if (n < 0) {
            if (errno == EINTR) continue;
            fail_system(name_, "cannot write");
        }
        done += static_cast<size_t>(n);
    }
    pending_ = 0;
}

void Output::write(const void* data, size_t count) {
    const auto* in = static_cast<const uint8_t*>(data);
    while (count > 0) {
        const size_t n = std::min(count, buffer_.size() - pending_);
        std::memcpy(buffer_.data() + pending_, in, n);
        pending_ += n;
        size_ += n;
        in += n;
        count -= n;
        if (pending_ == buffer_.size()) flush();
    }
}

void Output::commit() {
    flush();
    if (fd_ > STDERR_FILENO) {
        const int fd = fd_;
        fd_ = -1;
        if (::close(fd) != 0) fail_system(name_, "cannot write");
    }
    if (!temporary_.empty() && ::rename(temporary_.c_str(), path_.c_str()) != 0)
        fail_system(name_, "cannot create");
    committed_ = true;
}

}  // namespace tool
