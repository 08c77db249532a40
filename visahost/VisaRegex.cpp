// Compiles a VISA regular expression to a small automaton program (consume a character of a
// set, split, jump, match) and runs it as a breadth-first simulation over the string.
#include "visahost/VisaRegex.h"

#include <cctype>
#include <memory>

namespace LbVisaHost {

// Recursive-descent parser that emits the program while it parses.
class CVisaRegex::CParser {
public:
    CParser(const std::string& strExpr, CVisaRegex& cOut) : m_strExpr(strExpr), m_cOut(cOut) { }

    void parse()
    {
        if (m_strExpr.empty())
            fail("empty expression");
        parseAlternatives(0);
        if (m_nPos != m_strExpr.size())
            fail("unbalanced parenthesis");
        emit(OP_MATCH, 0, 0);
    }

private:
    [[noreturn]] static void fail(const char* szWhy) { throw CInvalidExpression(szWhy); }
    size_t emit(EOp eOp, size_t nX, size_t nY)
    {
        m_cOut.m_vProgram.push_back(SInst{eOp, nX, nY});
        return m_cOut.m_vProgram.size() - 1;
    }
    bool atEnd() const { return m_nPos >= m_strExpr.size(); }
    char peek() const { return m_strExpr[m_nPos]; }

    // alternatives := sequence ('|' sequence)*
    void parseAlternatives(unsigned nDepth)
    {
        if (nDepth > g_nMaxRegexNesting)
            fail("groups nested too deeply");
        std::vector<size_t> vJumps; // ends of the branches, to the end of the alternatives
        for (;;) {
            size_t nSplit = emit(OP_SPLIT, m_cOut.m_vProgram.size() + 1, 0);
            parseSequence(nDepth);
            if (atEnd() || peek() != '|') {
                // The last branch: its split degenerates to a step into it.
                m_cOut.m_vProgram[nSplit] = SInst{OP_JUMP, nSplit + 1, 0};
                break;
            }
            ++m_nPos;
            vJumps.push_back(emit(OP_JUMP, 0, 0));
            m_cOut.m_vProgram[nSplit].m_nY = m_cOut.m_vProgram.size();
        }
        for (size_t nJump : vJumps)
            m_cOut.m_vProgram[nJump].m_nX = m_cOut.m_vProgram.size();
    }

    // sequence := (atom ('*' | '+')?)*
    void parseSequence(unsigned nDepth)
    {
        while (!atEnd() && peek() != '|' && peek() != ')') {
            size_t nAtom = m_cOut.m_vProgram.size();
            parseAtom(nDepth);
            if (atEnd() || (peek() != '*' && peek() != '+'))
                continue;
            char cQuantifier = m_strExpr[m_nPos++];
            if (!atEnd() && (peek() == '*' || peek() == '+'))
                fail("nothing to repeat");
            if (cQuantifier == '+') {
                emit(OP_SPLIT, nAtom, m_cOut.m_vProgram.size() + 1);
                continue;
            }
            // x*: split before x (into x or past the loop), jump back after x.
            m_cOut.m_vProgram.insert(m_cOut.m_vProgram.begin() + static_cast<std::ptrdiff_t>(nAtom),
                                     SInst{OP_SPLIT, 0, 0});
            for (size_t i = nAtom + 1; i < m_cOut.m_vProgram.size(); ++i) {
                SInst& s = m_cOut.m_vProgram[i];
                if (s.m_eOp == OP_SPLIT || s.m_eOp == OP_JUMP) {
                    if (s.m_nX >= nAtom)
                        ++s.m_nX;
                    if (s.m_eOp == OP_SPLIT && s.m_nY >= nAtom)
                        ++s.m_nY;
                }
            }
            emit(OP_JUMP, nAtom, 0);
            m_cOut.m_vProgram[nAtom] = SInst{OP_SPLIT, nAtom + 1, m_cOut.m_vProgram.size()};
        }
    }

