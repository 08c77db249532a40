// Resource expressions of viFindRsrc: a VISA regular expression over the resource string,
// optionally followed by an attribute expression in braces, e.g. "?*::INSTR{VI_ATTR_MANF_ID==0x3F}".
//
// Regular expression: see VisaRegex.h. Attribute expression: conditions
// "ATTRIBUTE op value" (op ==, !=, <, >, <=, >=; value a number or a quoted string that is a
// regular expression for == and !=) joined by &&, ||, ! and parentheses.
// Every constructor throws CRsrcExpr::CInvalidExpression on bad syntax.
#ifndef LBVISAHOST_RSRCEXPR_H
#define LBVISAHOST_RSRCEXPR_H

#include <functional>
#include <string>

#include "visahost/VisaRegex.h"
#include "visahost/include/visa.h"

namespace LbVisaHost {

// One condition of an attribute expression.
struct SAttrCondition {
    ViAttr m_nAttr = 0;
    ViUInt16 m_nOp = 0; // LBVISA_OP_*
    bool m_bText = false;
    ViAttrState m_nValue = 0;
    std::string m_strText;
};

class CRsrcExpr {
public:
    using CInvalidExpression = LbVisaHost::CInvalidExpression;
    // Answers whether the resource satisfies one condition.
    using FCondition = std::function<bool(const SAttrCondition&)>;

    explicit CRsrcExpr(const std::string& strExpr);
    bool matches(const std::string& strRsrc) const;
    bool hasAttributes() const { return !m_strAttributes.empty(); }
    // Evaluates the attribute expression (true when there is none).
    bool matchesAttributes(const FCondition& fCondition) const;

    // Whether text matches a VISA regular expression (see VisaRegex.h); throws CInvalidExpression.
    static bool matchesRegex(const std::string& strVisaRegex, const std::string& strText);

private:
    CVisaRegex m_cRegex;
    std::string m_strAttributes;
};

} // namespace LbVisaHost

#endif
