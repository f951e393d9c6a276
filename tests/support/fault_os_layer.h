// Test operating-system layer: the library's DORVATEKO_Os* calls land here,
// forward to the C library, and can be told to fail.
#pragma once

#include <cstdint>

namespace tekoj_test {

// The n-th allocation from now (0 = the next one) fails; -1 switches it off.
void fail_allocation(int64_t n);
// Whether an allocation was made to fail since the last reset or arming.
bool failure_injected();
// Allocations and releases since the last reset, and blocks still live.
int64_t allocation_count();
int64_t live_blocks();
void reset_counters();
// After `bytes` more bytes, every write to a file comes up short; -1 = never.
void fail_writes_after(int64_t bytes);

// Switches failure injection off again when a test ends.
struct FaultScope {
    FaultScope() { reset_counters(); }
    ~FaultScope() {
        fail_allocation(-1);
        fail_writes_after(-1);
    }
};

}  // namespace tekoj_test
