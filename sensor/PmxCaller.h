#ifndef LBPMXVISA_PMXCALLER_H
#define LBPMXVISA_PMXCALLER_H
// CIPmxCaller: who runs a read or write on a sensor session. A caller that is closing starts no
// new command and gets no new wait; CPmxSession::abandon ends the wait it is in.
namespace LbPmxVisa {

class CIPmxCaller {
public:
    virtual bool isClosing() const = 0;

protected:
    ~CIPmxCaller() { }
};

} // namespace LbPmxVisa

#endif
