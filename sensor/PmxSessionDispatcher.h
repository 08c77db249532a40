#ifndef LBPMXVISA_PMXSESSIONDISPATCHER_H
#define LBPMXVISA_PMXSESSIONDISPATCHER_H
// CPmxSessionDispatcher: the process-wide registry of sensor sessions and owner of the
// attached commands interface. It opens the library driver on demand and closes it when no
// session is left, creates one CPmxSession per distinct resource and shares it (recycling),
// enumerates attached sensors, and routes every library callback to the session registered
// under the callback's sensor handle. callChecked() turns a non-zero library result into
// CPmxCommandException. The maps are guarded by a lock of their own because the library's
// callback thread reads them while application threads change them; the attached interface is
// read on every thread and so is atomic. A sensor whose device information cannot be read
// during enumeration (unplugged meanwhile) is skipped with a WARN line. forget() serves a
// detach at a process end that has stopped the other threads.
#include "core/Lock.h"
#include "sensor/PmxCommands.h"
#include "sensor/PmxResourceInfo.h"

#include <boost/noncopyable.hpp>
#include <boost/shared_ptr.hpp>
#include <boost/weak_ptr.hpp>
#include <atomic>
#include <cstdint>
#include <exception>
#include <string>
#include <unordered_map>
#include <utility>
#include <vector>

namespace LbPmxVisa {

class CPmxSessionDispatcher : public CIPmxEventListener, private boost::noncopyable {
public:
    class CPmxCommandException : public std::exception {
    public:
        // The message is the attached library's text for the code (empty when it gives none).
        explicit CPmxCommandException(std::int32_t code);
        const char* what() const noexcept override { return m_sMessage.c_str(); }
        std::int32_t getErrorCode() const { return m_nErrorCode; }

    private:
        std::string m_sMessage;
        std::int32_t m_nErrorCode;
    };

    static CPmxSessionDispatcher& getInstance();
    static void attach(CIPmxCommands* commands);
    static void detach(CIPmxCommands* commands);
    // Like detach, but takes no lock and logs nothing: for a process end where the system
    // stopped the other threads, perhaps while they held a lock.
    static void forget(CIPmxCommands* commands);

    // Throws std::runtime_error when no commands interface is attached.
    CIPmxCommands* getCommands();

    template <class... Parameters, class... Arguments>
    void callChecked(std::int32_t (CIPmxCommands::*operation)(Parameters...), Arguments&&... arguments)
    {
        std::int32_t result = (getCommands()->*operation)(std::forward<Arguments>(arguments)...);
        if (result != 0) {
            throw CPmxCommandException(result);
        }
    }

    boost::shared_ptr<CPmxSession> getSession(const CPmxResourceInfo& resource);
    std::vector<CPmxResourceInfo> getAvailableDevices();
    unsigned getActiveSessionCount();
    void registerSession(CPmxSession& session);
    void detach(CPmxSession& session);
    void closeDriverIfIdle();
    void findAndNotify(const CPmxEvent& event, PmxNotification operation);

    const std::string& getManufacturerName() const { return m_sManufacturerName; }
    std::int32_t getManufacturerId() const { return m_nManufacturerId; }

    void notifyCommandAcceptedEvent(const CPmxEvent& event) override;
    void notifyDataAvailableEvent(const CPmxEvent& event) override;
    void notifyErrorOccuredEvent(const CPmxEvent& event) override;
    void notifyStateChangedEvent(const CPmxEvent& event) override;
    void notifyDeviceChangedEvent(const CPmxEvent& event) override;

private:
    CPmxSessionDispatcher();
    ~CPmxSessionDispatcher() override;

    std::unordered_map<std::string, boost::weak_ptr<CPmxSession>> m_cResourceMap;
    std::unordered_map<std::int64_t, CPmxSession*> m_cSessionMap;
    std::atomic<CIPmxCommands*> m_pcCommand;
    std::string m_sManufacturerName;
    std::int32_t m_nManufacturerId;
    LbCore::CCriticalSection m_cMapLock;
};

} // namespace LbPmxVisa

#endif
