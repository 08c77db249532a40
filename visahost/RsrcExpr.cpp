#include "visahost/RsrcExpr.h"

#include <cctype>
#include <cstdlib>
#include <cstring>

#include "visahost/Services.h"

namespace LbVisaHost {

namespace {

struct SAttrName {
    const char* m_szName;
    ViAttr m_nId;
};
const SAttrName g_asAttrNames[] = {
    {"VI_ATTR_RSRC_CLASS", VI_ATTR_RSRC_CLASS},
    {"VI_ATTR_RSRC_NAME", VI_ATTR_RSRC_NAME},
    {"VI_ATTR_RSRC_IMPL_VERSION", VI_ATTR_RSRC_IMPL_VERSION},
    {"VI_ATTR_RSRC_LOCK_STATE", VI_ATTR_RSRC_LOCK_STATE},
    {"VI_ATTR_MAX_QUEUE_LENGTH", VI_ATTR_MAX_QUEUE_LENGTH},
    {"VI_ATTR_SEND_END_EN", VI_ATTR_SEND_END_EN},
    {"VI_ATTR_TERMCHAR", VI_ATTR_TERMCHAR},
    {"VI_ATTR_TMO_VALUE", VI_ATTR_TMO_VALUE},
    {"VI_ATTR_SUPPRESS_END_EN", VI_ATTR_SUPPRESS_END_EN},
    {"VI_ATTR_TERMCHAR_EN", VI_ATTR_TERMCHAR_EN},
    {"VI_ATTR_MANF_NAME", VI_ATTR_MANF_NAME},
    {"VI_ATTR_MANF_ID", VI_ATTR_MANF_ID},
    {"VI_ATTR_MODEL_NAME", VI_ATTR_MODEL_NAME},
    {"VI_ATTR_MODEL_CODE", VI_ATTR_MODEL_CODE},
    {"VI_ATTR_INTF_INST_NAME", VI_ATTR_INTF_INST_NAME},
    {"VI_ATTR_INTF_TYPE", VI_ATTR_INTF_TYPE},
    {"VI_ATTR_INTF_NUM", VI_ATTR_INTF_NUM},
    {"VI_ATTR_RSRC_SPEC_VERSION", VI_ATTR_RSRC_SPEC_VERSION},
    {"VI_ATTR_RSRC_MANF_NAME", VI_ATTR_RSRC_MANF_NAME},
    {"VI_ATTR_RSRC_MANF_ID", VI_ATTR_RSRC_MANF_ID},
    {"VI_ATTR_USB_SERIAL_NUM", VI_ATTR_USB_SERIAL_NUM},
    {"VI_ATTR_USB_INTFC_NUM", VI_ATTR_USB_INTFC_NUM},
    {"VI_ATTR_USB_PROTOCOL", VI_ATTR_USB_PROTOCOL},
};

// Recursive-descent evaluator of an attribute expression; evaluates while it parses, so a
// short-circuited branch is still parsed (syntax errors anywhere are reported).
class CAttrParser {
public:
    CAttrParser(const std::string& strText, const CRsrcExpr::FCondition* pfCondition)
        : m_strText(strText), m_pfCondition(pfCondition)
    {
    }

