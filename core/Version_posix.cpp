// Version information on Linux: cmake/VersionInfo.cmake compiles a record into the module's
// ".lb_version" section; it is read back from the module file through the ELF section table.
// Record layout (native byte order):
//   char magic[8] = "LBVERS1"; uint32 fixed[13] (VS_FIXEDFILEINFO layout);
//   uint16 language, code page; then key\0value\0 pairs, ended by an empty key.
// The file is untrusted input: every offset and size is checked against what was read.
#include "core/Version.h"

#include <cstdio>
#include <cstring>
#include <dlfcn.h>
#include <elf.h>
#include <fstream>
#include <link.h>
#include <unistd.h>

namespace LbCore {

namespace {

const char SECTION_NAME[] = ".lb_version";
const char MAGIC[8] = {'L', 'B', 'V', 'E', 'R', 'S', '1', '\0'};
const std::size_t FIXED_OFFSET = 8;
const std::size_t FIXED_SIZE = 13 * 4;
const std::size_t TRANSLATION_OFFSET = FIXED_OFFSET + FIXED_SIZE;
const std::size_t STRINGS_OFFSET = TRANSLATION_OFFSET + 4;
const std::uint64_t c_nMaxSection = 1 << 20;

// An address inside this module; dladdr names the module that holds it.
const char s_cModuleAnchor = 0;

bool readAt(std::ifstream& file, std::uint64_t offset, void* buffer, std::uint64_t size)
{
    file.clear();
    file.seekg(static_cast<std::streamoff>(offset));
    file.read(static_cast<char*>(buffer), static_cast<std::streamsize>(size));
    return file.good();
}

bool equalsIgnoringCase(const char* left, const char* right)
{
    for (; *left != '\0' && *right != '\0'; ++left, ++right) {
        const char l = (*left >= 'A' && *left <= 'Z') ? static_cast<char>(*left - 'A' + 'a') : *left;
        const char r = (*right >= 'A' && *right <= 'Z') ? static_cast<char>(*right - 'A' + 'a') : *right;
        if (l != r) {
            return false;
        }
    }
    return *left == *right;
}

bool startsWithIgnoringCase(const std::string& text, const std::string& prefix)
{
    return text.size() >= prefix.size() && equalsIgnoringCase(text.substr(0, prefix.size()).c_str(), prefix.c_str());
}

} // namespace

bool CVersion::readBlock(const std::string& path)
{
    std::ifstream file(path.c_str(), std::ios::binary);
    if (!file) {
        return false;
    }
    file.seekg(0, std::ios::end);
    const std::uint64_t fileSize = static_cast<std::uint64_t>(file.tellg());

    Elf64_Ehdr header;
    if (fileSize < sizeof(header) || !readAt(file, 0, &header, sizeof(header))) {
        return false;
    }
    if (std::memcmp(header.e_ident, ELFMAG, SELFMAG) != 0 || header.e_ident[EI_CLASS] != ELFCLASS64 ||
        header.e_shentsize != sizeof(Elf64_Shdr) || header.e_shnum == 0 || header.e_shstrndx >= header.e_shnum ||
        header.e_shoff > fileSize || header.e_shnum * sizeof(Elf64_Shdr) > fileSize - header.e_shoff) {
        return false;
    }
    std::vector<Elf64_Shdr> sections(header.e_shnum);
    if (!readAt(file, header.e_shoff, sections.data(), sections.size() * sizeof(Elf64_Shdr))) {
        return false;
    }
    const Elf64_Shdr& names = sections[header.e_shstrndx];
    if (names.sh_offset > fileSize || names.sh_size > fileSize - names.sh_offset || names.sh_size > c_nMaxSection) {
        return false;
    }
    std::vector<char> nameTable(names.sh_size + 1, '\0');
    if (!readAt(file, names.sh_offset, nameTable.data(), names.sh_size)) {
        return false;
    }
    for (const Elf64_Shdr& section : sections) {
        if (section.sh_name >= names.sh_size || std::strcmp(&nameTable[section.sh_name], SECTION_NAME) != 0) {
            continue;
        }
        if (section.sh_type == SHT_NOBITS || section.sh_offset > fileSize ||
            section.sh_size > fileSize - section.sh_offset || section.sh_size < STRINGS_OFFSET ||
            section.sh_size > c_nMaxSection) {
            return false;
        }
        m_cBlock.resize(section.sh_size);
        if (!readAt(file, section.sh_offset, m_cBlock.data(), m_cBlock.size()) ||
            std::memcmp(m_cBlock.data(), MAGIC, sizeof(MAGIC)) != 0) {
            m_cBlock.clear();
            return false;
        }
        return true;
    }
    return false;
}

bool CVersion::queryValue(const std::string& path, const void*& value, std::size_t& size) const
{
    if (m_cBlock.size() < STRINGS_OFFSET) {
        return false;
    }
    if (path == "\\") {
        value = &m_cBlock[FIXED_OFFSET];
        size = FIXED_SIZE;
        return true;
    }
    if (equalsIgnoringCase(path.c_str(), "\\VarFileInfo\\Translation")) {
        value = &m_cBlock[TRANSLATION_OFFSET];
        size = 4;
        return true;
    }
    // '\StringFileInfo\<language><code page>\<key>' for the one translation of the record.
    const std::string prefix = "\\StringFileInfo\\";
    if (!startsWithIgnoringCase(path, prefix) || path.size() < prefix.size() + 9 || path[prefix.size() + 8] != '\\') {
        return false;
    }
    std::uint16_t translation[2];
    std::memcpy(translation, &m_cBlock[TRANSLATION_OFFSET], sizeof(translation));
    char expected[9];
    std::snprintf(expected, sizeof(expected), "%04x%04x", static_cast<unsigned>(translation[0]),
                  static_cast<unsigned>(translation[1]));
    if (!equalsIgnoringCase(path.substr(prefix.size(), 8).c_str(), expected)) {
        return false;
    }
    const std::string key = path.substr(prefix.size() + 9);

    const char* cursor = reinterpret_cast<const char*>(&m_cBlock[STRINGS_OFFSET]);
    const char* const end = reinterpret_cast<const char*>(m_cBlock.data() + m_cBlock.size());
    while (cursor < end && *cursor != '\0') {
        const char* const keyEnd = static_cast<const char*>(std::memchr(cursor, '\0', end - cursor));
        if (keyEnd == nullptr || keyEnd + 1 >= end) {
            return false;
        }
        const char* const text = keyEnd + 1;
        const char* const textEnd = static_cast<const char*>(std::memchr(text, '\0', end - text));
        if (textEnd == nullptr) {
            return false;
        }
        if (equalsIgnoringCase(cursor, key.c_str())) {
            value = text;
            size = static_cast<std::size_t>(textEnd - text) + 1;
            return true;
        }
        cursor = textEnd + 1;
    }
    return false;
}

std::string CVersion::getModulePath()
{
    Dl_info info;
    struct link_map* module = nullptr;
    if (dladdr1(&s_cModuleAnchor, &info, reinterpret_cast<void**>(&module), RTLD_DL_LINKMAP) == 0 ||
        module == nullptr) {
        return std::string();
    }
    if (module->l_name != nullptr && module->l_name[0] != '\0') {
        return module->l_name;
    }
    // The main program's entry has no name; the kernel knows its file.
    char path[4096];
    const ssize_t length = readlink("/proc/self/exe", path, sizeof(path) - 1);
    return length > 0 ? std::string(path, static_cast<std::size_t>(length)) : std::string();
}

} // namespace LbCore
