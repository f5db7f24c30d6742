#include "tavo_osal/testing/platform_hook.hpp"

#include <dlfcn.h>
#include <elf.h>
#include <link.h>
#include <sys/mman.h>
#include <unistd.h>

#include <cstdint>
#include <cstdio>
#include <cstdlib>
#include <cstring>

namespace tavo::test {
namespace {

#if __ELF_NATIVE_CLASS == 64
constexpr size_t symbol_of(ElfW(Xword) info) { return static_cast<size_t>(ELF64_R_SYM(info)); }
#else
constexpr size_t symbol_of(ElfW(Word) info) { return static_cast<size_t>(ELF32_R_SYM(info)); }
#endif

// What the dynamic section of one loaded object says about its relocations.
struct Tables {
    uintptr_t base = 0;
    const ElfW(Sym) * symbols = nullptr;
    const char* strings = nullptr;
    uintptr_t plt = 0, rela = 0, rel = 0;
    size_t plt_size = 0, rela_size = 0, rel_size = 0;
    bool plt_has_addends = false;
};

struct Search {
    const ObjectFilter& wanted;
    const char* function;
    std::vector<void**> found;
};

Tables read_tables(const dl_phdr_info& info) {
    Tables tables;
    tables.base = info.dlpi_addr;
    const ElfW(Dyn)* entry = nullptr;
    for (int i = 0; i < info.dlpi_phnum; ++i) {
        if (info.dlpi_phdr[i].p_type == PT_DYNAMIC) {
            entry = reinterpret_cast<const ElfW(Dyn)*>(tables.base + info.dlpi_phdr[i].p_vaddr);
        }
    }
    for (; entry != nullptr && entry->d_tag != DT_NULL; ++entry) {
        const uintptr_t value = static_cast<uintptr_t>(entry->d_un.d_ptr);
        // glibc has made addresses of what are distances from the base in the file; other C libraries have not.
        const uintptr_t address = value < tables.base ? tables.base + value : value;
        switch (entry->d_tag) {
            case DT_SYMTAB: tables.symbols = reinterpret_cast<const ElfW(Sym)*>(address); break;
            case DT_STRTAB: tables.strings = reinterpret_cast<const char*>(address); break;
            case DT_JMPREL: tables.plt = address; break;
            case DT_PLTRELSZ: tables.plt_size = value; break;
            case DT_PLTREL: tables.plt_has_addends = value == DT_RELA; break;
            case DT_RELA: tables.rela = address; break;
            case DT_RELASZ: tables.rela_size = value; break;
            case DT_REL: tables.rel = address; break;
            case DT_RELSZ: tables.rel_size = value; break;
            default: break;
        }
    }
    return tables;
}

bool is_meant(const char* name, const char* function) {
    if (strcmp(name, function) == 0) return true;
    constexpr const char* kCheckedCalls[][2] = {{"poll", "__poll_chk"}, {"read", "__read_chk"}};
    for (const auto& [plain, checked] : kCheckedCalls) {
        if (strcmp(function, plain) == 0 && strcmp(name, checked) == 0) return true;
    }
    return false;
}

template <typename Relocation>
void scan(const Tables& tables, uintptr_t start, size_t size, Search& search) {
    const auto* relocation = reinterpret_cast<const Relocation*>(start);
    const auto* end = reinterpret_cast<const Relocation*>(start + size);
    for (; relocation < end; ++relocation) {
        const size_t index = symbol_of(relocation->r_info);
        if (index == 0) continue;
        if (is_meant(tables.strings + tables.symbols[index].st_name, search.function)) {
            search.found.push_back(reinterpret_cast<void**>(tables.base + relocation->r_offset));
        }
    }
}

int visit(dl_phdr_info* info, size_t, void* data) {
    Search& search = *static_cast<Search*>(data);
    const char* slash = strrchr(info->dlpi_name, '/');
    if (!search.wanted(slash != nullptr ? slash + 1 : info->dlpi_name)) return 0;

    const Tables tables = read_tables(*info);
    if (tables.plt_has_addends) {
        scan<ElfW(Rela)>(tables, tables.plt, tables.plt_size, search);
    } else {
        scan<ElfW(Rel)>(tables, tables.plt, tables.plt_size, search);
    }
    scan<ElfW(Rela)>(tables, tables.rela, tables.rela_size, search);
    scan<ElfW(Rel)>(tables, tables.rel, tables.rel_size, search);
    return 0;
}

// The table may have been made read-only after loading.
void write_slot(void** slot, void* value) {
    const auto page_size = static_cast<uintptr_t>(sysconf(_SC_PAGESIZE));
    void* page = reinterpret_cast<void*>(reinterpret_cast<uintptr_t>(slot) & ~(page_size - 1));
    if (mprotect(page, page_size, PROT_READ | PROT_WRITE) != 0) {
        perror("mprotect of a relocation table");
        abort();
    }
    __atomic_store_n(slot, value, __ATOMIC_SEQ_CST);
}

}  // namespace

PlatformHook::PlatformHook(const char* object, const char* function, void* replacement)
    : PlatformHook(object_named(object), function, replacement) {
    if (active()) return;
    fprintf(stderr, "%s does not import %s: there is nothing to hook\n", object, function);
    abort();
}

PlatformHook::PlatformHook(const ObjectFilter& objects, const char* function, void* replacement) {
    Search search{objects, function, {}};
    dl_iterate_phdr(visit, &search);
    for (void** slot : search.found) {
        slots_.push_back({slot, *slot});
        write_slot(slot, replacement);
    }
}

bool PlatformHook::imports(const char* object, const char* function) {
    Search search{object_named(object), function, {}};
    dl_iterate_phdr(visit, &search);
    return !search.found.empty();
}

PlatformHook::~PlatformHook() {
    for (const Slot& slot : slots_) write_slot(slot.address, slot.original);
}

ObjectFilter object_named(std::string beginning) {
    return [beginning = std::move(beginning)](const std::string& object) { return object.rfind(beginning, 0) == 0; };
}

void* function_named(const char* name) {
    void* const function = dlsym(RTLD_DEFAULT, name);
    if (function == nullptr) {
        fprintf(stderr, "no function %s: the library must be linked as a shared one\n", name);
        abort();
    }
    return function;
}

}  // namespace tavo::test
