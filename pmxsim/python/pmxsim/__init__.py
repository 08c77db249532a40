"""Control of the simulated sensor-control library (PmxControl2_64) from Python, through ctypes.

The simulator that matters is the one the VISA runtime of this process loaded (through the
passport): `Simulator()` finds that library among the modules already loaded and never loads a
copy of its own, which would be a second, separate simulator. Create a pyvisa ResourceManager
first; `Simulator()` raises `PmxSimError` while no VISA runtime has loaded the library.

    rm = pyvisa.ResourceManager()          # loads the runtime, the passport and the library
    sim = pmxsim.Simulator()
    sim.attach("PMX-M02", "4711")          # appears in rm.list_resources()
    sim.load_scenario("noisy.yaml")        # PMXSIM_CONFIG, then a reset

Reset (also `load_scenario`) only while no VISA session to a sensor is open: a reset closes the
library's driver under the passport. pmxsim/README.md describes every function.
"""
import ctypes
import os
import sys

__all__ = ["Simulator", "PmxSimError", "library"]

# Result data types (PmxGetData, the data-available callback, queue_result).
TYPE_BINARY, TYPE_BITFIELD1, TYPE_BITFIELD2, TYPE_BITFIELD3 = 0, 1, 2, 3
TYPE_FLOAT_ARRAY, TYPE_FLOAT_TRIPLE, TYPE_FLOAT, TYPE_FLOAT_STREAM = 4, 5, 6, 7
TYPE_LONG_TRIPLE, TYPE_LONG, TYPE_TEXT, TYPE_AUX_FLOAT_ARRAY = 8, 9, 10, 11
_BYTE_TYPES = (TYPE_BINARY, TYPE_TEXT)
_INT_TYPES = (TYPE_BITFIELD1, TYPE_BITFIELD2, TYPE_BITFIELD3, TYPE_LONG_TRIPLE, TYPE_LONG)

# Result codes (as signed 32-bit values, as the library returns them).
def _code(value):
    return value - (1 << 32) if value >= (1 << 31) else value

NO_MORE_RESULTS = _code(0xC000000A)
COMMAND_IGNORED = _code(0xD0000007)
UNKNOWN_COMMAND = _code(0xD0000089)
DRIVER_NOT_OPEN = _code(0xD0000001)
INVALID_ARGUMENT = _code(0xD0000002)
NO_SUCH_SENSOR = _code(0xD0000005)
SENSOR_DETACHED = _code(0xD0000006)
BUFFER_TOO_SMALL = _code(0xD000000B)
SENSOR_NOT_OPEN = _code(0xD000000C)
ALREADY_ATTACHED = _code(0xD000000D)

_NAME = "PmxControl2_64"


class PmxSimError(Exception):
    """A control function failed (code: the library's result code), or no library is loaded."""

    def __init__(self, message, code=None):
        super().__init__(message)
        self.code = code


def _loaded_path_posix():
    # The file of the mapped library: the runtime may have loaded it from any folder.
    with open("/proc/self/maps") as maps:
        for line in maps:
            path = line.split(None, 5)[-1].strip()
            if os.path.basename(path).startswith("lib" + _NAME + ".so"):
                return path
    return None


def library():
    """The ctypes handle of the library instance this process loaded; never loads one."""
    if sys.platform == "win32":
        kernel32 = ctypes.WinDLL("kernel32", use_last_error=True)
        kernel32.GetModuleHandleW.restype = ctypes.c_void_p
        kernel32.GetModuleHandleW.argtypes = [ctypes.c_wchar_p]
        handle = kernel32.GetModuleHandleW(_NAME + ".dll")
        if handle:
            return ctypes.CDLL(_NAME + ".dll", handle=handle)
    else:
        path = _loaded_path_posix()
        if path is not None:
            # RTLD_NOLOAD: a reference to the loaded instance, or a failure, never a new copy.
            return ctypes.CDLL(path, mode=os.RTLD_NOLOAD | os.RTLD_NOW)
    raise PmxSimError("the simulated sensor library is not loaded in this process: create a "
                      "pyvisa ResourceManager (which loads the VISA runtime and the passport) first")


def _text(value):
    return value.encode() if isinstance(value, str) else value


