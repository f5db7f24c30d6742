// Memory, strings, lists, files, processes, dynamic loading.
#include <dlfcn.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>

#include "faults/plan.h"
#include "faults/row.h"
#include "tavo_osal/dl.h"
#include "tavo_osal/file.h"
#include "tavo_osal/list.h"
#include "tavo_osal/log.h"
#include "tavo_osal/memory.h"
#include "tavo_osal/process.h"
#include "tavo_osal/string.h"

namespace tavo::test::faults {
namespace {

Line error(const char* tag, std::string text) { return {TAVO_LOG_ERROR, tag, std::move(text)}; }

// A row whose function makes no platform call, so that there is nothing to make fail; a run shows it.
Row plain(const char* symbol, long (*call)()) { return {symbol, {{"", nullptr, call, nullptr, {}}}}; }

constexpr char kPath[] = "/sdcard/file";
FILE* g_file;
void* g_block;
char g_text[64];

void make_file() {
    g_file = fopen(kPath, "w+e");
    fputs("12 line\n", g_file);
    rewind(g_file);
}
void drop_file(long) {
    if (g_file != nullptr) fclose(g_file);
    remove(kPath);
}

}  // namespace

std::vector<Row> memory_rows() {
    const auto give_back = [](long) { tavo_osal_mem_free(g_block); };
    const auto take = [](void* block) {
        g_block = block;
        return long{block != nullptr};
    };
    static const auto taken = take;
    return {
        {"tavo_osal_mem_malloc",
         {{"",
           nullptr,
           [] { return taken(tavo_osal_mem_malloc(32)); },
           give_back,
           {on({"malloc"}, {fails(0, {error("OSAL_MEM", "Memory not allocated. Size Requested: 32.\n")})})}}}},
        {"tavo_osal_mem_calloc",
         {{"",
           nullptr,
           [] { return taken(tavo_osal_mem_calloc(4, 8)); },
           give_back,
           {on({"calloc"}, {fails(0, {error("OSAL_MEM", "Memory not allocated\n")})})}}}},
        {"tavo_osal_mem_realloc",
         {{"",
           [] { g_block = tavo_osal_mem_malloc(8); },
           [] {
               void* const larger = tavo_osal_mem_realloc(g_block, 4096);
               if (larger != nullptr) g_block = larger;
               return long{larger != nullptr};
           },
           give_back,
           {on({"realloc"}, {fails(0, {error("OSAL_MEM", "Memory not allocated\n")})})}}}},
        {"tavo_osal_mem_free",
         {{"",
           [] { g_block = tavo_osal_mem_malloc(8); },
           [] { return tavo_osal_mem_free(g_block), 0L; },
           nullptr,
           {}}}},
        plain("tavo_osal_memset", [] { return long{tavo_osal_memset(g_text, 'a', 8) == g_text}; }),
        plain("tavo_osal_memcpy", [] { return long{tavo_osal_memcpy(g_text, "text", 5) == g_text}; }),
        plain("tavo_osal_memmove", [] { return long{tavo_osal_memmove(g_text, "text", 5) == g_text}; }),
        plain("tavo_osal_memcmp", [] { return long{tavo_osal_memcmp("text", "text", 4)}; }),
    };
}

std::vector<Row> string_rows() {
    static char text[] = "some text";
    const auto give_back = [](long) { tavo_osal_mem_free(g_block); };
    static const auto copied = [](char* copy) {
        g_block = copy;
        return long{copy != nullptr};
    };
    std::vector<Row> rows = {
        {"tavo_osal_string_duplicate_string",
         {{"",
           nullptr,
           [] { return copied(tavo_osal_string_duplicate_string(text)); },
           give_back,
           {on({"strdup"}, {fails(0)})}}}},
        {"tavo_osal_convert_string_to_upper",
         {{"",
           nullptr,
           [] { return copied(tavo_osal_convert_string_to_upper(text)); },
           give_back,
           {on({"strdup"}, {fails(0, {error("OSAL_STRING", "String duplication failed\n")})})}}}},
        {"tavo_osal_sprintf",
         {{"",
           nullptr,
           [] { return long{tavo_osal_sprintf(g_text, "%d", 12)}; },
           nullptr,
           {on({"vsprintf"}, {fails(-1)})}}}},
        {"tavo_osal_snprintf",
         {{"",
           nullptr,
           [] { return long{tavo_osal_snprintf(g_text, sizeof g_text, "%d", 12)}; },
           nullptr,
           {on({"vsnprintf"}, {fails(-1)})}}}},
        {"tavo_osal_sscanf",
         {{"",
           nullptr,
           [] {
               int number = 0;
               return long{tavo_osal_sscanf("12", "%d", &number)};
           },
           nullptr,
           {on({"__isoc99_vsscanf"}, {fails(-1)})}}}},
    };
    const Row plain_rows[] = {
        plain("tavo_osal_string_copy", [] { return long{tavo_osal_string_copy(g_text, text) == g_text}; }),
        plain("tavo_osal_string_num_copy", [] { return long{tavo_osal_string_num_copy(g_text, text, 4) == g_text}; }),
        plain("tavo_osal_string_concatenate",
              [] { return g_text[0] = '\0', long{tavo_osal_string_concatenate(g_text, text) == g_text}; }),
        plain("tavo_osal_string_num_concatenate",
              [] { return g_text[0] = '\0', long{tavo_osal_string_num_concatenate(g_text, text, 4) == g_text}; }),
        plain("tavo_osal_string_get_length", [] { return long{tavo_osal_string_get_length(text)}; }),
        plain("tavo_osal_string_search_string",
              [] { return long{tavo_osal_string_search_string(text, "text") - text}; }),
        plain("tavo_osal_string_search_character",
              [] { return long{tavo_osal_string_search_character(text, 'e') - text}; }),
        plain("tavo_osal_string_search_last_character",
              [] { return long{tavo_osal_string_search_last_character(text, 'e') - text}; }),
        plain("tavo_osal_string_scan_string", [] { return long{tavo_osal_string_scan_string(text, 'e') - text}; }),
        plain("tavo_osal_string_scan_string_rev",
              [] { return long{tavo_osal_string_scan_string_rev(text, 'e') - text}; }),
        plain("tavo_osal_string_compare", [] { return long{tavo_osal_string_compare(text, "some text")}; }),
        plain("tavo_osal_string_num_compare", [] { return long{tavo_osal_string_num_compare(text, "some", 4)}; }),
        plain("tavo_osal_case_ignore_string_compare",
              [] { return long{tavo_osal_case_ignore_string_compare(text, "SOME TEXT")}; }),
        plain("tavo_osal_case_ignore_string_num_compare",
              [] { return long{tavo_osal_case_ignore_string_num_compare(text, "SOME", 4)}; }),
        plain("tavo_osal_convert_string_to_num",
              [] {
                  long long number = 0;
                  return long{tavo_osal_convert_string_to_num("12", 10, &number)} + static_cast<long>(number);
              }),
    };
    rows.insert(rows.end(), std::begin(plain_rows), std::end(plain_rows));
    return rows;
}

std::vector<Row> file_rows() {
    static TAVO_ListNode head, node, other;
    return {
        plain("tavo_osal_init_list_head", [] { return tavo_osal_init_list_head(&head), 0L; }),
        plain("tavo_osal_list_insert",
              [] { return tavo_osal_init_list_head(&head), tavo_osal_list_insert(&node, &head, &head), 0L; }),
        plain("tavo_osal_list_add",
              [] { return tavo_osal_init_list_head(&head), tavo_osal_list_add(&node, &head), 0L; }),
        plain("tavo_osal_list_delete",
              [] {
                  tavo_osal_init_list_head(&head);
                  tavo_osal_list_add(&other, &head);
                  return tavo_osal_list_delete(&other), 0L;
              }),
        plain("tavo_osal_is_list_empty",
              [] { return tavo_osal_init_list_head(&head), long{tavo_osal_is_list_empty(&head)}; }),
        plain("tavo_osal_add_to_queue",
              [] { return tavo_osal_init_list_head(&head), tavo_osal_add_to_queue(&node, &head), 0L; }),
        plain("tavo_osal_remove_from_queue",
              [] {
                  tavo_osal_init_list_head(&head);
                  tavo_osal_add_to_queue(&node, &head);
                  return long{tavo_osal_remove_from_queue(&head) == &node};
              }),

        // The stream's functions answer as the platform's do, and say nothing.
        {"tavo_osal_fopen",
         {{"",
           nullptr,
           [] {
               g_file = tavo_osal_fopen(kPath, "w");
               return long{g_file != nullptr};
           },
           drop_file,
           {on({"fopen"}, {fails(0)})}}}},
        {"tavo_osal_fclose",
         {{"",
           make_file,
           [] { return long{tavo_osal_fclose(g_file)}; },
           [](long) { remove(kPath); },
           {on({"fclose"}, {fails(EOF)})}}}},
        {"tavo_osal_fgets",
         {{"",
           make_file,
           [] { return long{tavo_osal_fgets(g_text, sizeof g_text, g_file) != nullptr}; },
           drop_file,
           {on({"fgets"}, {fails(0)})}}}},
        {"tavo_osal_fread",
         {{"",
           make_file,
           [] { return long{tavo_osal_fread(g_text, 1, 4, g_file)}; },
           drop_file,
           {on({"fread"}, {fails(0)})}}}},
        {"tavo_osal_fwrite",
         {{"",
           make_file,
           [] { return long{tavo_osal_fwrite("text", 1, 4, g_file)}; },
           drop_file,
           {on({"fwrite"}, {fails(0)})}}}},
        {"tavo_osal_fprintf",
         {{"",
           make_file,
           [] { return long{tavo_osal_fprintf(g_file, "%d", 12)}; },
           drop_file,
           {on({"vfprintf"}, {fails(-1)})}}}},
        {"tavo_osal_fscanf",
         {{"",
           make_file,
           [] {
               int number = 0;
               return long{tavo_osal_fscanf(g_file, "%d", &number)};
           },
           drop_file,
           {on({"__isoc99_vfscanf"}, {fails(EOF)})}}}},
        {"tavo_osal_feof", {{"", make_file, [] { return long{tavo_osal_feof(g_file)}; }, drop_file, {}}}},
        {"tavo_osal_ferror", {{"", make_file, [] { return long{tavo_osal_ferror(g_file)}; }, drop_file, {}}}},
        {"tavo_osal_file_check_existence",
         {{"",
           make_file,
           [] { return long{tavo_osal_file_check_existence(kPath)}; },
           drop_file,
           {on({"stat"}, {fails(0, {error("OSAL_FILE", "File /sdcard/file does not exist.\n")})})}}}},
        {"tavo_osal_get_file_size",
         {{"",
           [] {
               make_file();
               fclose(g_file);
               g_file = nullptr;
           },
           [] { return static_cast<long>(tavo_osal_get_file_size(kPath)); },
           drop_file,
           {on({"fopen"}, {fails(-1, {error("OSAL_FILE", "Unable to open the file\n")})}),
            on({"fseek"}, {fails(-1, {error("OSAL_FILE", "Unable to seek end-of-file.\n")})}),
            on({"ftell"}, {fails(-1, {error("OSAL_FILE", "Error in getting file size. Errno = 5\n")})}),
            on({"fclose"}, {same()})}}}},
    };
}

std::vector<Row> process_rows() {
    static void* handle;
    static void* address;
    static constexpr char kExec[] = "OSAL_EXEC";
    static constexpr char kForkFailed[] = "Double Fork and Exec Failed!!!!!!!!!!!!!!!!!!!!!!!!!!\n";
    const auto open_object = [] { tavo_osal_dlopen("libm.so.6", RTLD_NOW, &handle); };
    return {
        {"tavo_osal_exec",
         {{"",
           nullptr,
           [] { return long{tavo_osal_exec("/bin/true", "true", nullptr)}; },
           nullptr,
           {on({"calloc"}, {fails(0x9001, {error("OSAL_MEM", "Memory not allocated\n")})}),
            on({"fork"}, {fails(0x9001, {error(kExec, kForkFailed)})}, 1),
            // In the first child: the caller is not told. The child says so, and returns to a copy of the caller.
            on({"fork"}, {same_but({error(kExec, kForkFailed)})}, 2),
            // In the grandchild, and the outputs: the caller is not told.
            on({"execv", "write", "waitpid", "printf", "fflush"}, {same()})},
           false,
           Side::kClient,
           false,
           true}}},
        {"tavo_osal_wait",
         {{"", nullptr, [] { return long{tavo_osal_wait(0)}; }, nullptr, {on({"sleep"}, {fails(1)})}}}},
        {"tavo_osal_system_call",
         {{"", nullptr, [] { return long{tavo_osal_system_call("true")}; }, nullptr, {on({"system"}, {fails(-1)})}}}},
        plain("tavo_osal_misc_math_ceil", [] { return long{tavo_osal_misc_math_ceil(1.5F)}; }),
        {"tavo_osal_dlopen",
         {{"",
           nullptr,
           [] { return long{tavo_osal_dlopen("libm.so.6", RTLD_NOW, &handle)}; },
           [](long result) {
               if (result == 0) tavo_osal_dlclose(handle);
           },
           {on({"dlopen"},
               {fails(0x9801, {error("OSAL_DL", "Failed to open libm.so.6\n"), error("OSAL_DL", "*\n")})})}}}},
        {"tavo_osal_dlsym",
         {{"",
           open_object,
           [] { return long{tavo_osal_dlsym(handle, "cos", &address)}; },
           [](long) { tavo_osal_dlclose(handle); },
           {on({"dlsym"},
               {fails(0x9802, {error("OSAL_DL", "Failed to find symbol  cos\n"), error("OSAL_DL", "*\n")})})}}}},
        {"tavo_osal_dlclose",
         {{"",
           open_object,
           [] { return long{tavo_osal_dlclose(handle)}; },
           [](long result) {
               if (result != 0) dlclose(handle);
           },
           {on({"dlclose"},
               {fails(0x9803, {error("OSAL_DL", "Failed to unload the shared object with handle : *\n")})})}}}},
    };
}

}  // namespace tavo::test::faults
