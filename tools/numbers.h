// Numbers as people type them.
#pragma once

#include <chrono>
#include <cstddef>
#include <cstdint>
#include <string>

namespace tavo::tool {

// A key of a queue or a block: any 32-bit number but 0, decimal or with 0x in front. Numbers above 2,147,483,647 are
// the negative ones that the service takes them for. Throws Misuse.
int32_t parse_key(const std::string& text);

// A key of a semaphore, whose file is called by it: 0 to 4,294,967,295. Throws Misuse.
uint32_t parse_semaphore_key(const std::string& text);

// Bytes: a whole number, with K, M or G behind it for powers of 1024. Throws Misuse.
uint64_t parse_size(const std::string& text);

// Seconds with a fraction; negative stands for no limit, which is poll's -1. At most a day.
std::chrono::milliseconds milliseconds_of(double seconds);

// In powers of 1024: 1234567 is 1.2M.
std::string short_number(double value);

}  // namespace tavo::tool
