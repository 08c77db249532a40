// Fuzzes what a LAN gateway client can send: the input is one TCP stream, cut into RPC records
// and dispatched as VXI-11 core calls to a device that answers like a link (read data
// included), and the same bytes split into raw-socket command lines.
#include <cstddef>
#include <cstdint>
#include <cstring>

#include "tools/lan/LineReader.h"
#include "tools/lan/Vxi11Rpc.h"

namespace {

class CFuzzDevice : public LbPmxLan::CIVxi11Device {
public:
    void createLink(const Create_LinkParms& p, Create_LinkResp& r) override
    {
        r.lid = p.device != nullptr ? static_cast<long>(std::strlen(p.device)) : 0;
        r.maxRecvSize = LbPmxLan::VXI11_MAX_RECV;
    }
    long write(const Device_WriteParms& p, unsigned long& size) override
    {
        size = p.data.data_len;
        return 0;
    }
    long read(const Device_ReadParms& p, std::string& data, long& reason) override
    {
        data.assign(p.requestSize % 64, static_cast<char>(p.termChar));
        reason = LbPmxLan::VXI11_REASON_END;
        return 0;
    }
    long readStb(const Device_GenericParms&, unsigned char& stb) override
    {
        stb = 0;
        return 0;
    }
    long trigger(const Device_GenericParms&) override { return 0; }
    long clear(const Device_GenericParms&) override { return 0; }
    long lock(const Device_LockParms&) override { return 0; }
    long unlock(Device_Link) override { return 12; }
    long enableSrq(const Device_EnableSrqParms& p) override { return p.handle.handle_len > 40 ? 5 : 0; }
    long destroyLink(Device_Link) override { return 4; }
    long createIntrChan(const Device_RemoteFunc&) override { return 0; }
    long destroyIntrChan() override { return 6; }
    long abort(Device_Link) override { return 0; }
};

} // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size)
{
    std::size_t at = 0;
    auto readExact = [&](void* p, std::size_t n) {
        if (n > size - at)
            return false;
        std::memcpy(p, data + at, n);
        at += n;
        return true;
    };
    CFuzzDevice device;
    std::vector<std::uint8_t> record;
    std::vector<std::uint8_t> reply;
    LbPmxLan::EVxi11Channel channel = LbPmxLan::EVxi11Channel::Core;
    while (LbPmxLan::readRpcRecord(readExact, LbPmxLan::RPC_MAX_RECORD, record)) {
        if (!LbPmxLan::dispatchVxi11(channel, record, device, reply))
            break;
        channel =
            channel == LbPmxLan::EVxi11Channel::Core ? LbPmxLan::EVxi11Channel::Abort : LbPmxLan::EVxi11Channel::Core;
    }
    LbPmxLan::CLineReader lines;
    lines.feed(reinterpret_cast<const char*>(data), size);
    std::string line;
    while (lines.next(line) == LbPmxLan::CLineReader::RESULT_LINE) {
        LbPmxLan::isQuery(line);
    }
    return 0;
}
