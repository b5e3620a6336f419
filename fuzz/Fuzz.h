#pragma once

#include <cstdio>
#include <cstdlib>
#include <initializer_list>

#include "fuzz/readers/Reading.h"

namespace appsync {

/// Stops the run when something that is promised of every input does not hold for this one.
inline int fuzz(ByteView bytes, std::initializer_list<Reader> readers) {
    for (const Reader reader : readers) {
        const Reading reading = reader(bytes);
        if (reading.broken.empty()) continue;
        std::fprintf(stderr, "%s\n", reading.broken.c_str());
        std::abort();
    }
    return 0;
}

}  // namespace appsync
