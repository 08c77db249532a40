#include "sensor/PmxScpiCommandParser.h"

#include <gtest/gtest.h>

#include <utility>
#include <vector>

using LbPmxVisa::CPmxScpiCommandParser;
using LbPmxVisa::scpiCompare;

namespace {

void expectKinds(CPmxScpiCommandParser::ECommandType kind, const std::vector<std::string>& commands)
{
    for (const std::string& command : commands) {
        EXPECT_EQ(kind, CPmxScpiCommandParser::getInstance().parse(command)) << "command '" << command << "'";
    }
}

} // namespace

TEST(ScpiCommandParser, RecognisesTheErrorQueryInLongAndShortForms)
{
    expectKinds(CPmxScpiCommandParser::COMMAND_SYSTEM_ERROR_QUERY,
                {"syst:err?", "system:error?", "SYST:ERROR?", "System:Err?", "syst:err?\nmore text", "syst:err?\n",
                 "syst:err?\r\n", "syst:err? ", "syst:err?\t\r \n"});
    expectKinds(CPmxScpiCommandParser::COMMAND_OTHER,
                {"syst:erro?", "syst:err", "syste:err?", " syst:err?", "syst:err?\r?", "\"syst:err?\"",
                 "syst:err:next?", "syst?", "syst:err?;", "syst:err?:", "syst::err?"});
}

TEST(ScpiCommandParser, RecognisesTheOperationConditionQuery)
{
    expectKinds(CPmxScpiCommandParser::COMMAND_OPERATION_CONDITION_QUERY,
                {"stat:oper:cond?", "status:operation:condition?", "STAT:OPERATION:COND?", "stat:oper:cond?\r\n"});
    expectKinds(CPmxScpiCommandParser::COMMAND_OTHER, {"stat:oper?", "stat:oper:cond", "stat:oper:cond:x?"});
}

TEST(ScpiCommandParser, RecognisesTheFormatCommandsAfterNormalising)
{
    expectKinds(CPmxScpiCommandParser::COMMAND_FORMAT_ASCII,
                {"format ascii", " format  ascii\r\n", "\t\rformat ascii \t"});
    expectKinds(CPmxScpiCommandParser::COMMAND_FORMAT_REAL32,
                {"format real , 32", "format real,32", "format   real  ,  32", "  format   real , 32 \r"});
    expectKinds(CPmxScpiCommandParser::COMMAND_OTHER,
                {"format\tascii", "format real,64", "form asc", "FORMAT ASCII", "format", "format ascii x",
                 "formatascii", "format real,,32"});
}

TEST(ScpiCommandParser, TreatsEmptyAndOddInputAsASensorCommand)
{
    expectKinds(CPmxScpiCommandParser::COMMAND_OTHER,
                {"", "\n", "?", ":", "\"", "\"\"", "\n syst:err?", "*idn?", std::string("syst:err?\0?", 11)});
}

TEST(ScpiCommandParser, NormalizesBlanksAndCommas)
{
    const CPmxScpiCommandParser& parser = CPmxScpiCommandParser::getInstance();
    EXPECT_EQ("format real,32", parser.normalize("  format   real , 32 \r"));
    EXPECT_EQ("a,b,,c", parser.normalize("a  ,  b , ,c"));
    EXPECT_EQ("a,,b", parser.normalize("a , , b"));
    EXPECT_EQ("a\t b", parser.normalize("\n a\t  b\t\n"));
    EXPECT_EQ("", parser.normalize(" \r\n\t"));
}

TEST(ScpiCompare, ComparesHeadersLikeAStringComparison)
{
    EXPECT_EQ(0, scpiCompare("FETCh?", "fetc?"));
    EXPECT_EQ(0, scpiCompare("FETCh?", "fetch?"));
    EXPECT_EQ(0, scpiCompare("FETCh?", "FETCH?"));
    EXPECT_EQ(1, scpiCompare("FETCh?", "fetch"));
    EXPECT_EQ(-1, scpiCompare("FETCh?", "fetch:all?"));
    EXPECT_EQ(1, scpiCompare("FETCh?", ""));
    EXPECT_EQ(1, scpiCompare("FETCh?", "?")); // no mnemonic left to match

    // A pattern without "?" accepts the input with or without it.
    EXPECT_EQ(0, scpiCompare("FETCh", "fetch"));
    EXPECT_EQ(0, scpiCompare("FETCh", "fetc?"));

    // A mismatch reports the order of the short form against the input.
    EXPECT_GT(scpiCompare("FETCh?", "fetb?"), 0);
    EXPECT_LT(scpiCompare("FETCh?", "fetd?"), 0);
    EXPECT_GT(scpiCompare("FETCh?", "fet?"), 0);
    EXPECT_LT(scpiCompare("FETCh?", "fetchx?"), 0);

    // Enclosing quotes are dropped before the mnemonics are compared.
    EXPECT_EQ(0, scpiCompare("\"FETCh\"", "fetch"));
    EXPECT_EQ(1, scpiCompare("FETCh?", "\"fetch?\"")); // ends with the quote, not "?"
}

TEST(ScpiCompare, HandlesNullPointers)
{
    const char* text = "fetch?";
    EXPECT_EQ(0, scpiCompare(text, text));
    EXPECT_EQ(0, scpiCompare(nullptr, nullptr));
    EXPECT_EQ(-1, scpiCompare(nullptr, "fetch?"));
    EXPECT_EQ(1, scpiCompare("FETCh?", nullptr));
}
