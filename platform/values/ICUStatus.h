// What ICU says of a call.
#pragma once

#include <unicode/utypes.h>

#include <new>

namespace platform::values {

// False for what ICU cannot do; lack of memory is thrown, as everywhere else.
inline bool succeeded(UErrorCode status) {
    if (status == U_MEMORY_ALLOCATION_ERROR) {
        throw std::bad_alloc();
    }
    return U_SUCCESS(status);
}

}  // namespace platform::values
