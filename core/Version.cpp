#include "core/Version.h"

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <memory>

namespace LbCore {

namespace {

const char* const c_szNoVersionInfo = "VersionInfo: can not retrieve version information";
const char* const c_szNoModuleName = "Can't get module name, please verify your system settings";
const int FIXED_WORDS = 13;

// The module's own version, built while the module loads. A module without version
// information must still load, so a failure is kept and thrown to whoever asks.
struct SModuleVersion {
    std::unique_ptr<CVersion> version;
    std::string failure;
};

SModuleVersion buildModuleVersion(const std::string& path)
{
    SModuleVersion result;
    try {
        if (path.empty()) {
            throw CVersion::CVersionException(c_szNoModuleName);
        }
        result.version.reset(new CVersion(path));
    } catch (const std::exception& e) {
        result.failure = e.what();
    }
    return result;
}

} // namespace

CVersion::CVersion(const std::string& path) : m_pbyFixedInfo(nullptr)
{
    if (!readBlock(path)) {
        throw CVersionException(c_szNoVersionInfo);
    }
    const void* value = nullptr;
    std::size_t size = 0;
    if (!queryValue("\\", value, size) || value == nullptr || size < FIXED_WORDS * sizeof(std::uint32_t)) {
        m_cBlock.clear();
        throw CVersionException(c_szNoVersionInfo);
    }
    m_pbyFixedInfo = static_cast<const unsigned char*>(value);
}

CVersion::~CVersion() { }

const CVersion& CVersion::getModuleVersion()
{
    // Function-local so that static objects built before this file's still find it.
    static const SModuleVersion s_cModuleVersion = buildModuleVersion(getModulePath());
    if (!s_cModuleVersion.version) {
        throw CVersionException(s_cModuleVersion.failure);
    }
    return *s_cModuleVersion.version;
}

namespace {
// Builds the module's own version while the module loads.
struct SModuleVersionAtLoad {
    SModuleVersionAtLoad()
    {
        try {
            CVersion::getModuleVersion();
        } catch (const std::exception&) {
        }
    }
} s_cModuleVersionAtLoad;
} // namespace

// Words 2 and 3 of the fixed record are the file version, 4 and 5 the product version.
std::uint32_t CVersion::getFixedWord(int index) const
{
    std::uint32_t word;
    std::memcpy(&word, m_pbyFixedInfo + index * sizeof(word), sizeof(word));
    return word;
}

std::uint16_t CVersion::getFileMajor() const
{
    return static_cast<std::uint16_t>(getFixedWord(2) >> 16);
}
std::uint16_t CVersion::getFileMinor() const
{
    return static_cast<std::uint16_t>(getFixedWord(2) & 0xFFFF);
}
std::uint16_t CVersion::getFileBuild() const
{
    return static_cast<std::uint16_t>(getFixedWord(3) >> 16);
}
std::uint16_t CVersion::getFileRevision() const
{
    return static_cast<std::uint16_t>(getFixedWord(3) & 0xFFFF);
}
std::uint16_t CVersion::getProductMajor() const
{
    return static_cast<std::uint16_t>(getFixedWord(4) >> 16);
}
std::uint16_t CVersion::getProductMinor() const
{
    return static_cast<std::uint16_t>(getFixedWord(4) & 0xFFFF);
}
std::uint16_t CVersion::getProductBuild() const
{
    return static_cast<std::uint16_t>(getFixedWord(5) >> 16);
}
std::uint16_t CVersion::getProductRevision() const
{
    return static_cast<std::uint16_t>(getFixedWord(5) & 0xFFFF);
}

std::string CVersion::getQueryValue(const std::string& key) const
{
    const CVersionException missing("CVersion::getQueryValue() can't get the value for the key:" + key);
    const void* value = nullptr;
    std::size_t size = 0;
    if (!queryValue("\\VarFileInfo\\Translation", value, size) || value == nullptr ||
        size < 2 * sizeof(std::uint16_t)) {
        throw missing;
    }
    std::uint16_t translation[2];
    std::memcpy(translation, value, sizeof(translation));

    // Only a plain key names a string value: an empty key or a path would name a block, and a
    // key too long for the path buffer is missing rather than cut short.
    if (key.empty() || key.find_first_of(std::string("\\\0", 2)) != std::string::npos) {
        throw missing;
    }
    char path[255];
    const int length =
        std::snprintf(path, sizeof(path), "%s%04x%04x%s%s", "\\StringFileInfo\\", static_cast<unsigned>(translation[0]),
                      static_cast<unsigned>(translation[1]), "\\", key.c_str());
    if (length < 0 || static_cast<std::size_t>(length) >= sizeof(path)) {
        throw missing;
    }
    if (!queryValue(path, value, size) || value == nullptr) {
        throw missing;
    }
    const char* text = static_cast<const char*>(value);
    return std::string(text, std::find(text, text + size, '\0'));
}

} // namespace LbCore
