"""Drives the simulated sensor library from Python through ctypes, by export name only."""
import ctypes
import sys
import threading

lib = ctypes.CDLL(sys.argv[1])
i32, i64 = ctypes.c_int32, ctypes.c_int64
NOTIFY = ctypes.CFUNCTYPE(None, i64, i32, ctypes.c_void_p)

for name in ("PmxSimReset", "PmxSimAttach", "PmxSimDetach", "PmxSimSetDeviceFlag", "PmxSimQueueResult",
             "PmxSimReportError", "PmxSimSetTriggerState", "PmxSimSetDelays", "PmxSimSetAutoAck",
             "PmxSimFailNext"):
    getattr(lib, name).restype = i32
lib.PmxSimQueueResult.argtypes = [ctypes.c_char_p, i32, ctypes.c_void_p, i32]
lib.PmxSimFailNext.argtypes = [ctypes.c_char_p, i32]
lib.PmxOpenSensor.argtypes = [ctypes.c_char_p, ctypes.POINTER(i64)]
lib.PmxSendCommand.argtypes = [i64, ctypes.c_char_p, i32]
lib.PmxGetData.argtypes = [i64] + [ctypes.POINTER(i32)] * 3
lib.PmxGetFloatResult.argtypes = [i64] + [ctypes.POINTER(ctypes.c_float)] * 3
lib.PmxGetStringResult.argtypes = [i64, ctypes.c_char_p, i32]
lib.PmxSetNotifyCallbackDataAvailable.argtypes = [NOTIFY, ctypes.c_void_p]

data = threading.Event()
on_data = NOTIFY(lambda handle, value, user: data.set())

assert lib.PmxSimReset() == 0
assert lib.PmxSimSetDelays(0, 0) == 0
assert lib.PmxSetNotifyCallbackDataAvailable(on_data, None) == 0
assert lib.PmxOpenDriver() == 0
handle = i64()
assert lib.PmxOpenSensor(b"USB::0x0c6f::0003::100000", ctypes.byref(handle)) == 0
assert lib.PmxSendCommand(handle, b"*idn?", 0) == 0
assert data.wait(20)
kind, count, pending = i32(), i32(), i32()
assert lib.PmxGetData(handle, ctypes.byref(kind), ctypes.byref(count), ctypes.byref(pending)) == 0
assert kind.value == 10, kind.value
text = ctypes.create_string_buffer(1024)
assert lib.PmxGetStringResult(handle, text, 1024) == 0
assert text.value == b"Marlowe&Tenby,PMX-M01,100000,1.20", text.value

values = (ctypes.c_float * 1)(-12.5)
assert lib.PmxSimQueueResult(b"100000", 6, values, 1) == 0
first = ctypes.c_float()
assert lib.PmxGetFloatResult(handle, ctypes.byref(first), None, None) == 0
assert first.value == -12.5
assert lib.PmxSimFailNext(b"PmxGetData", 77) == 0
assert lib.PmxGetData(handle, ctypes.byref(kind), None, None) == 77
assert lib.PmxGetData(handle, ctypes.byref(kind), None, None) == ctypes.c_int32(0xC000000A).value
assert lib.PmxSetNotifyCallbackDataAvailable(NOTIFY(), None) == 0
assert lib.PmxCloseDriver() == 0
assert lib.PmxSimReset() == 0
print("ctypes check passed")
