// Captures what is written to the Android log, with the testing kit's means.
#pragma once

#include "tavo_osal/testing/gtest.hpp"
