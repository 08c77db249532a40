"""Smoke test with a real VISA client: pyvisa loads the build's `visa` library, lists the sensors,
opens one with pyvisa's own resource class for the passport's interface type, and, at pyvisa's
default terminations (writes end in CR LF), queries its identity, reads a measurement in ASCII,
results pending together and continuous results as ASCII values, a trace as a binary block, the
operation status and the error queue.

Usage: /usr/bin/python3 pyvisa_smoke.py <path of libvisa.so>
Exit code 0 when everything answered as expected; the first failure ends the run (a VISA error
with its traceback, naming the call and its status).
"""
import ctypes
import os
import sys

import pyvisa
from pyvisa import constants
from pyvisa.resources import MessageBasedResource

# The passport's resources report this interface type; pyvisa maps it to a resource class of
# its own, so no resource_pyclass is passed when opening.
INTERFACE_TYPE = 0x8100


def step(text):
    print("  " + text, flush=True)


def main(library):
    rm = pyvisa.ResourceManager(library)
    try:
        resources = rm.list_resources()
        step("resources: %s" % ", ".join(resources))
        assert resources, "no resource listed"
        assert all(r.startswith("LBPMX::") and r.endswith("::INSTR") for r in resources), resources

        name = resources[0]
        info = rm.resource_info(name)
        step("resource info: interface type 0x%04X, board %d, class %s, name %s"
             % (int(info.interface_type), info.interface_board_number, info.resource_class,
                info.resource_name))
        assert int(info.interface_type) == INTERFACE_TYPE, info
        assert info.resource_class == "INSTR", info

        sim = ctypes.CDLL(os.path.join(os.path.dirname(library), "libPmxControl2_64.so"))
        sim.PmxSimQueueResult.argtypes = [ctypes.c_char_p, ctypes.c_int32, ctypes.c_void_p, ctypes.c_int32]
        inst = rm.open_resource(name)
        step("opened as %s" % type(inst).__name__)
        assert isinstance(inst, MessageBasedResource), type(inst)
        try:
            run_session(inst, sim)
        finally:
            inst.close()
    finally:
        rm.close()


def run_session(inst, sim):
    inst.timeout = 5000
    assert inst.timeout == 5000, inst.timeout
    assert inst.write_termination == "\r\n", repr(inst.write_termination)

    idn = inst.query("*IDN?")
    step("*IDN? -> %r" % idn)
    assert idn.startswith("Marlowe&Tenby,"), idn
    assert inst.get_visa_attribute(constants.VI_ATTR_USB_SERIAL_NUM) in idn, idn

    inst.write("FUNC POWER")
    inst.assert_trigger()
    power = float(inst.query("FETCh?"))
    step("power after a trigger: %.3f dBm" % power)
    assert -100.0 < power < 30.0, power

    # Results pending together are read as one list of values.
    serial = inst.get_visa_attribute(constants.VI_ATTR_USB_SERIAL_NUM).encode()
    for value in (1.5, -2.5):
        assert sim.PmxSimQueueResult(serial, 6, ctypes.byref(ctypes.c_float(value)), 1) == 0
    pending = inst.query_ascii_values("FETCh?")
    step("two results pending together: %s" % pending)
    assert pending == [1.5, -2.5], pending

    # A float array follows the data format: after "format real,32" it comes as a binary block.
    inst.write("FUNC TRACE")
    inst.write("TRAC:POIN 8")
    inst.write("format real,32")
    trace = inst.query_binary_values("INIT", datatype="f", is_big_endian=False,
                                     expect_termination=False)
    step("trace as a binary block: %s" % ", ".join("%.2f" % v for v in trace))
    assert len(trace) == 8, trace
    assert all(-100.0 < v < 30.0 for v in trace), trace
    inst.write("format ascii")
    inst.write("FUNC POWER")

    error = inst.query("SYSTem:ERRor?")
    step("SYSTem:ERRor? -> %r" % error)
    assert error == '0, "No Error"', error

    stb = inst.read_stb()
    step("status byte: %d" % stb)
    assert stb & 4 == 0, stb

    # Continuous results, each read parsed as ASCII values; the operation status shows the
    # measuring.
    inst.write("INIT:CONT ON")
    for _ in range(20):
        values = inst.query_ascii_values("FETCh?")
        assert values and all(-100.0 < v < 30.0 for v in values), values
    step("continuous results: %s" % ", ".join("%.3f" % v for v in values))
    condition = int(inst.query("STATus:OPERation:CONDition?"))
    step("STATus:OPERation:CONDition? -> %d" % condition)
    assert condition in (16, 32), condition
    inst.write("INIT:CONT OFF")


if __name__ == "__main__":
    if len(sys.argv) != 2:
        sys.exit("usage: pyvisa_smoke.py <visa library>")
    try:
        main(sys.argv[1])
    except AssertionError as e:
        print("FAILED: %s: %s" % (type(e).__name__, e), flush=True)
        sys.exit(1)
    print("pyvisa smoke test passed")
