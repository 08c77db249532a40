"""End-to-end test of the LAN gateway with Debian's pyvisa-py, a VISA that knows nothing of the
passport: VXI-11 (TCPIP::127.0.0.1::inst0::INSTR) and raw sockets (TCPIP::127.0.0.1::<port>::SOCKET)
against the two default simulated sensors of a running lbpmx-lan, started by scripts/checks/lan.sh.

Usage: /usr/bin/python3 lan_pyvisa.py <socket base port> <control folder>
The control folder holds the FIFOs of the test-only preload that unplugs simulated sensors.
"""
import signal
import socket
import subprocess
import sys
import threading

import pyvisa
from pyvisa import constants
from pyvisa.errors import VisaIOError
from pyvisa_py.protocols import rpc, vxi11

HOST = "127.0.0.1"
WAITLOCK = 1
# VXI-11 error codes
DEVICE_NOT_ACCESSIBLE, INVALID_LINK, PARAMETER_ERROR = 3, 4, 5
OUT_OF_RESOURCES, DEVICE_LOCKED, NO_LOCK_HELD, IO_TIMEOUT = 9, 11, 12, 15


def step(text):
    print("  " + text, flush=True)


def core_port():
    mapper = rpc.TCPPortMapperClient(HOST)
    try:
        return mapper.get_port((vxi11.DEVICE_CORE_PROG, vxi11.DEVICE_CORE_VERS, rpc.IPPROTO_TCP, 0))
    finally:
        mapper.close()


def open_instr(rm, device):
    inst = rm.open_resource("TCPIP::%s::%s::INSTR" % (HOST, device))
    inst.timeout = 5000
    inst.write_termination = "\n"
    return inst


def closed_by_peer(sock):
    sock.settimeout(10)
    try:
        return sock.recv(64) == b""
    except ConnectionResetError:
        return True


def measurement_and_trace(rm):
    inst = open_instr(rm, "inst0")
    idn = inst.query("*IDN?")
    step("inst0 *IDN? -> %r" % idn)
    assert idn == "Marlowe&Tenby,PMX-M01,100000,1.20", idn
    inst.write("FUNC POWER")
    inst.assert_trigger()
    power = float(inst.query("FETCh?"))
    step("power after a trigger: %.3f dBm" % power)
    assert -100.0 < power < 30.0, power
    inst.write("FUNC TRACE")
    inst.write("TRAC:POIN 8")
    inst.write("format real,32")
    trace = inst.query_binary_values("INIT", datatype="f", is_big_endian=False, expect_termination=False)
    step("trace: %s" % ", ".join("%.1f" % v for v in trace))
    assert len(trace) == 8 and all(-100.0 < v < 30.0 for v in trace), trace
    inst.write("format ascii")
    inst.write("FUNC POWER")
    assert inst.query("SYSTem:ERRor?") == '0, "No Error"'
    stb = inst.read_stb()
    step("status byte %d, then clear" % stb)
    assert stb & 4 == 0, stb
    inst.clear()
    by_serial = open_instr(rm, "100001")
    assert by_serial.query("*IDN?") == "Marlowe&Tenby,PMX-M10,100001,1.20"
    by_serial.close()
    return inst


def locking(rm, inst):
    other = open_instr(rm, "inst0")
    inst.lock_excl()
    try:
        other.lock_excl()
        raise AssertionError("a second client got the lock")
    except VisaIOError as e:
        assert e.error_code == constants.VI_ERROR_RSRC_LOCKED, e
    try:
        other.query("*IDN?")
        raise AssertionError("a second client wrote to a locked sensor")
    except VisaIOError:
        pass
    assert inst.query("*IDN?").startswith("Marlowe&Tenby,")
    inst.unlock()
    other.lock_excl()
    assert other.query("*IDN?").startswith("Marlowe&Tenby,")
    other.unlock()
    other.close()
    step("lock held against a second client, then handed over")


