// The built-in operating-system layer: a thin skin over the C library. A
// build with TEKOJ_EXTERNAL_OS_LAYER leaves this file out and takes the same
// symbols from the sibling decoder library instead.
#include <TekoJEncoderInternal.h>

#include <cstdio>
#include <cstdlib>
#include <cstring>

extern "C" {

EKO_API void* DORVATEKO_OsMalloc(uint32_t size) { return std::malloc(size == 0 ? 1 : size); }

EKO_API void DORVATEKO_OsFree(void* block) { std::free(block); }

EKO_API void* DORVATEKO_OsRealloc(void* block, uint32_t size) { return std::realloc(block, size == 0 ? 1 : size); }

EKO_API void* DORVATEKO_OsMemcpy(void* dst, const void* src, uint32_t count) {
    return count == 0 ? dst : std::memcpy(dst, src, count);
}

EKO_API void* DORVATEKO_OsMemset(void* dst, int32_t value, uint32_t count) {
    return count == 0 ? dst : std::memset(dst, value, count);
}

EKO_API void* DORVATEKO_OsFopen(const char* path, const char* mode) {
    if (path == nullptr || mode == nullptr) return nullptr;
    return std::fopen(path, mode);
}

EKO_API uint32_t DORVATEKO_OsFwrite(const void* data, uint32_t size, uint32_t count, void* file) {
    if (file == nullptr || size == 0 || count == 0) return 0;
    return static_cast<uint32_t>(std::fwrite(data, size, count, static_cast<std::FILE*>(file)));
}

EKO_API int32_t DORVATEKO_OsFclose(void* file) {
    if (file == nullptr) return -1;
    return std::fclose(static_cast<std::FILE*>(file));
}

}  // extern "C"
