/**
 * @file
 * The C++ interface: owning, movable objects over the C API's handles, std::chrono for times, std::error_code for
 * failures. Header-only, C++17; a program that uses it links to the library as for the C API, which it includes.
 */
#ifndef TAVO_OSAL_HPP
#define TAVO_OSAL_HPP

#include "tavo_osal.h"
#include "tavo_osal/cpp/condition.hpp"
#include "tavo_osal/cpp/error.hpp"
#include "tavo_osal/cpp/event.hpp"
#include "tavo_osal/cpp/message_queue.hpp"
#include "tavo_osal/cpp/mutex.hpp"
#include "tavo_osal/cpp/semaphore.hpp"
#include "tavo_osal/cpp/shared_block.hpp"
#include "tavo_osal/cpp/thread.hpp"
#include "tavo_osal/cpp/timer.hpp"

#endif
