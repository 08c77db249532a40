"""Smoke test with a real VISA client: pyvisa loads the build's `visa` library, lists the sensors,
opens one with pyvisa's own resource class for the passport's interface type, queries its
identity, reads a measurement in ASCII and a trace as a binary block, and the error queue.

Usage: /usr/bin/python3 pyvisa_smoke.py <path of libvisa.so>
Exit code 0 when everything answered as expected; the first failure ends the run (a VISA error
with its traceback, naming the call and its status).
"""
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

        inst = rm.open_resource(name)
        step("opened as %s" % type(inst).__name__)
        assert isinstance(inst, MessageBasedResource), type(inst)
        try:
            run_session(inst)
        finally:
            inst.close()
    finally:
        rm.close()


def run_session(inst):
    inst.timeout = 5000
    assert inst.timeout == 5000, inst.timeout
    # pyvisa ends writes with CR LF by default; the session recognises its own queries
    # ("SYSTem:ERRor?") only before a bare line feed and sends "syst:err?\r" on to the sensor,
    # which refuses it (VI_ERROR_NSUP_OPER). A line feed alone ends each command.
    inst.write_termination = "\n"

    idn = inst.query("*IDN?")
    step("*IDN? -> %r" % idn)
    assert idn.startswith("Marlowe&Tenby,"), idn
    assert inst.get_visa_attribute(constants.VI_ATTR_USB_SERIAL_NUM) in idn, idn

    inst.write("FUNC POWER")
    inst.assert_trigger()
    power = float(inst.query("FETCh?"))
    step("power after a trigger: %.3f dBm" % power)
    assert -100.0 < power < 30.0, power

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


if __name__ == "__main__":
    if len(sys.argv) != 2:
        sys.exit("usage: pyvisa_smoke.py <visa library>")
    try:
        main(sys.argv[1])
    except AssertionError as e:
        print("FAILED: %s: %s" % (type(e).__name__, e), flush=True)
        sys.exit(1)
    print("pyvisa smoke test passed")
