/* What the demo's sender and receiver have agreed on: the key, and what message number n looks like. */
#ifndef DEMO_MESSAGES_H
#define DEMO_MESSAGES_H

#include <stdint.h>
#include <string.h>

#define DEMO_KEY "7"
#define DEMO_MESSAGES 20000U
#define DEMO_MAX_SIZE 65536U

/* Sizes from the bare prefix to 64 KiB, mixed. */
static inline uint32_t demo_size(uint32_t number) {
    static const uint32_t sizes[] = {0, 1, 16, 100, 1024, 4092, 4096, 10000, 16384, DEMO_MAX_SIZE};
    return sizes[(number * 7U) % (sizeof sizes / sizeof sizes[0])];
}

/* Fills a message with bytes that tell its number and every place in it apart. */
static inline void demo_fill(unsigned char* message, uint32_t number, uint32_t size) {
    uint64_t state = 0x9e3779b97f4a7c15ULL * (number + 1ULL);
    for (uint32_t at = 0; at < size; at += (uint32_t)sizeof state) {
        const uint32_t rest = size - at;
        state ^= state << 13;
        state ^= state >> 7;
        state ^= state << 17;
        memcpy(message + at, &state, rest < sizeof state ? rest : sizeof state);
    }
}

/* FNV-1a over 64-bit words, then bytes: the same on both sides. */
static inline uint64_t demo_checksum(uint64_t sum, const unsigned char* bytes, uint32_t size) {
    uint32_t at = 0;
    for (uint64_t word; size - at >= sizeof word; at += (uint32_t)sizeof word) {
        memcpy(&word, bytes + at, sizeof word);
        sum = (sum ^ word) * 0x100000001b3ULL;
    }
    for (; at < size; ++at) sum = (sum ^ bytes[at]) * 0x100000001b3ULL;
    return sum;
}

#endif
