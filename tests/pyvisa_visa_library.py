"""pyvisa features that reach the VISA library's own functions: flush() (viFlush), read_bytes,
query_binary_values, interface_type / interface_number (answered by the runtime from
viParseRsrcEx), and events enabled twice and disabled twice (success codes, not errors).

Usage: /usr/bin/python3 pyvisa_visa_library.py <path of libvisa.so>
"""
import struct
import sys

import pyvisa
from pyvisa import constants


def main(library):
    rm = pyvisa.ResourceManager(library)
    try:
        name = rm.list_resources()[0]
        info = rm.resource_info(name)
        inst = rm.open_resource(name)
        try:
            run_session(rm, inst, info)
        finally:
            inst.close()
    finally:
        rm.close()


def run_session(rm, inst, info):
    inst.timeout = 5000
    inst.write_termination = "\n"
    assert inst.interface_type == info.interface_type, (inst.interface_type, info)
    assert inst.interface_number == info.interface_board_number, (inst.interface_number, info)

    # read_bytes reads as many bytes as asked; flush() reaches viFlush with pyvisa's masks.
    # (The passport refuses a read buffer smaller than the answer: room is left, and the read
    # ends at the termination character.)
    inst.read_termination = "\n"
    inst.write("*IDN?")
    raw = inst.read_raw()
    inst.write("*IDN?")
    assert inst.read_bytes(len(raw) + 8, break_on_termchar=True) == raw, raw
    inst.read_termination = None
    inst.flush(constants.BufferOperation.discard_read_buffer_no_io
               | constants.BufferOperation.flush_write_buffer)
    inst.flush(constants.BufferOperation.discard_read_buffer)
    try:
        inst.flush(constants.BufferOperation.discard_read_buffer
                   | constants.BufferOperation.discard_read_buffer_no_io)
        raise AssertionError("both read masks at once were accepted")
    except pyvisa.errors.VisaIOError as e:
        assert e.error_code == constants.StatusCode.error_invalid_mask, e

    # The sensor sends float blocks least significant byte first.
    inst.write("FUNC TRACE")
    inst.write("TRAC:POIN 8")
    inst.write("format real,32")
    inst.write("INIT")
    raw = inst.read_raw()
    inst.write("INIT")
    trace = inst.query_binary_values("INIT", datatype="f", is_big_endian=False,
                                     expect_termination=False)
    assert len(trace) == 8 and all(-100.0 < v < 30.0 for v in trace), trace
    # The same bytes read big-endian are other numbers: the order matters.
    digits = int(raw[1:2])
    data = raw[2 + digits:2 + digits + 32]
    little = struct.unpack("<8f", data)
    big = struct.unpack(">8f", data)
    assert little != big and all(-100.0 < v < 30.0 for v in little), (little, big)
    inst.write("format ascii")
    inst.write("FUNC POWER")

    # Enabling twice and disabling twice answer success codes of their own.
    lib = rm.visalib
    srq = constants.EventType.service_request
    queue = constants.EventMechanism.queue
    assert lib.enable_event(inst.session, srq, queue) == constants.StatusCode.success
    assert (lib.enable_event(inst.session, srq, queue)
            == constants.StatusCode.success_event_already_enabled)
    assert lib.disable_event(inst.session, srq, queue) == constants.StatusCode.success
    assert (lib.disable_event(inst.session, srq, queue)
            == constants.StatusCode.success_event_already_disabled)
    error = inst.query("SYSTem:ERRor?")
    assert error == '0, "No Error"', error


if __name__ == "__main__":
    if len(sys.argv) != 2:
        sys.exit("usage: pyvisa_visa_library.py <visa library>")
    try:
        main(sys.argv[1])
    except AssertionError as e:
        print("FAILED: %s" % e, flush=True)
        sys.exit(1)
    print("pyvisa VISA library test passed")
