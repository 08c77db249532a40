#ifndef LBPMXPASSPORT_BASEPASSPORT_H
#define LBPMXPASSPORT_BASEPASSPORT_H
// CBasePassport: the interface of every passport session class. The entry functions call these
// virtual operations on the object stored in the VISA session record; every operation answers
// VI_ERROR_NSUP_OPER here and does nothing else.
// Calls in progress keep their object: each entry function holds a CCall while it runs, and
// closing an object with calls in progress ends their waits (abandonCalls) and leaves the object
// to the last of them, which destroys it (destroyClosed) as it leaves.
#include "visahost/include/visa.h"

#include <atomic>

namespace LbPmxPassport {

class CBasePassport {
public:
    class CCall {
    public:
        explicit CCall(CBasePassport& object) : m_rObject(object) { object.m_nCalls.fetch_add(CALL); }
        ~CCall() { m_rObject.leave(); }
        CCall(const CCall&) = delete;
        CCall& operator=(const CCall&) = delete;

    private:
        CBasePassport& m_rObject;
    };

    virtual ~CBasePassport() { }
    // The five values of the runtime's find callback, passed through unchanged.
    virtual ViStatus findAttribute(ViAttr, ViUInt16, ViAttrState, ViConstString, ViUInt32)
    {
        return VI_ERROR_NSUP_OPER;
    }
    virtual ViStatus viClose() { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viGetAttribute(ViAttr, void*) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viSetAttribute(ViAttr, ViAttrState) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viTerminate(ViUInt16, ViJobId) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viWrite(ViConstBuf, ViUInt32, ViPUInt32) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viRead(ViPBuf, ViUInt32, ViPUInt32) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viAssertTrigger(ViUInt16) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viReadSTB(ViPUInt16) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viClear() { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viEnableEvent(ViEventType, ViUInt16, ViEventFilter) { return VI_ERROR_NSUP_OPER; }
    virtual ViStatus viDisableEvent(ViEventType, ViUInt16) { return VI_ERROR_NSUP_OPER; }

protected:
    bool isClosed() const { return (m_nCalls.load() & CLOSED) != 0; }
    // For viClose: marks the object closed. True when no call is in progress, and the caller
    // destroys the object now; otherwise the calls' waits have been ended and the last call to
    // leave destroys it.
    bool closeWhenIdle()
    {
        // Counted as a call itself meanwhile, so that no call leaving now destroys the object.
        if (m_nCalls.fetch_add(CALL + CLOSED) >= CALL) {
            abandonCalls();
        }
        return m_nCalls.fetch_sub(CALL) == CALL + CLOSED;
    }
    // Ends the waits of the calls in progress.
    virtual void abandonCalls() { }
    // Destroys a closed object once its last call has left.
    virtual void destroyClosed() { delete this; }

private:
    static constexpr unsigned CLOSED = 1; // the low bit: viClose has run
    static constexpr unsigned CALL = 2;   // the count of calls in progress, above it

    void leave()
    {
        if (m_nCalls.fetch_sub(CALL) == CALL + CLOSED) {
            destroyClosed();
        }
    }

    std::atomic<unsigned> m_nCalls{0};
};

} // namespace LbPmxPassport

#endif