class Simulator:
    """The PmxSim* control functions of the loaded library; each raises PmxSimError on failure."""

    def __init__(self, lib=None):
        self._lib = lib if lib is not None else library()
        i32, text = ctypes.c_int32, ctypes.c_char_p
        signatures = {
            "PmxSimReset": [], "PmxSimAttach": [text, text], "PmxSimDetach": [text],
            "PmxSimSetDeviceFlag": [text, i32], "PmxSimQueueResult": [text, i32, ctypes.c_void_p, i32],
            "PmxSimReportError": [text, i32], "PmxSimSetTriggerState": [text, i32],
            "PmxSimGetLastCommand": [text, text, i32, ctypes.POINTER(i32)],
            "PmxSimSetDelays": [i32, i32], "PmxSimSetAutoAck": [i32], "PmxSimFailNext": [text, i32],
            "PmxGetErrorText": [i32, text, i32],
        }
        for name, argtypes in signatures.items():
            function = getattr(self._lib, name)
            function.argtypes, function.restype = argtypes, i32

    def _call(self, name, *args):
        self._check(name, getattr(self._lib, name)(*args))

    def _check(self, name, code):
        if code != 0:
            raise PmxSimError("%s failed: %s (0x%08X)" % (name, self.error_text(code), code & 0xFFFFFFFF),
                              code)

    def error_text(self, code):
        buffer = ctypes.create_string_buffer(256)
        self._lib.PmxGetErrorText(_code(code & 0xFFFFFFFF), buffer, len(buffer))
        return buffer.value.decode(errors="replace")

    def reset(self):
        """As freshly loaded: sensors, delays and faults from PMXSIM_CONFIG or PMXSIM_DEVICES."""
        self._call("PmxSimReset")

    def load_scenario(self, path):
        """Sets PMXSIM_CONFIG to the scenario file (None: unset) and resets. A malformed file
        leaves no sensor and one line on stderr."""
        if path is None:
            os.environ.pop("PMXSIM_CONFIG", None)
        else:
            os.environ["PMXSIM_CONFIG"] = os.fspath(path)
        self.reset()

    def attach(self, sensor_type, serial):
        self._call("PmxSimAttach", _text(sensor_type), _text(serial))

    def detach(self, serial):
        self._call("PmxSimDetach", _text(serial))

    def set_device_flag(self, serial, flag):
        self._call("PmxSimSetDeviceFlag", _text(serial), flag)

    def queue_result(self, serial, data_type, values):
        """Queues a result for the open sensor: bytes or str for TYPE_BINARY and TYPE_TEXT, a
        sequence of ints or floats for the other types."""
        if data_type in _BYTE_TYPES:
            data = _text(values)
            buffer, count = ctypes.create_string_buffer(data, len(data)), len(data)
        else:
            element = ctypes.c_int32 if data_type in _INT_TYPES else ctypes.c_float
            buffer, count = (element * len(values))(*values), len(values)
        self._call("PmxSimQueueResult", _text(serial), data_type, ctypes.cast(buffer, ctypes.c_void_p),
                   count)

    def report_error(self, serial, code):
        """Fires the error callback of the open sensor (serial None: handle 0)."""
        self._call("PmxSimReportError", _text(serial) if serial else None, _code(code & 0xFFFFFFFF))

    def set_trigger_state(self, serial, state):
        self._call("PmxSimSetTriggerState", _text(serial), state)

    def last_command(self, serial):
        """(text, timeout) of the sensor's last command since it was opened."""
        size, timeout = 4096, ctypes.c_int32()
        while True:  # the library keeps commands of any length; the buffer grows until one fits
            text = ctypes.create_string_buffer(size)
            code = self._lib.PmxSimGetLastCommand(_text(serial), text, size, ctypes.byref(timeout))
            if code != BUFFER_TOO_SMALL or size >= 1 << 30:
                break
            size *= 4
        self._check("PmxSimGetLastCommand", code)
        return text.value.decode(errors="replace"), timeout.value

    def set_delays(self, ack_ms, measure_ms):
        self._call("PmxSimSetDelays", ack_ms, measure_ms)

    def set_auto_ack(self, on):
        self._call("PmxSimSetAutoAck", 1 if on else 0)

    def fail_next(self, function, code):
        """The next call of the named library function (e.g. "PmxGetData") returns code."""
        self._call("PmxSimFailNext", _text(function), _code(code & 0xFFFFFFFF))
