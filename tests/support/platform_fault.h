// Makes the library's platform calls fail, with the testing kit's means.
#pragma once

#include "tavo_osal/testing/platform_hook.hpp"
