// Where the library's messages end in the fuzz targets: written out in full, so that bad values in them are found,
// and then dropped.
#include <android/log.h>

#include <cstdarg>
#include <cstdio>

extern "C" [[gnu::visibility("default")]] int __android_log_vprint(int, const char*, const char* format,
                                                                   va_list values) {
    char line[512];
    return vsnprintf(line, sizeof line, format, values);
}

extern "C" [[gnu::visibility("default")]] int __android_log_print(int, const char*, const char* format, ...) {
    char line[512];
    va_list values;
    va_start(values, format);
    const int length = vsnprintf(line, sizeof line, format, values);
    va_end(values);
    return length;
}
