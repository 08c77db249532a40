#include "tools/lan/Vxi11Rpc.h"

#include <cstring>

namespace LbPmxLan {

namespace {

constexpr std::uint32_t RPC_VERSION = 2;
constexpr std::uint32_t RECORD_LAST_FRAGMENT = 0x80000000u;
// More empty fragments than this in one record is a flood, not a client.
constexpr int MAX_EMPTY_FRAGMENTS = 16;

// XDR routines have various signatures; the library takes them all as xdrproc_t.
template <class TProc> xdrproc_t xdrProc(TProc proc)
{
    return reinterpret_cast<xdrproc_t>(reinterpret_cast<void (*)()>(proc));
}

// Ends a record encoded by `x` behind the 4 bytes reserved at the front of `out`: trims `out`
// to what was encoded and writes the record mark there. A failed encoding leaves `out` empty.
bool finishRecord(XDR& x, bool encoded, std::vector<std::uint8_t>& out)
{
    std::uint32_t used = xdr_getpos(&x);
    xdr_destroy(&x);
    if (!encoded) {
        out.clear();
        return false;
    }
    out.resize(4 + used);
    std::uint32_t header = RECORD_LAST_FRAGMENT | used;
    for (int i = 0; i < 4; ++i) {
        out[i] = static_cast<std::uint8_t>(header >> (24 - 8 * i));
    }
    return true;
}

// Encodes a reply message (header and results) as one record.
bool encodeReply(const rpc_msg& msg, std::vector<std::uint8_t>& out)
{
    unsigned long size = xdr_sizeof(xdrProc(xdr_replymsg), const_cast<rpc_msg*>(&msg));
    out.assign(4 + size, 0);
    XDR x;
    xdrmem_create(&x, reinterpret_cast<char*>(out.data()) + 4, size, XDR_ENCODE);
    return finishRecord(x, xdr_replymsg(&x, const_cast<rpc_msg*>(&msg)), out);
}

rpc_msg acceptedReply(std::uint32_t xid, accept_stat stat)
{
    rpc_msg msg;
    std::memset(&msg, 0, sizeof msg);
    msg.rm_xid = xid;
    msg.rm_direction = REPLY;
    msg.rm_reply.rp_stat = MSG_ACCEPTED;
    msg.acpted_rply.ar_verf = _null_auth;
    msg.acpted_rply.ar_stat = stat;
    msg.acpted_rply.ar_results.where = nullptr;
    msg.acpted_rply.ar_results.proc = xdrProc(xdr_void);
    return msg;
}

bool replyResult(std::uint32_t xid, xdrproc_t proc, void* result, std::vector<std::uint8_t>& out)
{
    rpc_msg msg = acceptedReply(xid, SUCCESS);
    msg.acpted_rply.ar_results.where = reinterpret_cast<caddr_t>(result);
    msg.acpted_rply.ar_results.proc = proc;
    return encodeReply(msg, out);
}

bool replyError(std::uint32_t xid, Device_ErrorCode code, std::vector<std::uint8_t>& out)
{
    Device_Error result = {code};
    return replyResult(xid, xdrProc(xdr_Device_Error), &result, out);
}

// Decodes the arguments, runs `body` and frees what decoding allocated. Undecodable arguments
// answer GARBAGE_ARGS and end the connection.
template <class TArgs, class TBody>
bool withArgs(XDR& x, std::uint32_t xid, bool_t (*decode)(XDR*, TArgs*), std::vector<std::uint8_t>& out, TBody body)
{
    TArgs args;
    std::memset(&args, 0, sizeof args);
    bool ok = decode(&x, &args);
    if (ok) {
        body(args);
    } else {
        encodeReply(acceptedReply(xid, GARBAGE_ARGS), out);
    }
    xdr_free(xdrProc(decode), reinterpret_cast<char*>(&args));
    return ok;
}

// Decodes the arguments, lets `fill` set a zeroed result from them and answers with that result.
template <class TArgs, class TResult, class TFill>
bool answer(XDR& x, std::uint32_t xid, bool_t (*decode)(XDR*, TArgs*), bool_t (*encode)(XDR*, TResult*),
            std::vector<std::uint8_t>& out, TFill fill)
{
    return withArgs(x, xid, decode, out, [&](TArgs& args) {
        TResult result;
        std::memset(&result, 0, sizeof result);
        fill(args, result);
        replyResult(xid, xdrProc(encode), &result, out);
    });
}

bool dispatchCore(XDR& x, std::uint32_t xid, std::uint32_t proc, CIVxi11Device& device, std::vector<std::uint8_t>& out)
{
    switch (proc) {
    case 0: // NULLPROC: a ping
        return replyResult(xid, xdrProc(xdr_void), nullptr, out);
    case create_link:
        return answer(x, xid, xdr_Create_LinkParms, xdr_Create_LinkResp, out,
                      [&](Create_LinkParms& a, Create_LinkResp& r) { device.createLink(a, r); });
    case device_write:
        return answer(x, xid, xdr_Device_WriteParms, xdr_Device_WriteResp, out,
                      [&](Device_WriteParms& a, Device_WriteResp& r) { r.error = device.write(a, r.size); });
    case device_read: {
        std::string data; // the reply points into it until it is encoded
        return answer(x, xid, xdr_Device_ReadParms, xdr_Device_ReadResp, out,
                      [&](Device_ReadParms& a, Device_ReadResp& r) {
                          r.error = device.read(a, data, r.reason);
                          r.data.data_len = static_cast<u_int>(data.size());
                          r.data.data_val = data.empty() ? nullptr : &data[0];
                      });
    }
    case device_readstb:
        return answer(x, xid, xdr_Device_GenericParms, xdr_Device_ReadStbResp, out,
                      [&](Device_GenericParms& a, Device_ReadStbResp& r) { r.error = device.readStb(a, r.stb); });
    case device_trigger:
    case device_clear:
    case device_remote:
    case device_local:
        return withArgs(x, xid, xdr_Device_GenericParms, out, [&](Device_GenericParms& a) {
            const long notSupported = 8;
            long code = proc == device_trigger ? device.trigger(a)
                : proc == device_clear         ? device.clear(a)
                                               : notSupported; // no remote/local state on USB
            replyError(xid, code, out);
        });
    case device_lock:
        return withArgs(x, xid, xdr_Device_LockParms, out,
                        [&](Device_LockParms& a) { replyError(xid, device.lock(a), out); });
    case device_unlock:
    case destroy_link:
        return withArgs(x, xid, xdr_Device_Link, out, [&](Device_Link& lid) {
            replyError(xid, proc == device_unlock ? device.unlock(lid) : device.destroyLink(lid), out);
        });
    case device_enable_srq:
        return withArgs(x, xid, xdr_Device_EnableSrqParms, out,
                        [&](Device_EnableSrqParms& a) { replyError(xid, device.enableSrq(a), out); });
    case device_docmd:
        return answer(x, xid, xdr_Device_DocmdParms, xdr_Device_DocmdResp, out,
                      [](Device_DocmdParms&, Device_DocmdResp& r) { r.error = 8; }); // no device-specific commands
    case create_intr_chan:
        return withArgs(x, xid, xdr_Device_RemoteFunc, out,
                        [&](Device_RemoteFunc& a) { replyError(xid, device.createIntrChan(a), out); });
    case destroy_intr_chan:
        return replyError(xid, device.destroyIntrChan(), out);
    default:
        encodeReply(acceptedReply(xid, PROC_UNAVAIL), out);
        return true;
    }
}

} // namespace

bool readRpcRecord(const std::function<bool(void*, std::size_t)>& readExact, std::size_t maxRecord,
                   std::vector<std::uint8_t>& record)
{
    record.clear();
    int empty = 0;
    for (;;) {
        std::uint8_t raw[4];
        if (!readExact(raw, sizeof raw)) {
            return false;
        }
        std::uint32_t header =
            (std::uint32_t(raw[0]) << 24) | (std::uint32_t(raw[1]) << 16) | (std::uint32_t(raw[2]) << 8) | raw[3];
        std::size_t length = header & ~RECORD_LAST_FRAGMENT;
        if (length > maxRecord - record.size()) {
            return false;
        }
        if (length == 0 && ++empty > MAX_EMPTY_FRAGMENTS) {
            return false;
        }
        std::size_t at = record.size();
        record.resize(at + length);
        if (length != 0 && !readExact(record.data() + at, length)) {
            return false;
        }
        if (header & RECORD_LAST_FRAGMENT) {
            return true;
        }
    }
}

bool dispatchVxi11(EVxi11Channel channel, const std::vector<std::uint8_t>& record, CIVxi11Device& device,
                   std::vector<std::uint8_t>& reply)
{
    reply.clear();
    XDR x;
    xdrmem_create(&x, const_cast<char*>(reinterpret_cast<const char*>(record.data())),
                  static_cast<u_int>(record.size()), XDR_DECODE);
    // Credentials are decoded into these buffers, so decoding allocates nothing for them.
    char cred[MAX_AUTH_BYTES];
    char verf[MAX_AUTH_BYTES];
    rpc_msg call;
    std::memset(&call, 0, sizeof call);
    call.rm_call.cb_cred.oa_base = cred;
    call.rm_call.cb_verf.oa_base = verf;
    bool ok = xdr_callmsg(&x, &call) && call.rm_direction == CALL;
    if (!ok) {
        xdr_destroy(&x);
        return false; // not even a call header: nothing to answer
    }
    std::uint32_t xid = call.rm_xid;
    std::uint32_t prog = channel == EVxi11Channel::Core ? DEVICE_CORE : DEVICE_ASYNC;
    if (call.rm_call.cb_rpcvers != RPC_VERSION) {
        rpc_msg msg;
        std::memset(&msg, 0, sizeof msg);
        msg.rm_xid = xid;
        msg.rm_direction = REPLY;
        msg.rm_reply.rp_stat = MSG_DENIED;
        msg.rjcted_rply.rj_stat = RPC_MISMATCH;
        msg.rjcted_rply.rj_vers.low = RPC_VERSION;
        msg.rjcted_rply.rj_vers.high = RPC_VERSION;
        encodeReply(msg, reply);
        ok = false;
    } else if (call.rm_call.cb_prog != prog) {
        ok = encodeReply(acceptedReply(xid, PROG_UNAVAIL), reply);
    } else if (call.rm_call.cb_vers != 1) {
        rpc_msg msg = acceptedReply(xid, PROG_MISMATCH);
        msg.acpted_rply.ar_vers.low = 1;
        msg.acpted_rply.ar_vers.high = 1;
        ok = encodeReply(msg, reply);
    } else if (channel == EVxi11Channel::Core) {
        ok = dispatchCore(x, xid, call.rm_call.cb_proc, device, reply);
    } else if (call.rm_call.cb_proc == 0) {
        ok = replyResult(xid, xdrProc(xdr_void), nullptr, reply);
    } else if (call.rm_call.cb_proc == device_abort) {
        ok = withArgs(x, xid, xdr_Device_Link, reply,
                      [&](Device_Link& lid) { replyError(xid, device.abort(lid), reply); });
    } else {
        ok = encodeReply(acceptedReply(xid, PROC_UNAVAIL), reply);
    }
    xdr_destroy(&x);
    return ok;
}

bool encodeSrqCall(std::uint32_t xid, const std::string& handle, std::vector<std::uint8_t>& out)
{
    rpc_msg call;
    std::memset(&call, 0, sizeof call);
    call.rm_xid = xid;
    call.rm_direction = CALL;
    call.rm_call.cb_rpcvers = RPC_VERSION;
    call.rm_call.cb_prog = DEVICE_INTR;
    call.rm_call.cb_vers = DEVICE_INTR_VERSION;
    call.rm_call.cb_proc = device_intr_srq;
    call.rm_call.cb_cred = _null_auth;
    call.rm_call.cb_verf = _null_auth;
    Device_SrqParms parms;
    parms.handle.handle_len = static_cast<u_int>(handle.size());
    parms.handle.handle_val = const_cast<char*>(handle.data());
    out.assign(4 + 512 + handle.size(), 0);
    XDR x;
    xdrmem_create(&x, reinterpret_cast<char*>(out.data()) + 4, static_cast<u_int>(out.size() - 4), XDR_ENCODE);
    return finishRecord(x, xdr_callmsg(&x, &call) && xdr_Device_SrqParms(&x, &parms), out);
}

} // namespace LbPmxLan
