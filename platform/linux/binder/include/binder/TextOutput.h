// Where text that describes an object goes.
#pragma once

#include <binder/Export.h>
#include <utils/Errors.h>

#include <cstddef>

namespace android {

class LIBBINDER_EXPORT TextOutput {
public:
    TextOutput();
    virtual ~TextOutput();

    virtual status_t print(const char* txt, size_t len) = 0;
    virtual void moveIndent(int delta) = 0;
    virtual void pushBundle() = 0;
    virtual void popBundle() = 0;
};

}  // namespace android
