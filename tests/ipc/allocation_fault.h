// Lets one allocation of the library's fail.
#pragma once

#include <cstdlib>
#include <new>
#include <string>
#include <vector>

#include "support/platform_fault.h"

namespace tavo::test {

// The sizes asked for, and which of the requests, counted from 1, is refused; 0 refuses none.
inline std::vector<size_t> g_allocations;
inline size_t g_refused_allocation = 0;

class AllocationFault {
public:
    enum Function { kMalloc, kCalloc, kRealloc, kNew, kNothrowNew };

    AllocationFault(Function function, size_t refused, const char* library = "libtavoosal.so")
        : hook_(library, name_of(function), replacement_of(function)) {
        g_allocations.clear();
        g_refused_allocation = refused;
    }

private:
    static bool refuse(size_t size) {
        g_allocations.push_back(size);
        return g_allocations.size() == g_refused_allocation;
    }
    static void* test_malloc(size_t size) { return refuse(size) ? nullptr : malloc(size); }
    static void* test_calloc(size_t count, size_t size) { return refuse(count * size) ? nullptr : calloc(count, size); }
    static void* test_realloc(void* block, size_t size) { return refuse(size) ? nullptr : realloc(block, size); }
    static void* test_new(size_t size) {
        if (refuse(size)) throw std::bad_alloc();
        return operator new(size);
    }
    static void* test_nothrow_new(size_t size, const std::nothrow_t& tag) {
        return refuse(size) ? nullptr : operator new(size, tag);
    }

    static const char* name_of(Function function) {
        static const std::string nothrow_new = std::string(kOperatorNew) + "RKSt9nothrow_t";
        switch (function) {
            case kMalloc: return "malloc";
            case kCalloc: return "calloc";
            case kRealloc: return "realloc";
            case kNew: return kOperatorNew;
            default: return nothrow_new.c_str();
        }
    }
    static void* replacement_of(Function function) {
        switch (function) {
            case kMalloc: return reinterpret_cast<void*>(test_malloc);
            case kCalloc: return reinterpret_cast<void*>(test_calloc);
            case kRealloc: return reinterpret_cast<void*>(test_realloc);
            case kNew: return reinterpret_cast<void*>(test_new);
            default: return reinterpret_cast<void*>(test_nothrow_new);
        }
    }

    const PlatformHook hook_;
};

}  // namespace tavo::test
