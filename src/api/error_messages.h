// One message per library error code.
#pragma once

#include <TekoJEncoder.h>

namespace tekoj {

constexpr const char* error_message(uint32_t code) {
    switch (code) {
        case EKO_OK: return "no error";
        case EKO_ERR_ALLOC: return "memory allocation failed";
        case EKO_ERR_FORMAT: return "pixel format code not supported";
        case EKO_ERR_SAMPLING: return "component count, sampling factors or quantisation tables not supported";
        case EKO_ERR_DIMENSIONS: return "width or height outside 1..49999";
        case EKO_ERR_ARGUMENT: return "invalid argument";
        case EKO_ERR_WRITE: return "writing the output failed";
        case EKO_ERR_TOO_LARGE: return "output larger than its length field can describe";
        case EKO_ERR_STATE: return "call out of order";
        default: return "unknown error";
    }
}

}  // namespace tekoj
