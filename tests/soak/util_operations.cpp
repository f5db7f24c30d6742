#include <android/log.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <deque>
#include <string>
#include <vector>

#include "soak/failure.h"
#include "soak/message.h"
#include "soak/operations.h"
#include "tavo_osal/list.h"
#include "tavo_osal/log.h"
#include "tavo_osal/memory.h"
#include "tavo_osal/string.h"

namespace tavo::soak {
namespace {

// The latest line that the calling thread wrote to the log.
struct LogLine {
    int priority = -1;
    char tag[32] = "";
    char text[400] = "";
};
thread_local LogLine g_line;

std::string random_text(Random& random, unsigned most) {
    std::string text(random.below(most), ' ');
    for (char& c : text) c = static_cast<char>('A' + random.below(58));
    return text;
}

int sign(int value) { return (value > 0) - (value < 0); }

}  // namespace

void use_memory(Client& client) {
    const unsigned size = client.random.between(1, client.random.one_in(10) ? 200000 : 2000);
    const uint64_t seed = client.random.next();
    auto* block = static_cast<unsigned char*>(tavo_osal_mem_malloc(size));
    auto* zeroed = static_cast<unsigned char*>(tavo_osal_mem_calloc(size, 2));
    if (expect(block != nullptr && zeroed != nullptr, "no memory")) {
        fill(seed, block, size);
        unsigned sum = 0;
        for (unsigned i = 0; i < 2 * size; ++i) sum |= zeroed[i];
        expect(sum == 0, "tavo_osal_mem_calloc gave a block that is not zeroed");
        tavo_osal_memcpy(zeroed, block, size);
        expect(tavo_osal_memcmp(zeroed, block, size) == 0, "a copy differs");
        tavo_osal_memmove(zeroed + size / 2, zeroed, size);
        expect(first_difference(seed, zeroed + size / 2, size) == size, "a moved block is damaged");
        tavo_osal_memset(zeroed, 0x1a5, size);
        expect(zeroed[0] == 0xa5 && zeroed[size - 1] == 0xa5, "tavo_osal_memset did not fill");
        auto* larger = static_cast<unsigned char*>(tavo_osal_mem_realloc(block, size + client.random.below(5000)));
        if (larger != nullptr) block = larger;
        expect(larger != nullptr && first_difference(seed, block, size) == size, "tavo_osal_mem_realloc lost bytes");
    }
    tavo_osal_mem_free(zeroed);
    tavo_osal_mem_free(block);
}

void use_strings(Client& client) {
    const std::string a = random_text(client.random, 40), b = random_text(client.random, 40);
    char text[100];
    expect(tavo_osal_string_copy(text, a.c_str()) == text && tavo_osal_string_concatenate(text, b.c_str()) == text,
           "copying or joining did not answer with the target");
    const std::string both = a + b;
    expect(both == text && tavo_osal_string_get_length(text) == both.size(), "a joined text is wrong");
    expect(tavo_osal_string_search_string(text, b.c_str()) == text + both.find(b), "searching a text went wrong");
    const int c = 'A' + static_cast<int>(client.random.below(58));
    const auto first = both.find(static_cast<char>(c)), last = both.rfind(static_cast<char>(c));
    expect(tavo_osal_string_search_character(text, c) == (first == std::string::npos ? nullptr : text + first) &&
               tavo_osal_string_scan_string_rev(text, c) == (last == std::string::npos ? nullptr : text + last),
           "searching a character went wrong");
    expect(sign(tavo_osal_string_compare(a.c_str(), b.c_str())) == sign(a.compare(b)), "comparing went wrong");
    char* upper = tavo_osal_convert_string_to_upper(text);
    expect(upper != nullptr && tavo_osal_case_ignore_string_compare(upper, text) == 0, "upper case went wrong");
    char* copy = tavo_osal_string_duplicate_string(text);
    expect(copy != nullptr && both == copy, "a duplicate differs");
    tavo_osal_mem_free(upper);
    tavo_osal_mem_free(copy);

    const auto number = static_cast<int32_t>(client.random.next() >> 33U);  // never a limit: errno may be ERANGE
    long long read_back = 0;
    int scanned = 0;
    tavo_osal_snprintf(text, sizeof text, "%d", number);
    succeeds(tavo_osal_convert_string_to_num(text, 10, &read_back), "tavo_osal_convert_string_to_num");
    expect(tavo_osal_sscanf(text, "%d", &scanned) == 1, "tavo_osal_sscanf found nothing");
    expect(read_back == number && scanned == number, "a number did not come back");
    expect_status(tavo_osal_convert_string_to_num("99999999999", 10, &read_back), TAVO_OUT_OF_RANGE, "a large number");
}

void use_list(Client& client) {
    struct Entry {
        TAVO_ListNode node = {};
        int value = 0;
    };
    TAVO_ListNode head;
    tavo_osal_init_list_head(&head);
    std::vector<Entry> entries(client.random.between(1, 60));
    std::deque<int> model;
    for (size_t i = 0; i < entries.size(); ++i) {
        entries[i].value = static_cast<int>(i);
        if (client.random.one_in(2)) {
            tavo_osal_list_add(&entries[i].node, &head);
            model.push_front(entries[i].value);
        } else {
            tavo_osal_add_to_queue(&entries[i].node, &head);
            model.push_back(entries[i].value);
        }
        if (!client.random.one_in(4)) continue;
        auto* entry = reinterpret_cast<Entry*>(tavo_osal_remove_from_queue(&head));
        expect(entry != nullptr && entry->value == model.front() && entry->node.next == nullptr, "a wrong entry");
        model.pop_front();
    }
    expect(tavo_osal_is_list_empty(&head) == (model.empty() ? 1 : 0), "a list is empty that is not, or the reverse");
    const TAVO_ListNode* node = head.next;
    for (const int value : model) {
        if (!expect(node != &head && reinterpret_cast<const Entry*>(node)->value == value, "a list's order is wrong")) {
            return;
        }
        node = node->next;
    }
    expect(node == &head, "a list has too many entries");
}

void write_log(Client& client) {
    const auto level = client.random.below(TAVO_LOG_VERBOSE + 1);
    const unsigned number = client.random.below(1000000);
    g_line = {};
    tavo_print_log(level, 0, __LINE__, "SOAK", "message %u of %s\n", number, "the soak");
    const int line = __LINE__ - 1;
    if (level > g_uiMxEnabledLogLevel || level == TAVO_LOG_PERFORMANCE) {
        expect(g_line.priority < 0, "a line was logged whose level is not enabled");
        return;
    }
    char text[sizeof g_line.text];
    snprintf(text, sizeof text, "%d::message %u of the soak\n", line, number);
    const int priority = level == TAVO_LOG_ERROR     ? ANDROID_LOG_ERROR
                         : level == TAVO_LOG_WARNING ? ANDROID_LOG_WARN
                         : level == TAVO_LOG_INFO    ? ANDROID_LOG_INFO
                         : level == TAVO_LOG_DEBUG   ? ANDROID_LOG_DEBUG
                                                     : ANDROID_LOG_VERBOSE;
    expect(g_line.priority == priority && strcmp(g_line.tag, "SOAK") == 0 && strcmp(g_line.text, text) == 0,
           (std::string("a wrong log line: ") + g_line.text).c_str());
    const unsigned next = client.random.between(1, 5);
    tavo_set_log_preference(("SOAK -s -a -l" + std::to_string(next)).c_str(), nullptr, nullptr);
    expect(g_uiMxEnabledLogLevel == next, "a log preference was not taken");
}

}  // namespace tavo::soak

// In front of liblog's: what eight clients log is of no use to anybody else.
extern "C" [[gnu::visibility("default")]] int __android_log_vprint(int priority, const char* tag, const char* format,
                                                                   va_list values) {
    auto& line = tavo::soak::g_line;
    line.priority = priority;
    snprintf(line.tag, sizeof line.tag, "%s", tag != nullptr ? tag : "");
    return vsnprintf(line.text, sizeof line.text, format, values);
}

extern "C" [[gnu::visibility("default")]] int __android_log_print(int priority, const char* tag, const char* format,
                                                                  ...) {
    va_list values;
    va_start(values, format);
    const int count = __android_log_vprint(priority, tag, format, values);
    va_end(values);
    return count;
}
