// The gateway's core, written only against the VISA C API: the sensors it serves (found with
// viFindRsrc, named inst0, inst1, ... in the order first seen and remembered by serial, so a
// replugged sensor gets its old name back) and the links that clients hold on them. Each link
// is a VISA session of its own, so VISA's lock rules hold between links; the I/O of one sensor
// runs one operation (or one raw-socket query, write and read) at a time, in turn, instead of
// refusing the second as busy. Every operation answers a VXI-11 error code, which the raw
// socket listener uses as well.
#ifndef LBPMX_LAN_GATEWAY_H
#define LBPMX_LAN_GATEWAY_H

#include <visa.h>

#include <atomic>
#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

namespace LbPmxLan {

class CLanLog;

// VXI-11 error codes.
enum EVxi11Error : long {
    VXI11_OK = 0,
    VXI11_SYNTAX = 1,
    VXI11_NOT_ACCESSIBLE = 3,
    VXI11_INVALID_LINK = 4,
    VXI11_PARAMETER = 5,
    VXI11_NO_CHANNEL = 6,
    VXI11_NOT_SUPPORTED = 8,
    VXI11_OUT_OF_RESOURCES = 9,
    VXI11_LOCKED = 11,
    VXI11_NO_LOCK = 12,
    VXI11_IO_TIMEOUT = 15,
    VXI11_IO_ERROR = 17,
    VXI11_ABORT = 23,
    VXI11_CHANNEL_EXISTS = 29
};

struct CSensor {
    unsigned m_nIndex = 0;
    std::string m_strSerial;
    std::string m_strResource;
    bool m_bPresent = false;
    unsigned m_nLinks = 0;
    bool m_bBusy = false; // one I/O operation (or socket query) at a time; guarded by the gateway's mutex
};

class CGateway;

typedef std::chrono::steady_clock Clock;

// One client's link on a sensor. Not thread-safe by itself: a connection uses its links from
// its one thread (the SRQ handler only reads the fields it was given at enable).
class CLink {
public:
    CLink(CGateway& gateway, CSensor& sensor, ViSession session);
    ~CLink(); // releases the lock, disables events and closes the VISA session
    long write(const char* data, std::size_t size, unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock,
               unsigned long& written);
    // Reads up to `max` bytes of the answer; `termChar` >= 0 ends the piece after that byte.
    // The whole answer is read from the sensor into the link and handed out in pieces: reason
    // REQCNT while more remains, END with the last piece, CHR at the termination character.
    // What remains is dropped by the link's next write or clear. `gone` is asked between
    // slices of a long wait, so a vanished client frees its link early.
    long read(std::size_t max, unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock, int termChar,
              const std::function<bool()>& gone, std::string& data, long& reason);
    long readStb(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock, unsigned char& stb);
    long trigger(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock);
    long clear(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock);
    long lock(unsigned long lockTimeout, bool waitLock);
    // Takes the sensor's I/O turn (waiting up to ioTimeout) and keeps it across this link's
    // operations until endTurn, so that a write and the read of its answer run as one unit.
    long beginTurn(unsigned long ioTimeout);
    void endTurn();
    // After a failed operation: true when the session failed because its sensor is gone (an
    // unplugged sensor's sessions stay dead even when it returns).
    bool sensorGone();
    long unlock();
    // Calls `srq` (on the VISA runtime's handler thread) whenever the sensor requests service.
    long enableSrq(bool enable, std::function<void()> srq);
    const CSensor& sensor() const { return m_cSensor; }

private:
    static ViStatus _VI_FUNCH onServiceRequest(ViSession vi, ViEventType type, ViEvent event, ViAddr user);
    // Runs `op` with the sensor to itself, retrying while another link holds the VISA lock and
    // waitLock allows; returns the VISA status of the last attempt (VI_ERROR_TMO when the
    // sensor stayed busy with other links' I/O for the whole ioTimeout).
    ViStatus exclusive(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock,
                       const std::function<ViStatus()>& op);
    ViStatus setTimeout(unsigned long ms);
    bool waitTurn(std::unique_lock<std::mutex>& guard, Clock::time_point deadline);
    void giveTurn(std::unique_lock<std::mutex>& guard);
    ViStatus fetchAnswer(unsigned long ioTimeout, unsigned long lockTimeout, bool waitLock,
                         const std::function<bool()>& gone);
    void dropAnswer();

    CGateway& m_cGateway;
    CSensor& m_cSensor;
    ViSession m_nSession;
    bool m_bLocked = false;
    std::uintptr_t m_nSrqId = 0; // the handler's number while service requests are enabled
    unsigned long m_nTimeout = 0;
    bool m_bHoldsTurn = false; // between beginTurn and endTurn
    bool m_bFailed = false;    // the last write or read failed other than by a time-out
    std::string m_strAnswer;   // the answer being handed out, from m_nAnswerAt on
    std::size_t m_nAnswerAt = 0;
    std::vector<char> m_vecBuffer; // what the sensor's answers are read into; grows to fit them
    std::function<void()> m_fSrq;
};

class CGateway {
public:
    explicit CGateway(CLanLog& log, unsigned maxLinks);
    ~CGateway();
    // Opens the resource manager and finds the sensors; false when VISA cannot be opened.
    bool start();
    // Finds the sensors again: new ones get the next free name, missing ones are marked absent,
    // returning ones become present under their old name. Returns the sensors now known.
    std::vector<CSensor> scan();
    // "instN" or a serial (case ignored); a device not present is looked for with a rescan.
    // Null with `error` set when it is unknown, absent or has its maximum of links.
    std::unique_ptr<CLink> open(const std::string& device, long& error);
    CLanLog& log() { return m_cLog; }

private:
    friend class CLink;
    CSensor* find(const std::string& device);
    void released(CSensor& sensor);

    CLanLog& m_cLog;
    unsigned m_nMaxLinks;
    ViSession m_nRm = VI_NULL;
    std::mutex m_cMutex;                // guards the sensor table, link counts and busy flags
    std::condition_variable m_cChanged; // a sensor's I/O finished or a lock was released
    std::uint64_t m_nReleases = 0;      // such releases, counted so that a waiter never misses one
    std::vector<std::unique_ptr<CSensor>> m_vecSensors;
    std::map<std::string, std::string> m_mapSerialOf; // resource string -> serial
};

// Maps a VISA status to the VXI-11 error of an operation.
long vxi11ErrorOf(ViStatus status);

} // namespace LbPmxLan

#endif
