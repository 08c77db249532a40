"""End-to-end cases of the LAN gateway beyond tests/lan_pyvisa.py: raw-socket queries of several
clients at once. Run by scripts/checks/lan.sh against its running gateway (max-links 6, sensors 100000 and
100001), after lan_pyvisa.py.

Usage: /usr/bin/python3 lan_faults.py <socket base port> <control folder>
"""
import signal
import socket
import sys
import threading

import pyvisa

HOST = "127.0.0.1"
IDN0 = b"Marlowe&Tenby,PMX-M01,100000,1.20"


def step(text):
    print("  " + text, flush=True)


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


def main(base, control):
    signal.alarm(200)  # a hang fails the test instead of stalling the test command
    rm = pyvisa.ResourceManager("@py")
    try:
        socket_queries_at_once(base)
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