def error_codes():
    client = vxi11.CoreClient(HOST)
    try:
        assert client.create_link(1, 0, 0, "inst9")[0] == DEVICE_NOT_ACCESSIBLE
        error, link, abort_port, max_recv = client.create_link(1, 0, 0, "inst0")
        assert error == 0 and abort_port > 0 and max_recv >= 1024, (error, abort_port, max_recv)
        assert client.device_write(link + 1000, 1000, 0, 8, b"*IDN?\n")[0] == INVALID_LINK
        assert client.device_read(link, 0, 1000, 0, 0, 0)[0] == PARAMETER_ERROR
        assert client.device_read(link, 100, 300, 0, 0, 0)[0] == IO_TIMEOUT  # nothing to read
        assert client.device_unlock(link) == NO_LOCK_HELD
        assert client.destroy_link(link) == 0
        assert client.destroy_link(link) == INVALID_LINK
    finally:
        client.close()
    step("VXI-11 error codes: not accessible, invalid link, parameter, I/O timeout, no lock")


def service_request():
    server = socket.socket()
    server.bind((HOST, 0))
    server.listen(4)
    server.settimeout(10)
    client = vxi11.CoreClient(HOST)
    try:
        error, link, _, _ = client.create_link(3, 0, 0, "inst0")
        assert error == 0, error
        host = int.from_bytes(socket.inet_aton(HOST), "big")
        intr_prog, tcp = 0x0607B1, 0
        # pyvisa-py's create_intr_chan packs the wrong structure; the call is made with the right one.
        params = (host, server.getsockname()[1], intr_prog, 1, tcp)
        assert client.make_call(vxi11.CREATE_INTR_CHAN, params, client.packer.pack_device_remote_func_parms,
                                client.unpacker.unpack_device_error) == 0
        assert client.device_enable_srq(link, True, b"srq-1") == 0
        assert client.device_write(link, 5000, 0, 8, b"INIT\n")[0] == 0  # the trigger state changes
        conn, _ = server.accept()
        conn.settimeout(10)
        record = b""
        while len(record) < 4 or len(record) < 4 + (int.from_bytes(record[:4], "big") & 0x7FFFFFFF):
            chunk = conn.recv(4096)
            assert chunk, "interrupt channel closed early"
            record += chunk
        conn.close()
        words = [int.from_bytes(record[i:i + 4], "big") for i in range(4, 48, 4)]
        # xid, CALL, RPC version 2, program, version, device_intr_srq, null credentials and verifier
        assert words[1:6] == [0, 2, intr_prog, 1, 30], words
        assert words[10] == 5 and record[48:53] == b"srq-1", record
        client.device_read(link, 1000, 5000, 0, 0, 0)  # the measurement of INIT
        assert client.device_enable_srq(link, False, b"") == 0
        assert client.destroy_intr_chan() == 0
        assert client.destroy_intr_chan() == 6  # no channel
        client.destroy_link(link)
    finally:
        client.close()
        server.close()
    step("a service request reached the client's interrupt channel")


def raw_socket(rm, base):
    sock = rm.open_resource("TCPIP::%s::%d::SOCKET" % (HOST, base))
    sock.timeout = 5000
    sock.read_termination = "\n"
    sock.write_termination = "\n"
    assert sock.query("*IDN?") == "Marlowe&Tenby,PMX-M01,100000,1.20"
    sock.write("FUNC TRACE")
    sock.write("TRAC:POIN 4")
    sock.write("format real,32")
    sock.write("INIT")
    trace = sock.query_binary_values("FETC?", datatype="f")
    assert len(trace) == 4, trace
    sock.write("format ascii")
    sock.write("FUNC POWER")
    sock.close()
    second = rm.open_resource("TCPIP::%s::%d::SOCKET" % (HOST, base + 1))
    second.read_termination = "\n"
    assert second.query("*IDN?") == "Marlowe&Tenby,PMX-M10,100001,1.20"
    second.close()
    step("raw sockets on ports %d and %d" % (base, base + 1))


def several_clients():
    errors = []

    def client(n):
        try:
            c = vxi11.CoreClient(HOST)
            error, link, _, _ = c.create_link(n, 0, 0, "inst0")
            assert error == 0, error
            for _ in range(5):
                assert c.device_lock(link, WAITLOCK, 30000) == 0
                assert c.device_write(link, 5000, 0, 8, b"*IDN?\n")[0] == 0
                error, reason, data = c.device_read(link, 1000, 5000, 0, 0, 0)
                assert error == 0 and data == b"Marlowe&Tenby,PMX-M01,100000,1.20", (error, data)
                assert c.device_unlock(link) == 0
            c.destroy_link(link)
            c.close()
        except Exception as e:  # reported by the main thread
            errors.append("client %d: %r" % (n, e))

    threads = [threading.Thread(target=client, args=(n,)) for n in range(4)]
    for t in threads:
        t.start()
    for t in threads:
        t.join(120)
    assert not errors and not any(t.is_alive() for t in threads), errors
    step("four clients took turns on inst0 under the lock")


