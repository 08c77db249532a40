"""End-to-end cases of the LAN gateway beyond tests/lan_pyvisa.py: raw-socket queries of several
clients at once, answers read in pieces, and a raw socket whose sensor was unplugged and plugged
back. Run by scripts/checks/lan.sh against its running gateway (max-links 6, sensors 100000 and
100001), after lan_pyvisa.py.

Usage: /usr/bin/python3 lan_faults.py <socket base port> <control folder>
"""
import signal
import socket
import sys
import threading

import pyvisa
from pyvisa_py.protocols import vxi11

HOST = "127.0.0.1"
REQCNT, CHR, END = 1, 2, 4
TERMCHRSET = 0x80
IO_TIMEOUT = 15
IDN0 = b"Marlowe&Tenby,PMX-M01,100000,1.20"


def step(text):
    print("  " + text, flush=True)


def sim(control, command):
    with open(control + "/ctl", "w") as ctl:
        ctl.write(command + "\n")
    with open(control + "/ack") as ack:
        answer = ack.readline().strip()
    assert answer == "0", (command, answer)


def socket_queries_at_once(base):
    queries = [(b"*IDN?\n", IDN0 + b"\n"), (b"SYST:VERS?\n", b"1999.0\n"), (b"*TST?\n", b"0\n"),
               (b"*OPC?\n", b"1\n")]
    bad = []
    start = threading.Barrier(len(queries))

    def client(k):
        query, expected = queries[k]
        with socket.create_connection((HOST, base), 10) as s:
            s.settimeout(10)
            lines = s.makefile("rb")
            start.wait(10)
            for i in range(25):
                s.sendall(query)
                try:
                    line = lines.readline()
                except OSError as e:
                    line = repr(e).encode()
                if line != expected:
                    bad.append((k, i, line))
                    return

    threads = [threading.Thread(target=client, args=(k,)) for k in range(len(queries))]
    for t in threads:
        t.start()
    for t in threads:
        t.join(120)
    assert not bad and not any(t.is_alive() for t in threads), bad
    step("four socket clients querying one sensor at once each got their own answers")


def answers_in_pieces(rm):
    c = vxi11.CoreClient(HOST)
    try:
        error, link, _, _ = c.create_link(5, 0, 0, "inst0")
        assert error == 0, error
        assert c.device_write(link, 5000, 0, 8, b"*IDN?\n")[0] == 0
        assert c.device_read(link, 8, 5000, 0, 0, 0) == (0, REQCNT, IDN0[:8])
        assert c.device_read(link, 8, 5000, 0, TERMCHRSET, ord(",")) == (0, CHR, IDN0[8:14])
        assert c.device_read(link, 1000, 5000, 0, 0, 0) == (0, END, IDN0[14:])
        # What is left of an answer is dropped by the next write and by a clear.
        assert c.device_write(link, 5000, 0, 8, b"*IDN?\n")[0] == 0
        assert c.device_read(link, 4, 5000, 0, 0, 0)[:2] == (0, REQCNT)
        assert c.device_write(link, 5000, 0, 8, b"*TST?\n")[0] == 0
        assert c.device_read(link, 100, 5000, 0, 0, 0) == (0, END, b"0")
        assert c.device_write(link, 5000, 0, 8, b"*IDN?\n")[0] == 0
        assert c.device_read(link, 4, 5000, 0, 0, 0)[:2] == (0, REQCNT)
        assert c.device_clear(link, 0, 0, 5000) == 0
        assert c.device_read(link, 100, 300, 0, 0, 0)[0] == IO_TIMEOUT
        c.destroy_link(link)
    finally:
        c.close()
    inst = rm.open_resource("TCPIP::%s::inst0::INSTR" % HOST)
    inst.timeout = 5000
    inst.write_termination = "\n"
    inst.chunk_size = 1024
    for command in ("FUNC TRACE", "TRAC:POIN 1024", "format real,32", "INIT"):
        inst.write(command)
    trace = inst.query_binary_values("FETC?", datatype="f", is_big_endian=False)
    assert len(trace) == 1024, len(trace)
    inst.write("format ascii")
    inst.write("FUNC POWER")
    inst.close()
    step("answers larger than the request are read in pieces (REQCNT, CHR, END)")


def replugged_socket(base, control):
    old = socket.create_connection((HOST, base + 1), 10)
    old.settimeout(10)
    old.sendall(b"*IDN?\n")
    assert old.recv(100).startswith(b"Marlowe&Tenby,PMX-M10,100001")
    sim(control, "detach 100001")
    sim(control, "attach PMX-M10 100001")
    old.sendall(b"*IDN?\n")
    try:
        assert old.recv(100) == b"", "a dead session's connection stayed open"
    except ConnectionResetError:
        pass
    old.close()
    with socket.create_connection((HOST, base + 1), 10) as again:
        again.settimeout(10)
        again.sendall(b"*IDN?\n")
        assert again.recv(100).startswith(b"Marlowe&Tenby,PMX-M10,100001")
    step("a socket whose sensor was replugged is closed; a new one works")


def socket_link_limit(base):
    clients = []
    try:
        for _ in range(7):  # max-links 6 (links closed just before may still count for a moment)
            s = socket.create_connection((HOST, base), 10)
            s.settimeout(10)
            clients.append(s)
            s.sendall(b"*OPC?\n")
            answer = s.recv(100)
            if answer != b"1\n":
                assert answer == b"ERROR: link limit reached\n", answer
                break
        else:
            raise AssertionError("a seventh socket on one sensor was served")
    finally:
        for s in clients:
            s.close()
    step("a socket beyond the link limit is told so")


def main(base, control):
    signal.alarm(200)  # a hang fails the test instead of stalling the test command
    rm = pyvisa.ResourceManager("@py")
    try:
        socket_queries_at_once(base)
        socket_link_limit(base)
        answers_in_pieces(rm)
        replugged_socket(base, control)
    finally:
        rm.close()


if __name__ == "__main__":
    if len(sys.argv) != 3:
        sys.exit("usage: lan_faults.py <socket base port> <control folder>")
    try:
        main(int(sys.argv[1]), sys.argv[2])
    except (AssertionError, pyvisa.errors.VisaIOError) as e:
        print("FAILED: %s: %s" % (type(e).__name__, e), flush=True)
        sys.exit(1)
    print("LAN gateway fault cases passed")
