#include "sensor/PmxControl.h"

#include "pmxsim/PmxControl2.h"
#include "sensor/PmxResourceInfo.h"
#include "sensor/PmxSession.h"

namespace LbPmxVisa {

CPmxControl::CPmxControl() : m_bDriverOpen(false), m_pcListener(nullptr) { }

CPmxControl::~CPmxControl() { }

void CPmxControl::setEventListener(CIPmxEventListener* listener)
{
    m_pcListener = listener;
}

std::int32_t CPmxControl::openDriver()
{
    std::int32_t result = PmxOpenDriver();
    if (result != 0) {
        return result;
    }
    // A driver whose callbacks could not all be installed would never report anything: the open
    // fails with the registration's result and the driver is closed again.
    result = installCallbacks();
    if (result != 0) {
        removeCallbacks();
        PmxCloseDriver();
        return result;
    }
    m_bDriverOpen = true;
    return 0;
}

std::int32_t CPmxControl::closeDriver()
{
    removeCallbacks();
    std::int32_t result = PmxCloseDriver();
    m_bDriverOpen = result != 0;
    if (result != 0) {
        // The driver stays open, so it keeps its callbacks: the next session must hear it.
        installCallbacks();
    } else {
        // Closing the driver closed every sensor.
        LbCore::CMutexLock lock(m_cUnclosedLock);
        m_cUnclosed.clear();
    }
    return result;
}

std::int32_t CPmxControl::installCallbacks()
{
    std::int32_t results[] = {
        PmxSetNotifyCallbackCommandAccepted(&CPmxControl::onCommandAccepted, this),
        PmxSetNotifyCallbackStateChanged(&CPmxControl::onStateChanged, this),
        PmxSetNotifyCallbackDataAvailable(&CPmxControl::onDataAvailable, this),
        PmxSetNotifyCallbackErrorOccurred(&CPmxControl::onErrorOccurred, this),
        PmxSetNotifyCallbackDeviceChanged(&CPmxControl::onDeviceChanged, this),
    };
    for (std::int32_t result : results) {
        if (result != 0) {
            return result;
        }
    }
    return 0;
}

void CPmxControl::removeCallbacks()
{
    PmxSetNotifyCallbackCommandAccepted(nullptr, nullptr);
    PmxSetNotifyCallbackStateChanged(nullptr, nullptr);
    PmxSetNotifyCallbackDataAvailable(nullptr, nullptr);
    PmxSetNotifyCallbackErrorOccurred(nullptr, nullptr);
    PmxSetNotifyCallbackDeviceChanged(nullptr, nullptr);
}

bool CPmxControl::isDriverOpen()
{
    return m_bDriverOpen;
}

std::int32_t CPmxControl::openSensor(const CPmxResourceInfo& resource, std::int64_t* handle)
{
    std::string descriptor = g_pcPmxSerializer->serialize(resource);
    {
        // The library may still hold the sensor under a handle whose close failed; it is
        // released now (and tried again next time if that fails too).
        LbCore::CMutexLock lock(m_cUnclosedLock);
        std::map<std::string, std::int64_t>::iterator unclosed = m_cUnclosed.find(descriptor);
        if (unclosed != m_cUnclosed.end() && PmxCloseSensor(unclosed->second) == 0) {
            m_cUnclosed.erase(unclosed);
        }
    }
    return PmxOpenSensor(descriptor.c_str(), handle);
}

std::int32_t CPmxControl::closeSensor(CPmxSession& session)
{
    std::int32_t result = PmxCloseSensor(session.getHandle());
    if (result != 0) {
        LbCore::CMutexLock lock(m_cUnclosedLock);
        m_cUnclosed[g_pcPmxSerializer->serialize(session.getResourceInfo())] = session.getHandle();
    }
    return result;
}

std::int32_t CPmxControl::sendCommand(CPmxSession& session, const std::string& text)
{
    return PmxSendCommand(session.getHandle(), text.c_str(), 0);
}

std::int32_t CPmxControl::getData(CPmxSession& session, std::int32_t* out1, std::int32_t* out2, std::int32_t* out3)
{
    return PmxGetData(session.getHandle(), out1, out2, out3);
}

std::int32_t CPmxControl::clearDevice(CPmxSession& session)
{
    return PmxClearDevice(session.getHandle());
}

std::int32_t CPmxControl::getErrorText(std::int32_t code, char* buffer, std::int32_t size)
{
    return PmxGetErrorText(code, buffer, size);
}

std::int32_t CPmxControl::emptyAllBuffers(CPmxSession& session)
{
    return PmxEmptyAllBuffers(session.getHandle());
}

std::int32_t CPmxControl::getStringResult(CPmxSession& session, char* buffer, std::int32_t size)
{
    return PmxGetStringResult(session.getHandle(), buffer, size);
}

std::int32_t CPmxControl::getBinaryResult(CPmxSession& session, unsigned char* buffer, std::int32_t size,
                                          std::int32_t* count)
{
    return PmxGetBinaryResult(session.getHandle(), buffer, size, count);
}

std::int32_t CPmxControl::getBitfieldResult(CPmxSession& session, std::int32_t* out1, std::int32_t* out2,
                                            std::int32_t* out3)
{
    return PmxGetBitfieldResult(session.getHandle(), out1, out2, out3);
}

std::int32_t CPmxControl::getLongResult(CPmxSession& session, std::int32_t* out1, std::int32_t* out2,
                                        std::int32_t* out3)
{
    return PmxGetLongResult(session.getHandle(), out1, out2, out3);
}

std::int32_t CPmxControl::getFloatResult(CPmxSession& session, float* out1, float* out2, float* out3)
{
    return PmxGetFloatResult(session.getHandle(), out1, out2, out3);
}

std::int32_t CPmxControl::getFloatArray(CPmxSession& session, float* array, std::int32_t capacity, std::int32_t* count)
{
    return PmxGetFloatArray(session.getHandle(), array, capacity, count);
}

std::int32_t CPmxControl::getAuxFloatArray(CPmxSession& session, float* array1, float* array2, float* array3,
                                           std::int32_t capacity, std::int32_t* count)
{
    return PmxGetAuxFloatArray(session.getHandle(), array1, array2, array3, capacity, count);
}

std::int32_t CPmxControl::getTriggerState(CPmxSession& session, std::int32_t* state)
{
    return PmxGetTriggerState(session.getHandle(), state);
}

std::int32_t CPmxControl::getDeviceListLength(std::int32_t* count)
{
    return PmxGetDeviceListLength(count);
}

// The buffers start empty: a failing library call may leave them unwritten, and the texts are
// copied whatever the result.
std::int32_t CPmxControl::getDeviceInfo(std::int32_t index, std::string& name, std::string& type, std::string& serial,
                                        std::int32_t* flag)
{
    char nameText[256] = "";
    char typeText[256] = "";
    char serialText[256] = "";
    std::int32_t result = PmxGetDeviceInfo(index, nameText, typeText, serialText, flag);
    // A library that fills a buffer to the brim leaves no terminator; the texts stay in bounds.
    nameText[255] = typeText[255] = serialText[255] = '\0';
    name = nameText;
    type = typeText;
    serial = serialText;
    return result;
}

// Runs on the library's own thread, inside the library's callback: an exception must not
// unwind into the library, where nothing would catch it and the process would end. A listener
// that fails (only when memory runs out in the system's own listeners) loses that one event.
void CPmxControl::forward(PmxNotification notification, std::int64_t handle, std::int32_t value)
{
    CIPmxEventListener* listener = m_pcListener;
    if (listener != nullptr) {
        CPmxEvent event = {handle, value};
        try {
            (listener->*notification)(event);
        } catch (...) {
        }
    }
}

void CPmxControl::onCommandAccepted(std::int64_t handle, std::int32_t value, void* user)
{
    static_cast<CPmxControl*>(user)->forward(&CIPmxEventListener::notifyCommandAcceptedEvent, handle, value);
}

void CPmxControl::onStateChanged(std::int64_t handle, std::int32_t value, void* user)
{
    static_cast<CPmxControl*>(user)->forward(&CIPmxEventListener::notifyStateChangedEvent, handle, value);
}

void CPmxControl::onDataAvailable(std::int64_t handle, std::int32_t value, void* user)
{
    static_cast<CPmxControl*>(user)->forward(&CIPmxEventListener::notifyDataAvailableEvent, handle, value);
}

void CPmxControl::onErrorOccurred(std::int64_t handle, std::int32_t code, void* user)
{
    if (code == PMX_BENIGN_ERROR) {
        return;
    }
    static_cast<CPmxControl*>(user)->forward(&CIPmxEventListener::notifyErrorOccuredEvent, handle, code);
}

void CPmxControl::onDeviceChanged(void* user)
{
    static_cast<CPmxControl*>(user)->forward(&CIPmxEventListener::notifyDeviceChangedEvent, 0, 0);
}

} // namespace LbPmxVisa