    void parseAtom(unsigned nDepth)
    {
        char c = m_strExpr[m_nPos++];
        std::bitset<256> aSet;
        switch (c) {
        case '*':
        case '+':
            fail("nothing to repeat");
        case '(':
            parseAlternatives(nDepth + 1);
            if (atEnd() || peek() != ')')
                fail("unbalanced parenthesis");
            ++m_nPos;
            return;
        case '?':
            aSet.set();
            break;
        case '[':
            aSet = parseSet();
            break;
        case '\\':
            if (atEnd())
                fail("trailing backslash");
            addFolded(aSet, static_cast<unsigned char>(m_strExpr[m_nPos++]));
            break;
        default:
            addFolded(aSet, static_cast<unsigned char>(c));
            break;
        }
        m_cOut.m_vSets.push_back(aSet);
        emit(OP_CONSUME, m_cOut.m_vSets.size() - 1, 0);
    }

    static void addFolded(std::bitset<256>& aSet, unsigned char c)
    {
        aSet.set(c);
        aSet.set(static_cast<unsigned char>(std::toupper(c)));
        aSet.set(static_cast<unsigned char>(std::tolower(c)));
    }

    std::bitset<256> parseSet()
    {
        std::bitset<256> aSet;
        bool bNegated = !atEnd() && peek() == '^';
        if (bNegated)
            ++m_nPos;
        bool bFirst = true;
        for (;;) {
            if (atEnd())
                fail("unterminated character set");
            unsigned char c = static_cast<unsigned char>(m_strExpr[m_nPos++]);
            if (c == ']' && !bFirst)
                break;
            bFirst = false;
            if (m_nPos + 1 < m_strExpr.size() && peek() == '-' && m_strExpr[m_nPos + 1] != ']') {
                unsigned char cLast = static_cast<unsigned char>(m_strExpr[m_nPos + 1]);
                if (cLast < c)
                    fail("invalid range");
                for (unsigned n = c; n <= cLast; ++n)
                    addFolded(aSet, static_cast<unsigned char>(n));
                m_nPos += 2;
            } else {
                addFolded(aSet, c);
            }
        }
        return bNegated ? ~aSet : aSet;
    }

    const std::string& m_strExpr;
    CVisaRegex& m_cOut;
    size_t m_nPos = 0;
};

CVisaRegex::CVisaRegex(const std::string& strExpr)
{
    CParser(strExpr, *this).parse();
}

// Adds the state nStart and every state reachable from it without consuming a character.
void CVisaRegex::addState(std::vector<size_t>& vList, std::vector<char>& vOn, size_t nStart) const
{
    std::vector<size_t> vStack{nStart};
    while (!vStack.empty()) {
        size_t n = vStack.back();
        vStack.pop_back();
        if (vOn[n])
            continue;
        vOn[n] = 1;
        const SInst& s = m_vProgram[n];
        if (s.m_eOp == OP_JUMP) {
            vStack.push_back(s.m_nX);
        } else if (s.m_eOp == OP_SPLIT) {
            vStack.push_back(s.m_nY);
            vStack.push_back(s.m_nX);
        } else {
            vList.push_back(n);
        }
    }
}

bool CVisaRegex::matches(const std::string& strText) const
{
    std::vector<size_t> vCurrent, vNext;
    std::vector<char> vOn(m_vProgram.size(), 0);
    addState(vCurrent, vOn, 0);
    for (char c : strText) {
        std::fill(vOn.begin(), vOn.end(), 0);
        vNext.clear();
        for (size_t n : vCurrent) {
            const SInst& s = m_vProgram[n];
            if (s.m_eOp == OP_CONSUME && m_vSets[s.m_nX].test(static_cast<unsigned char>(c)))
                addState(vNext, vOn, n + 1);
        }
        vCurrent.swap(vNext);
        if (vCurrent.empty())
            return false;
    }
    for (size_t n : vCurrent)
        if (m_vProgram[n].m_eOp == OP_MATCH)
            return true;
    return false;
}

} // namespace LbVisaHost
