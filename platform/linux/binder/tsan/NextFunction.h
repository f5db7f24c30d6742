// The library function that one of ours stands in front of.
#pragma once

#include <dlfcn.h>

#include <cstdlib>

namespace android {

template <typename Function>
Function nextFunction(const char* name) {
    void* function = dlsym(RTLD_NEXT, name);
    if (function == nullptr) abort();
    return reinterpret_cast<Function>(function);
}

}  // namespace android
