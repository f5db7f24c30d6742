// Marks what libbinder.so exports; everything else in it is hidden.
#pragma once

#define LIBBINDER_EXPORT __attribute__((visibility("default")))
