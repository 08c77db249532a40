#ifndef LBCORE_VERSION_H
#define LBCORE_VERSION_H
// CVersion: the version information of one module file, read once at construction and
// read-only afterwards: the fixed version numbers and the string table. On Windows it is the
// VERSIONINFO resource; on Linux an equivalent record in the module file's ".lb_version"
// section (cmake/VersionInfo.cmake writes both). String values are looked up by the same key
// paths on both: '\StringFileInfo\<language><code page>\<key>' with the first translation
// of '\VarFileInfo\Translation'.
// Failures throw CVersionException: "VersionInfo: can not retrieve version information" when
// the file has no readable version information, "CVersion::getQueryValue() can't get the value
// for the key:<key>" for a missing string.
//
// getModuleVersion(): the version of the module (DLL, shared object or executable) whose code
// calls it, found from an address inside that module. The library is linked statically into
// several modules, so each module keeps its own private copy of this function.
#include <cstdint>
#include <stdexcept>
#include <string>
#include <vector>

#if defined(__GNUC__) && !defined(_WIN32)
#define LBCORE_MODULE_LOCAL __attribute__((visibility("hidden")))
#else
#define LBCORE_MODULE_LOCAL
#endif

namespace LbCore {

class CVersion {
public:
    class CVersionException : public std::runtime_error {
    public:
        explicit CVersionException(const std::string& message) : std::runtime_error(message) { }
    };

    explicit CVersion(const std::string& path);
    virtual ~CVersion();
    CVersion(const CVersion&) = delete;
    CVersion& operator=(const CVersion&) = delete;

    LBCORE_MODULE_LOCAL static const CVersion& getModuleVersion();

    std::uint16_t getFileMajor() const;
    std::uint16_t getFileMinor() const;
    std::uint16_t getFileBuild() const;
    std::uint16_t getFileRevision() const;
    std::uint16_t getProductMajor() const;
    std::uint16_t getProductMinor() const;
    std::uint16_t getProductBuild() const;
    std::uint16_t getProductRevision() const;

    std::string getQueryValue(const std::string& key) const;
    std::string getCompanyName() const { return getQueryValue("CompanyName"); }
    std::string getComments() const { return getQueryValue("Comments"); }
    std::string getFileDescription() const { return getQueryValue("FileDescription"); }
    std::string getFileVersion() const { return getQueryValue("FileVersion"); }
    std::string getInternalName() const { return getQueryValue("InternalName"); }
    std::string getLegalCopyright() const { return getQueryValue("LegalCopyright"); }
    std::string getLegalTrademarks() const { return getQueryValue("LegalTrademarks"); }
    std::string getOriginalFilename() const { return getQueryValue("OriginalFilename"); }
    std::string getPrivateBuild() const { return getQueryValue("PrivateBuild"); }
    std::string getProductName() const { return getQueryValue("ProductName"); }
    std::string getProductVersion() const { return getQueryValue("ProductVersion"); }
    std::string getSpecialBuild() const { return getQueryValue("SpecialBuild"); }

private:
    // Platform part: reads the file's version information into m_cBlock (false when it has
    // none) and looks a key path up inside it.
    bool readBlock(const std::string& path);
    // The file of the module that contains this copy of the library; empty when unknown.
    LBCORE_MODULE_LOCAL static std::string getModulePath();
    bool queryValue(const std::string& path, const void*& value, std::size_t& size) const;
    std::uint32_t getFixedWord(int index) const;

    std::vector<unsigned char> m_cBlock;
    // The fixed version record (VS_FIXEDFILEINFO layout: thirteen 32-bit words) inside m_cBlock.
    const unsigned char* m_pbyFixedInfo;
};

} // namespace LbCore

#endif