    bool parse()
    {
        bool bResult = parseOr(m_pfCondition != nullptr);
        skipBlanks();
        if (m_nPos != m_strText.size())
            fail();
        return bResult;
    }

private:
    [[noreturn]] void fail() const { throw CRsrcExpr::CInvalidExpression("invalid attribute expression"); }
    void skipBlanks()
    {
        while (m_nPos < m_strText.size() && std::isspace(static_cast<unsigned char>(m_strText[m_nPos])))
            ++m_nPos;
    }
    bool eat(const char* szToken)
    {
        skipBlanks();
        size_t nLen = std::strlen(szToken);
        if (m_strText.compare(m_nPos, nLen, szToken) != 0)
            return false;
        m_nPos += nLen;
        return true;
    }
    bool parseOr(bool bEvaluate)
    {
        bool bResult = parseAnd(bEvaluate);
        while (eat("||"))
            bResult = parseAnd(bEvaluate && !bResult) || bResult;
        return bResult;
    }
    bool parseAnd(bool bEvaluate)
    {
        bool bResult = parseUnary(bEvaluate);
        while (eat("&&"))
            bResult = parseUnary(bEvaluate && bResult) && bResult;
        return bResult;
    }
    bool parseUnary(bool bEvaluate)
    {
        if (eat("!="))
            fail();
        // Nesting is bounded, so that no expression exhausts the stack.
        struct SDepth {
            explicit SDepth(CAttrParser& c) : m_c(c)
            {
                if (++m_c.m_nDepth > g_nMaxRegexNesting)
                    m_c.fail();
            }
            ~SDepth() { --m_c.m_nDepth; }
            CAttrParser& m_c;
        } sDepth(*this);
        if (eat("!"))
            return !parseUnary(bEvaluate);
        if (eat("(")) {
            bool bResult = parseOr(bEvaluate);
            if (!eat(")"))
                fail();
            return bResult;
        }
        return parseCondition(bEvaluate);
    }
    bool parseCondition(bool bEvaluate)
    {
        SAttrCondition sCond;
        skipBlanks();
        size_t nStart = m_nPos;
        while (m_nPos < m_strText.size() &&
               (std::isalnum(static_cast<unsigned char>(m_strText[m_nPos])) || m_strText[m_nPos] == '_'))
            ++m_nPos;
        std::string strName = m_strText.substr(nStart, m_nPos - nStart);
        bool bKnown = false;
        for (const SAttrName& sName : g_asAttrNames) {
            if (strName == sName.m_szName) {
                sCond.m_nAttr = sName.m_nId;
                bKnown = true;
            }
        }
        if (!bKnown)
            fail();
        static const struct {
            const char* m_szOp;
            ViUInt16 m_nOp;
        } s_asOps[] = {{"==", LBVISA_OP_EQ}, {"!=", LBVISA_OP_NE}, {"<=", LBVISA_OP_LE},
                       {">=", LBVISA_OP_GE}, {"<", LBVISA_OP_LT},  {">", LBVISA_OP_GT}};
        for (const auto& sOp : s_asOps) {
            if (eat(sOp.m_szOp)) {
                sCond.m_nOp = sOp.m_nOp;
                break;
            }
        }
        if (sCond.m_nOp == 0)
            fail();
        skipBlanks();
        if (m_nPos < m_strText.size() && (m_strText[m_nPos] == '\'' || m_strText[m_nPos] == '"')) {
            char cQuote = m_strText[m_nPos++];
            size_t nEnd = m_strText.find(cQuote, m_nPos);
            if (nEnd == std::string::npos)
                fail();
            sCond.m_bText = true;
            sCond.m_strText = m_strText.substr(m_nPos, nEnd - m_nPos);
            m_nPos = nEnd + 1;
            if (sCond.m_nOp != LBVISA_OP_EQ && sCond.m_nOp != LBVISA_OP_NE)
                fail();
            CVisaRegex cCheck(sCond.m_strText); // a text value is a regular expression
        } else {
            const char* szStart = m_strText.c_str() + m_nPos;
            char* szEnd = nullptr;
            long long nValue = std::strtoll(szStart, &szEnd, 0);
            if (szEnd == szStart)
                fail();
            sCond.m_nValue = static_cast<ViAttrState>(nValue);
            m_nPos += static_cast<size_t>(szEnd - szStart);
        }
        return bEvaluate && (*m_pfCondition)(sCond);
    }

    const std::string& m_strText;
    const CRsrcExpr::FCondition* m_pfCondition;
    size_t m_nPos = 0;
    unsigned m_nDepth = 0;
};

} // namespace

bool CRsrcExpr::matchesRegex(const std::string& strVisaRegex, const std::string& strText)
{
    return CVisaRegex(strVisaRegex).matches(strText);
}

// The regular-expression part ends at the first '{' that is neither escaped nor inside a set.
namespace {
size_t attributeStart(const std::string& strExpr)
{
    bool bInSet = false;
    for (size_t i = 0; i < strExpr.size(); ++i) {
        if (strExpr[i] == '\\')
            ++i;
        else if (strExpr[i] == '[')
            bInSet = true;
        else if (strExpr[i] == ']')
            bInSet = false;
        else if (strExpr[i] == '{' && !bInSet)
            return i;
    }
    return std::string::npos;
}
} // namespace

CRsrcExpr::CRsrcExpr(const std::string& strExpr) : m_cRegex(strExpr.substr(0, attributeStart(strExpr)))
{
    size_t nBrace = attributeStart(strExpr);
    if (nBrace != std::string::npos) {
        if (strExpr.back() != '}' || strExpr.size() - nBrace < 3)
            throw CInvalidExpression("invalid attribute expression");
        m_strAttributes = strExpr.substr(nBrace + 1, strExpr.size() - nBrace - 2);
        CAttrParser(m_strAttributes, nullptr).parse(); // syntax check only
    }
}

bool CRsrcExpr::matches(const std::string& strRsrc) const
{
    return m_cRegex.matches(strRsrc);
}

bool CRsrcExpr::matchesAttributes(const FCondition& fCondition) const
{
    if (m_strAttributes.empty())
        return true;
    return CAttrParser(m_strAttributes, &fCondition).parse();
}

} // namespace LbVisaHost