def link_limit():
    clients = [vxi11.CoreClient(HOST) for _ in range(7)]
    try:
        results = [c.create_link(1, 0, 0, "inst1")[0] for c in clients]
        assert results == [0] * 6 + [OUT_OF_RESOURCES], results
    finally:
        for c in clients:
            c.close()  # closing the connection destroys its links
    step("a seventh link on one sensor is refused (max-links 6)")


KILLED_CLIENT = r"""
import sys
from pyvisa_py.protocols import vxi11
c = vxi11.CoreClient("127.0.0.1")
error, link, _, _ = c.create_link(9, 1, 0, "inst0")  # created locked
assert error == 0, error
print("reading", flush=True)
c.device_read(link, 100, 60000, 0, 0, 0)  # nothing comes: killed while waiting
"""


def killed_client():
    child = subprocess.Popen([sys.executable, "-I", "-c", KILLED_CLIENT], stdout=subprocess.PIPE, text=True)
    try:
        assert child.stdout.readline().strip() == "reading"
    finally:
        child.kill()
        child.wait(30)
    c = vxi11.CoreClient(HOST)
    error, link, _, _ = c.create_link(2, 0, 0, "inst0")
    assert error == 0, error
    # Waits in the gateway until the vanished client's link (and its lock) is gone.
    assert c.device_lock(link, WAITLOCK, 30000) == 0
    c.device_unlock(link)
    c.destroy_link(link)
    c.close()
    step("a client killed mid-read freed its link and lock")


def refused_and_malformed(base, port):
    for target in (base, port):
        s = socket.socket()
        s.bind(("127.0.0.2", 0))  # outside the allow-list 127.0.0.1/32
        s.connect((HOST, target))
        assert closed_by_peer(s), target
        s.close()
    step("clients outside the allow-list are refused")
    s = socket.create_connection((HOST, base), 10)
    s.sendall(b"*IDN\x00?\n")
    s.settimeout(10)
    assert s.recv(100) == b"ERROR: malformed input\n"
    assert closed_by_peer(s)
    s.close()
    s = socket.create_connection((HOST, port), 10)
    s.sendall(b"\x80\x00\x00\x08garbage!")  # one record that is no RPC call
    assert closed_by_peer(s)
    s.close()
    step("malformed socket and RPC input close the connection")


def unplug(rm, control):
    def sim(command):
        with open(control + "/ctl", "w") as ctl:
            ctl.write(command + "\n")
        with open(control + "/ack") as ack:
            assert ack.readline().strip() == "0", command

    inst = open_instr(rm, "inst1")
    assert "100001" in inst.query("*IDN?")
    sim("detach 100001")
    try:
        inst.query("*IDN?")
        raise AssertionError("an unplugged sensor answered")
    except VisaIOError:
        pass
    inst.close()
    sim("attach PMX-M10 100001")
    for name in ("inst1", "100001"):
        again = open_instr(rm, name)
        assert again.query("*IDN?") == "Marlowe&Tenby,PMX-M10,100001,1.20", name
        again.close()
    step("an unplugged sensor fails; replugged, it is inst1 again")


def main(base, control):
    signal.alarm(200)  # a hang fails the test instead of stalling the test command
    port = core_port()
    step("rpcbind lists the VXI-11 core channel on port %d" % port)
    assert port > 0
    rm = pyvisa.ResourceManager("@py")
    try:
        inst = measurement_and_trace(rm)
        locking(rm, inst)
        error_codes()
        service_request()
        raw_socket(rm, base)
        several_clients()
        link_limit()
        killed_client()
        refused_and_malformed(base, port)
        assert inst.query("*IDN?").startswith("Marlowe&Tenby,")  # the gateway survived it all
        unplug(rm, control)
        inst.close()
    finally:
        rm.close()


if __name__ == "__main__":
    if len(sys.argv) != 3:
        sys.exit("usage: lan_pyvisa.py <socket base port> <control folder>")
    try:
        main(int(sys.argv[1]), sys.argv[2])
    except (AssertionError, VisaIOError) as e:
        print("FAILED: %s: %s" % (type(e).__name__, e), flush=True)
        sys.exit(1)
    print("LAN gateway test passed")
