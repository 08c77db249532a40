// Resource expressions of viFindRsrc from applications, split at the first line feed into an
// expression and a resource string: construction fails only with CInvalidExpression, matching
// always ends (each input has a time limit: fuzz/rsrcexpr.options), the attribute part is
// evaluated whatever the callback answers, and the resource string escaped character by
// character is an expression that matches it.
#include <cstdint>
#include <cstdlib>
#include <string>

#include "visahost/RsrcExpr.h"

using LbVisaHost::CRsrcExpr;
using LbVisaHost::CVisaRegex;

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    const std::string strInput(reinterpret_cast<const char*>(data), size);
    const std::string::size_type nSplit = strInput.find('\n');
    const std::string strExpr = strInput.substr(0, nSplit);
    const std::string strRsrc = nSplit == std::string::npos ? std::string() : strInput.substr(nSplit + 1);
    try {
        CRsrcExpr cExpr(strExpr);
        cExpr.matches(strRsrc);
        unsigned nCalls = 0;
        cExpr.matchesAttributes([&](const LbVisaHost::SAttrCondition&) { return ++nCalls % 2 == 0; });
    } catch (const CRsrcExpr::CInvalidExpression&) {
    }
    if (!strRsrc.empty()) {
        std::string strEscaped;
        for (char c : strRsrc) {
            strEscaped += '\\';
            strEscaped += c;
        }
        if (!CVisaRegex(strEscaped).matches(strRsrc))
            std::abort();
    }
    return 0;
}
