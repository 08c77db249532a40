// CVisaRegex: the regular-expression part of a VISA resource expression.
//
// ? any one character, * / + zero / one or more of what precedes, [list] and [^list] character
// sets (ranges a-z; a ']' right after the opening is a member), a|b alternatives, (..) groups,
// \c a literal c. Matching covers the whole string and ignores case. Matching simulates the
// automaton for all positions at once, so its time is at most proportional to the length of
// the expression times the length of the string, whatever the expression.
// The constructor throws CInvalidExpression on bad syntax, and on groups nested deeper than
// g_nMaxRegexNesting.
#ifndef LBVISAHOST_VISAREGEX_H
#define LBVISAHOST_VISAREGEX_H

#include <bitset>
#include <cstddef>
#include <stdexcept>
#include <string>
#include <vector>

namespace LbVisaHost {

class CInvalidExpression : public std::runtime_error {
public:
    using std::runtime_error::runtime_error;
};

const unsigned g_nMaxRegexNesting = 64;

class CVisaRegex {
public:
    explicit CVisaRegex(const std::string& strExpr);
    bool matches(const std::string& strText) const;

private:
    enum EOp { OP_CONSUME, OP_SPLIT, OP_JUMP, OP_MATCH };
    struct SInst {
        EOp m_eOp;
        size_t m_nX; // OP_CONSUME: index of the character set; OP_SPLIT / OP_JUMP: target
        size_t m_nY; // OP_SPLIT: second target
    };
    class CParser;
    void addState(std::vector<size_t>& vList, std::vector<char>& vOn, size_t nStart) const;

    std::vector<SInst> m_vProgram;
    std::vector<std::bitset<256>> m_vSets;
};

} // namespace LbVisaHost

#endif
