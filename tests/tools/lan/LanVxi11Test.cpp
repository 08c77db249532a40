// VXI-11 RPC handling without sockets or sensors: calls are encoded here as a client would
// and dispatched to a device that records what it is handed.
#include <gtest/gtest.h>

#include <cstring>

#include "tools/lan/Vxi11Rpc.h"

using namespace LbPmxLan;

namespace {

// Records what the dispatcher hands over and answers with fixed values.
class CRecordingDevice : public CIVxi11Device {
public:
    std::string m_strDevice;
    std::string m_strWritten;
    long m_nLid = 0;
    void createLink(const Create_LinkParms& p, Create_LinkResp& r) override
    {
        m_strDevice = p.device;
        r.lid = 42;
        r.abortPort = 1234;
        r.maxRecvSize = VXI11_MAX_RECV;
    }
    long write(const Device_WriteParms& p, unsigned long& size) override
    {
        m_strWritten.assign(p.data.data_val, p.data.data_len);
        size = p.data.data_len;
        return 0;
    }
    long read(const Device_ReadParms&, std::string& data, long& reason) override
    {
        data = "answer";
        reason = VXI11_REASON_END;
        return 0;
    }
    long readStb(const Device_GenericParms&, unsigned char& stb) override
    {
        stb = 0x50;
        return 0;
    }
    long trigger(const Device_GenericParms&) override { return 0; }
    long clear(const Device_GenericParms&) override { return 0; }
    long lock(const Device_LockParms& p) override
    {
        m_nLid = p.lid;
        return 11;
    }
    long unlock(Device_Link) override { return 12; }
    long enableSrq(const Device_EnableSrqParms&) override { return 0; }
    long destroyLink(Device_Link lid) override
    {
        m_nLid = lid;
        return 0;
    }
    long createIntrChan(const Device_RemoteFunc&) override { return 0; }
    long destroyIntrChan() override { return 6; }
    long abort(Device_Link) override { return 4; }
};

// Encodes a call record (without the record mark) of the core program.
template <class TArgs>
std::vector<std::uint8_t> call(std::uint32_t proc, bool_t (*encode)(XDR*, TArgs*), TArgs* args,
                               std::uint32_t prog = DEVICE_CORE)
{
    std::vector<std::uint8_t> out(2048);
    XDR x;
    xdrmem_create(&x, reinterpret_cast<char*>(out.data()), out.size(), XDR_ENCODE);
    rpc_msg msg;
    std::memset(&msg, 0, sizeof msg);
    msg.rm_xid = 7;
    msg.rm_direction = CALL;
    msg.rm_call.cb_rpcvers = 2;
    msg.rm_call.cb_prog = prog;
    msg.rm_call.cb_vers = 1;
    msg.rm_call.cb_proc = proc;
    msg.rm_call.cb_cred = _null_auth;
    msg.rm_call.cb_verf = _null_auth;
    EXPECT_TRUE(xdr_callmsg(&x, &msg) && encode(&x, args));
    out.resize(xdr_getpos(&x));
    return out;
}

// Decodes a reply record: its accept status and, when successful, the results.
template <class TResult>
accept_stat reply(const std::vector<std::uint8_t>& record, bool_t (*decode)(XDR*, TResult*), TResult* result)
{
    EXPECT_GE(record.size(), 4u);
    std::uint32_t mark = (std::uint32_t(record[0]) << 24) | (record[1] << 16) | (record[2] << 8) | record[3];
    EXPECT_EQ(0x80000000u | (record.size() - 4), mark);
    XDR x;
    xdrmem_create(&x, const_cast<char*>(reinterpret_cast<const char*>(record.data())) + 4, record.size() - 4,
                  XDR_DECODE);
    rpc_msg msg;
    std::memset(&msg, 0, sizeof msg);
    msg.acpted_rply.ar_results.where = reinterpret_cast<caddr_t>(result);
    msg.acpted_rply.ar_results.proc = reinterpret_cast<xdrproc_t>(reinterpret_cast<void (*)()>(decode));
    bool ok = xdr_replymsg(&x, &msg);
    EXPECT_TRUE(ok);
    EXPECT_EQ(7u, msg.rm_xid);
    EXPECT_EQ(MSG_ACCEPTED, msg.rm_reply.rp_stat);
    return msg.acpted_rply.ar_stat;
}

TEST(LanVxi11, DispatchesCallsAndEncodesReplies)
{
    CRecordingDevice device;
    std::vector<std::uint8_t> out;

    Create_LinkParms link = {1, 0, 1000, const_cast<char*>("inst0")};
    ASSERT_TRUE(dispatchVxi11(EVxi11Channel::Core, call(create_link, xdr_Create_LinkParms, &link), device, out));
    Create_LinkResp created = {};
    ASSERT_EQ(SUCCESS, reply(out, xdr_Create_LinkResp, &created));
    EXPECT_EQ("inst0", device.m_strDevice);
    EXPECT_EQ(42, created.lid);
    EXPECT_EQ(1234, created.abortPort);

    char text[] = "*IDN?\n";
    Device_WriteParms write = {42, 1000, 1000, VXI11_FLAG_END, {6, text}};
    ASSERT_TRUE(dispatchVxi11(EVxi11Channel::Core, call(device_write, xdr_Device_WriteParms, &write), device, out));
    Device_WriteResp written = {};
    ASSERT_EQ(SUCCESS, reply(out, xdr_Device_WriteResp, &written));
    EXPECT_EQ("*IDN?\n", device.m_strWritten);
    EXPECT_EQ(6u, written.size);

    Device_ReadParms read = {42, 100, 1000, 1000, 0, '\n'};
    ASSERT_TRUE(dispatchVxi11(EVxi11Channel::Core, call(device_read, xdr_Device_ReadParms, &read), device, out));
    Device_ReadResp answer = {};
    ASSERT_EQ(SUCCESS, reply(out, xdr_Device_ReadResp, &answer));
    EXPECT_EQ("answer", std::string(answer.data.data_val, answer.data.data_len));
    EXPECT_EQ(VXI11_REASON_END, answer.reason);
    xdr_free(reinterpret_cast<xdrproc_t>(reinterpret_cast<void (*)()>(xdr_Device_ReadResp)),
             reinterpret_cast<char*>(&answer));

    Device_LockParms lock = {42, VXI11_FLAG_WAITLOCK, 10};
    ASSERT_TRUE(dispatchVxi11(EVxi11Channel::Core, call(device_lock, xdr_Device_LockParms, &lock), device, out));
    Device_Error error = {};
    ASSERT_EQ(SUCCESS, reply(out, xdr_Device_Error, &error));
    EXPECT_EQ(11, error.error);

    // The abort channel serves device_abort only; the core program is unknown there.
    Device_Link lid = 42;
    ASSERT_TRUE(
        dispatchVxi11(EVxi11Channel::Abort, call(device_abort, xdr_Device_Link, &lid, DEVICE_ASYNC), device, out));
    ASSERT_EQ(SUCCESS, reply(out, xdr_Device_Error, &error));
    EXPECT_EQ(4, error.error);
    ASSERT_TRUE(dispatchVxi11(EVxi11Channel::Abort, call(destroy_link, xdr_Device_Link, &lid), device, out));
    EXPECT_EQ(PROG_UNAVAIL, reply(out, xdr_Device_Error, &error));
    ASSERT_TRUE(dispatchVxi11(EVxi11Channel::Core, call(99, xdr_Device_Link, &lid), device, out));
    EXPECT_EQ(PROC_UNAVAIL, reply(out, xdr_Device_Error, &error));
}

TEST(LanVxi11, MalformedInputClosesTheConnection)
{
    CRecordingDevice device;
    std::vector<std::uint8_t> out;
    Device_WriteParms write = {42, 1000, 1000, 0, {0, nullptr}};
    std::vector<std::uint8_t> record = call(device_write, xdr_Device_WriteParms, &write);
    record[record.size() - 1] = 0xFF; // the data length now claims 255 bytes that are not there
    EXPECT_FALSE(dispatchVxi11(EVxi11Channel::Core, record, device, out));
    Device_Error error = {};
    EXPECT_EQ(GARBAGE_ARGS, reply(out, xdr_Device_Error, &error));
    EXPECT_TRUE(device.m_strWritten.empty());

    EXPECT_FALSE(dispatchVxi11(EVxi11Channel::Core, std::vector<std::uint8_t>(3, 0), device, out));
    EXPECT_TRUE(out.empty());

    // Record marking: fragments are joined; a record above the limit is refused.
    const std::uint8_t stream[] = {0, 0, 0, 2, 'a', 'b', 0x80, 0, 0, 1, 'c', 0x80, 0, 0x10, 0};
    std::size_t at = 0;
    auto readExact = [&](void* p, std::size_t n) {
        if (at + n > sizeof stream)
            return false;
        std::memcpy(p, stream + at, n);
        at += n;
        return true;
    };
    std::vector<std::uint8_t> joined;
    ASSERT_TRUE(readRpcRecord(readExact, 100, joined));
    EXPECT_EQ("abc", std::string(joined.begin(), joined.end()));
    EXPECT_FALSE(readRpcRecord(readExact, 100, joined)); // 4096 bytes claimed
}

} // namespace
