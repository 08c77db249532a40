// Version information on Windows: the module's VERSIONINFO resource, read with the version API.
#include "core/Version.h"

#include <windows.h>

namespace LbCore {

namespace {

// An address inside this module; its allocation base is the module handle.
const char s_cModuleAnchor = 0;

} // namespace

bool CVersion::readBlock(const std::string& path)
{
    DWORD handle = 0;
    const DWORD size = GetFileVersionInfoSizeA(path.c_str(), &handle);
    if (size == 0) {
        return false;
    }
    m_cBlock.resize(size);
    if (!GetFileVersionInfoA(path.c_str(), 0, size, m_cBlock.data())) {
        m_cBlock.clear();
        return false;
    }
    return true;
}

bool CVersion::queryValue(const std::string& path, const void*& value, std::size_t& size) const
{
    LPVOID pointer = 0;
    UINT length = 0;
    if (m_cBlock.empty() || !VerQueryValueA(m_cBlock.data(), path.c_str(), &pointer, &length)) {
        return false;
    }
    value = pointer;
    size = length;
    return true;
}

std::string CVersion::getModulePath()
{
    MEMORY_BASIC_INFORMATION memory;
    if (VirtualQuery(&s_cModuleAnchor, &memory, sizeof(memory)) == 0) {
        return std::string();
    }
    char path[MAX_PATH];
    const DWORD length = GetModuleFileNameA(static_cast<HMODULE>(memory.AllocationBase), path, MAX_PATH);
    return std::string(path, length);
}

} // namespace LbCore
