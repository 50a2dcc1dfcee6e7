#include "print_Hidden.h"

#include <cxxabi.h>
#include <elf.h>
#include <link.h>

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <iterator>
#include <map>
#include <mutex>
#include <string>

namespace hidden {
namespace {

// Every function and data symbol of the library, by demangled name.
std::map<std::string, void *> ReadSymbols() {
    struct Library {
        std::string path;
        ElfW(Addr) base = 0;
    } lib;
    dl_iterate_phdr(
        [](dl_phdr_info *info, size_t, void *data) {
            if (!info->dlpi_name || !std::strstr(info->dlpi_name, "libusbadapter.so")) return 0;
            *static_cast<Library *>(data) = {info->dlpi_name, info->dlpi_addr};
            return 1;
        },
        &lib);
    std::map<std::string, void *> out;
    std::ifstream in(lib.path, std::ios::binary);
    const std::string file{std::istreambuf_iterator<char>(in), std::istreambuf_iterator<char>()};
    if (file.size() < sizeof(ElfW(Ehdr))) return out;
    const auto *bytes = reinterpret_cast<const unsigned char *>(file.data());
    const auto *eh = reinterpret_cast<const ElfW(Ehdr) *>(bytes);
    const auto *sh = reinterpret_cast<const ElfW(Shdr) *>(bytes + eh->e_shoff);
    for (int i = 0; i < eh->e_shnum; ++i) {
        if (sh[i].sh_type != SHT_SYMTAB) continue;
        const auto *syms = reinterpret_cast<const ElfW(Sym) *>(bytes + sh[i].sh_offset);
        const char *names = reinterpret_cast<const char *>(bytes + sh[sh[i].sh_link].sh_offset);
        for (size_t s = 0; s < sh[i].sh_size / sizeof(ElfW(Sym)); ++s) {
            int type = ELF64_ST_TYPE(syms[s].st_info);
            if ((type != STT_FUNC && type != STT_OBJECT) || syms[s].st_value == 0) continue;
            const char *mangled = names + syms[s].st_name;
            int status = 0;
            char *plain = abi::__cxa_demangle(mangled, nullptr, nullptr, &status);
            out[status == 0 ? plain : mangled] = reinterpret_cast<void *>(lib.base + syms[s].st_value);
            std::free(plain);
        }
    }
    return out;
}

}  // namespace
void *Find(const char *name) {
    static std::mutex mu;
    static std::map<std::string, void *> symbols;
    std::lock_guard<std::mutex> lock(mu);
    if (symbols.empty()) symbols = ReadSymbols();  // empty until Java has loaded the library
    auto it = symbols.find(name);
    if (it == symbols.end()) {
        ADD_FAILURE() << "libusbadapter.so has no symbol " << name
                      << (symbols.empty() ? " (library not loaded, or stripped)" : "");
        return nullptr;
    }
    return it->second;
}

}  // namespace hidden
