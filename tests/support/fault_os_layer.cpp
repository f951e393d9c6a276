#include "support/fault_os_layer.h"

#include <TekoJEncoderInternal.h>

#include <atomic>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace {
std::atomic<int64_t> fail_at{-1};
std::atomic<int64_t> allocations{0};
std::atomic<int64_t> live{0};
std::atomic<int64_t> write_budget{-1};
std::atomic<bool> injected{false};

bool should_fail() {
    ++allocations;
    int64_t n = fail_at.load();
    if (n < 0) return false;
    fail_at.store(n - 1);
    if (n == 0) injected.store(true);
    return n == 0;
}
}  // namespace

namespace tekoj_test {
void fail_allocation(int64_t n) {
    fail_at.store(n);
    if (n >= 0) injected.store(false);
}
bool failure_injected() { return injected.load(); }
int64_t allocation_count() { return allocations.load(); }
int64_t live_blocks() { return live.load(); }
void reset_counters() {
    allocations.store(0);
    fail_at.store(-1);
    write_budget.store(-1);
    injected.store(false);
}
void fail_writes_after(int64_t bytes) { write_budget.store(bytes); }
}  // namespace tekoj_test

extern "C" {

void* DORVATEKO_OsMalloc(uint32_t size) {
    if (should_fail()) return nullptr;
    void* p = std::malloc(size == 0 ? 1 : size);
    if (p != nullptr) ++live;
    return p;
}

void DORVATEKO_OsFree(void* block) {
    if (block != nullptr) --live;
    std::free(block);
}

void* DORVATEKO_OsRealloc(void* block, uint32_t size) {
    if (should_fail()) return nullptr;
    void* p = std::realloc(block, size == 0 ? 1 : size);
    if (p != nullptr && block == nullptr) ++live;
    return p;
}

void* DORVATEKO_OsMemcpy(void* dst, const void* src, uint32_t count) {
    return count == 0 ? dst : std::memcpy(dst, src, count);
}

void* DORVATEKO_OsMemset(void* dst, int32_t value, uint32_t count) {
    return count == 0 ? dst : std::memset(dst, value, count);
}

void* DORVATEKO_OsFopen(const char* path, const char* mode) { return std::fopen(path, mode); }

uint32_t DORVATEKO_OsFwrite(const void* data, uint32_t size, uint32_t count, void* file) {
    uint64_t bytes = static_cast<uint64_t>(size) * count;
    int64_t budget = write_budget.load();
    if (budget >= 0) {
        if (static_cast<int64_t>(bytes) > budget) {
            std::fwrite(data, 1, static_cast<size_t>(budget), static_cast<std::FILE*>(file));
            write_budget.store(0);
            return static_cast<uint32_t>(budget / (size == 0 ? 1 : size));
        }
        write_budget.store(budget - static_cast<int64_t>(bytes));
    }
    return static_cast<uint32_t>(std::fwrite(data, size, count, static_cast<std::FILE*>(file)));
}

int32_t DORVATEKO_OsFclose(void* file) { return std::fclose(static_cast<std::FILE*>(file)); }

}  // extern "C"
