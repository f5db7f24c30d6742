#include <elf.h>
#include <link.h>

#include <cstring>
#include <fstream>
#include <iterator>

#include "faults/platform_calls.h"

namespace tavo::test::faults {
namespace {

std::string path_of(const std::string& library) {
    struct Search {
        const std::string& library;
        std::string path;
    } search{library, ""};
    dl_iterate_phdr(
        [](dl_phdr_info* info, size_t, void* opaque) {
            auto& wanted = *static_cast<Search*>(opaque);
            const std::string path = info->dlpi_name;
            const size_t slash = path.rfind('/');
            const size_t begin = slash == std::string::npos ? 0 : slash + 1;
            if (path.compare(begin, wanted.library.size(), wanted.library) == 0) wanted.path = path;
            return 0;
        },
        &search);
    return search.path;
}

template <typename Record>
const Record* at(const std::string& file, size_t offset) {
    return offset + sizeof(Record) <= file.size() ? reinterpret_cast<const Record*>(file.data() + offset) : nullptr;
}

}  // namespace

std::vector<std::string> imports_of(const std::string& library) {
    std::ifstream stream(path_of(library), std::ios::binary);
    const std::string file{std::istreambuf_iterator<char>(stream), {}};
    std::vector<std::string> names;
    const auto* header = at<ElfW(Ehdr)>(file, 0);
    if (header == nullptr) return names;
    const auto section = [&](size_t i) { return at<ElfW(Shdr)>(file, header->e_shoff + i * header->e_shentsize); };
    for (size_t i = 0; i < header->e_shnum; ++i) {
        if (section(i)->sh_type != SHT_DYNSYM) continue;
        const size_t strings = section(section(i)->sh_link)->sh_offset;
        for (size_t at_byte = sizeof(ElfW(Sym)); at_byte < section(i)->sh_size; at_byte += sizeof(ElfW(Sym))) {
            const auto* symbol = at<ElfW(Sym)>(file, section(i)->sh_offset + at_byte);
            if (symbol->st_shndx == SHN_UNDEF) names.emplace_back(file.data() + strings + symbol->st_name);
        }
    }
    return names;
}

}  // namespace tavo::test::faults
