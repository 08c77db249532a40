#ifndef LBPMXPASSPORT_LBPMXINSTRSESN_H
#define LBPMXPASSPORT_LBPMXINSTRSESN_H
// CLbPmxInstrSesn: the object behind one open VISA session on a sensor resource. It holds a
// shared reference to the sensor session of its resource (shared with every other VISA session
// on it) and translates between VISA conventions (statuses, user buffers, return counts) and
// the sensor session's strings, data buffers and exceptions. No exception leaves an operation.
// Its three listeners turn sensor notifications into VISA events on this session.
// Objects come from the memory pool; viClose (or a failed viOpen) destroys the object, or, with
// calls in progress, ends their waits and leaves it to the last of them.
#include "core/MemoryPool.h"
#include "core/Parent.h"
#include "sensor/PmxCaller.h"
#include "sensor/PmxCommands.h"
#include "passport/BasePassport.h"

#include <boost/shared_ptr.hpp>

namespace LbPmxVisa {
class CPmxSession;
}

namespace LbPmxPassport {

class CLbPmxInstrSesn : public CBasePassport,
                        private LbPmxVisa::CIPmxCaller,
                        private LbCore::CMemoryPool::CMemoryPoolManaged {
public:
    using LbCore::CMemoryPool::CMemoryPoolManaged::operator new;
    using LbCore::CMemoryPool::CMemoryPoolManaged::operator delete;

    // Raises one VISA event of a fixed type on the owning session per notification.
    class CVisaEventListener : public LbCore::CParent<CLbPmxInstrSesn>, public LbPmxVisa::CIPmxEventListener {
    public:
        explicit CVisaEventListener(CLbPmxInstrSesn* owner) : LbCore::CParent<CLbPmxInstrSesn>(owner) { }
        // Unsubscribes from the sensor session's event dispatcher while the owner holds it.
        ~CVisaEventListener() override;
        void notifyCommandAcceptedEvent(const LbPmxVisa::CPmxEvent&) override { }
        void notifyDataAvailableEvent(const LbPmxVisa::CPmxEvent&) override { }
        void notifyErrorOccuredEvent(const LbPmxVisa::CPmxEvent&) override { }
        void notifyStateChangedEvent(const LbPmxVisa::CPmxEvent&) override { }
        void notifyDeviceChangedEvent(const LbPmxVisa::CPmxEvent&) override { }

    protected:
        void raise(ViEventType type);
    };

    class CVisaSrqEventListener : public CVisaEventListener {
    public:
        using CVisaEventListener::CVisaEventListener;
        void notifyStateChangedEvent(const LbPmxVisa::CPmxEvent&) override { raise(VI_EVENT_SERVICE_REQ); }
    };

    class CVisaUsbEventListener : public CVisaEventListener {
    public:
        using CVisaEventListener::CVisaEventListener;
        void notifyDeviceChangedEvent(const LbPmxVisa::CPmxEvent&) override { raise(VI_EVENT_USB_INTR); }
    };

    class CVisaExceptionEventListener : public CVisaEventListener {
    public:
        using CVisaEventListener::CVisaEventListener;
        void notifyErrorOccuredEvent(const LbPmxVisa::CPmxEvent&) override { raise(VI_EVENT_EXCEPTION); }
    };

    CLbPmxInstrSesn();
    ~CLbPmxInstrSesn() override;

    // Set by the viOpen entry before viOpen: the handle the runtime created and its record.
    void setVisaSession(ViSession session, ViAddr* record);
    ViSession getVisaSession() const { return m_nSession; }
    const boost::shared_ptr<LbPmxVisa::CPmxSession>& getSensorSession() const { return m_pcSession; }

    ViStatus findAttribute(ViAttr, ViUInt16, ViAttrState, ViConstString, ViUInt32) override;
    ViStatus viClose() override;
    ViStatus viGetAttribute(ViAttr attribute, void* value) override;
    ViStatus viSetAttribute(ViAttr attribute, ViAttrState value) override;
    ViStatus viTerminate(ViUInt16 degree, ViJobId jobId) override;
    ViStatus viWrite(ViConstBuf buffer, ViUInt32 count, ViPUInt32 returnCount) override;
    ViStatus viRead(ViPBuf buffer, ViUInt32 count, ViPUInt32 returnCount) override;
    ViStatus viAssertTrigger(ViUInt16 protocol) override;
    ViStatus viReadSTB(ViPUInt16 status) override;
    ViStatus viClear() override;
    ViStatus viEnableEvent(ViEventType type, ViUInt16 mechanism, ViEventFilter context) override;
    ViStatus viDisableEvent(ViEventType type, ViUInt16 mechanism) override;
    virtual ViStatus viOpen(ViConstRsrc name, ViAccessMode mode, ViUInt32 timeout);

    // Resource-manager operations, registered without a session object.
    static ViStatus viFindRsrc(ViSession rm, ViConstString expression, ViPFindList findList);
    static ViStatus viParseRsrc(ViSession rm, ViConstRsrc name, ViPUInt16 type, ViPUInt16 number);
    static ViStatus viParseRsrcEx(ViSession rm, ViConstRsrc name, ViPUInt16 type, ViPUInt16 number,
                                  ViChar* resourceClass, ViChar* expandedName, ViChar* alias);

    // VI_ATTR_RSRC_IMPL_VERSION from a build date "Mmm dd yyyy" and the file version.
    static ViUInt32 implementationVersion(const char* buildDate, unsigned major, unsigned minor);

    // An open is refused while more than this many sensor sessions exist, so at most one more,
    // MAX_OPEN_BEFORE_OPEN + 1 = 128, can exist at a time.
    static constexpr unsigned MAX_OPEN_BEFORE_OPEN = 127;

protected:
    void abandonCalls() override;
    void destroyClosed() override;
    bool isClosing() const override { return isClosed(); }

private:
    ViStatus getAttribute(ViAttr attribute, void* value);
    ViStatus enableListener(ViEventType type, bool enable);
    LbPmxVisa::CIPmxEventListener* listenerFor(ViEventType type);

    ViSession m_nSession;
    ViAddr* m_pcRecord;
    ViUInt16 m_nClosed;
    ViUInt16 m_nClosingFromDestructor;
    boost::shared_ptr<LbPmxVisa::CPmxSession> m_pcSession;
    CVisaSrqEventListener m_cSrqListener;
    CVisaUsbEventListener m_cUsbListener;
    CVisaExceptionEventListener m_cExceptionListener;
};

} // namespace LbPmxPassport

#endif
