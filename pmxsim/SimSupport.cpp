// The fixed tables (functions, models, texts of result codes) and the text helpers of the
// simulated library.
#include "pmxsim/SimSupport.h"

#include "pmxsim/PmxSim.h"

#include <algorithm>
#include <cctype>
#include <cstring>

namespace PmxSim {

namespace {

const char* const FUNCTION_NAMES[] = {"PmxOpenDriver",
                                      "PmxCloseDriver",
                                      "PmxOpenSensor",
                                      "PmxCloseSensor",
                                      "PmxSendCommand",
                                      "PmxGetData",
                                      "PmxGetFloatResult",
                                      "PmxGetFloatArray",
                                      "PmxGetAuxFloatArray",
                                      "PmxGetLongResult",
                                      "PmxGetBitfieldResult",
                                      "PmxGetBinaryResult",
                                      "PmxGetStringResult",
                                      "PmxGetTriggerState",
                                      "PmxGetDeviceListLength",
                                      "PmxGetDeviceInfo",
                                      "PmxClearDevice",
                                      "PmxEmptyAllBuffers",
                                      "PmxGetErrorText",
                                      "PmxSetNotifyCallbackDeviceChanged",
                                      "PmxSetNotifyCallbackErrorOccurred",
                                      "PmxSetNotifyCallbackDataAvailable",
                                      "PmxSetNotifyCallbackCommandAccepted",
                                      "PmxSetNotifyCallbackStateChanged"};

struct SModel {
    const char* type;
    uint32_t code;
};
const SModel MODELS[] = {{"PMX", 2},       {"PMX-M01", 3},   {"PMX-M02", 4},   {"PMX-M03", 11},  {"PMX-M04", 12},
                         {"PMX-M05", 19},  {"PMX-M06", 20},  {"PMX-M07", 21},  {"PMX-M08", 81},  {"PMX-M09", 44},
                         {"PMX-M10", 154}, {"PMX-M11", 150}, {"PMX-M12", 151}, {"PMX-M13", 152}, {"PMX-M14", 26},
                         {"PMX-M15", 33},  {"PMX-M16", 98},  {"PMX-M17", 46},  {"PMX-M18", 82},  {"PMX-M19", 166},
                         {"PMX-M20", 167}, {"PMX-M21", 35},  {"PMX-M22", 131}, {"PMX-M23", 149}, {"PMX-M24", 47},
                         {"PMX-M25", 45},  {"PMX-M26", 22},  {"PMX-M27", 23},  {"PMX-M28", 24},  {"PMX-M29", 25},
                         {"PMX-M30", 112}, {"PMX-M31", 168}, {"PMX-M32", 143}, {"PMX-M33", 144}};

struct SErrorText {
    int32_t code;
    const char* text;
};
const SErrorText ERROR_TEXTS[] = {
    {PMX_SUCCESS, "No error"},
    {PMX_ERR_NO_MORE_RESULTS, "No further result available"},
    {PMX_INFO_COMMAND_IGNORED, "Command ignored: nothing to do in the current measurement state"},
    {PMX_ERR_UNKNOWN_COMMAND, "Unknown command or invalid parameter"},
    {PMXSIM_E_DRIVER_NOT_OPEN, "Driver not open"},
    {PMXSIM_E_INVALID_ARGUMENT, "Invalid argument"},
    {PMXSIM_E_INVALID_HANDLE, "Unknown sensor handle"},
    {PMXSIM_E_BAD_DESCRIPTOR, "Malformed sensor descriptor"},
    {PMXSIM_E_NO_SUCH_SENSOR, "No such sensor attached"},
    {PMXSIM_E_SENSOR_DETACHED, "Sensor has been detached"},
    {PMXSIM_E_SENSOR_IN_USE, "Sensor already open"},
    {PMXSIM_E_INDEX_OUT_OF_RANGE, "Device index out of range"},
    {PMXSIM_E_TYPE_MISMATCH, "Pending result has another data type"},
    {PMXSIM_E_BUFFER_TOO_SMALL, "Buffer too small for the pending result"},
    {PMXSIM_E_SENSOR_NOT_OPEN, "Sensor not open"},
    {PMXSIM_E_ALREADY_ATTACHED, "Serial number already attached"},
    {PMXSIM_E_OUT_OF_RESOURCES, "Out of resources"}};

} // namespace

bool findModel(const std::string& type, uint32_t* code)
{
    for (const SModel& model : MODELS) {
        if (type == model.type) {
            *code = model.code;
            return true;
        }
    }
    return false;
}

const char* errorText(int32_t code)
{
    for (const SErrorText& entry : ERROR_TEXTS)
        if (entry.code == code)
            return entry.text;
    return nullptr;
}

const char* functionName(int fn)
{
    return FUNCTION_NAMES[fn];
}

std::string lower(std::string text)
{
    for (char& c : text)
        c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    return text;
}

std::string trim(const std::string& text)
{
    size_t begin = text.find_first_not_of(" \t\r\n");
    if (begin == std::string::npos)
        return std::string();
    size_t end = text.find_last_not_of(" \t\r\n");
    return text.substr(begin, end - begin + 1);
}

bool sameSerial(const std::string& a, const char* b)
{
    return lower(a) == lower(b);
}

bool validText(const char* text)
{
    return text != nullptr && *text != '\0' && std::strlen(text) <= MAX_TEXT && std::strchr(text, ':') == nullptr &&
        std::strchr(text, ',') == nullptr;
}

void copyText(char* target, const std::string& text)
{
    size_t n = std::min(text.size(), MAX_TEXT);
    std::memcpy(target, text.data(), n);
    target[n] = '\0';
}

} // namespace PmxSim
