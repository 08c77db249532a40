#ifndef LBPMXVISA_PMXSCPICOMMANDPARSER_H
#define LBPMXVISA_PMXSCPICOMMANDPARSER_H
// CPmxScpiCommandParser: classifies one written command piece (already split at ";",
// lower-cased and stripped of one leading ":" by the session) as one of the commands the
// system answers itself, or as a command for the sensor. Only the text before the first line
// feed counts, without trailing blanks, tabs and carriage returns. The tests run in the order of ECommandType and the first that holds decides.
// Stateless: one shared instance serves every session and thread without a lock; it never
// fails, anything unrecognised is COMMAND_OTHER.
//
// scpiCompare(pattern, input): 0 when input is a form of the SCPI header pattern (each
// mnemonic in its long form or exactly its short form, the upper-case letters of the pattern,
// in any case), otherwise negative or positive in the manner of a string comparison.
#include <cstdint>
#include <string>

namespace LbPmxVisa {

class CPmxScpiCommandParser {
public:
    enum ECommandType : std::int32_t {
        COMMAND_OTHER = 0,                     // sent to the sensor unchanged
        COMMAND_SYSTEM_ERROR_QUERY = 1,        // "SYSTem:ERRor?"
        COMMAND_OPERATION_CONDITION_QUERY = 2, // "STATus:OPERation:CONDition?"
        COMMAND_FORMAT_ASCII = 3,              // "format ascii"
        COMMAND_FORMAT_REAL32 = 4              // "format real,32"
    };

    static CPmxScpiCommandParser& getInstance();

    CPmxScpiCommandParser() { }
    virtual ~CPmxScpiCommandParser() { }

    ECommandType parse(const std::string& command) const;
    bool isSystemErrorQuery(const std::string& text) const;
    bool isOperationConditionQuery(const std::string& text) const;
    bool isFormatAscii(const std::string& text) const;
    bool isFormatReal32(const std::string& text) const;
    // Trims " \r\n\t" at both ends, makes runs of blanks one blank and drops blanks beside commas.
    std::string normalize(const std::string& text) const;
};

int scpiCompare(const char* pattern, const char* input);

} // namespace LbPmxVisa

#endif
