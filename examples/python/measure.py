"""Measures the power of a USB power sensor through VISA, as a test engineer's script would.

    python3 measure.py [--count N] [--frequency HZ] [--offset DB] [--unit DBM|W] [RESOURCE]

pyvisa finds the VISA library through PYVISA_LIBRARY. Without a resource the first sensor
listed is used. Prints the identity and one line per reading; a reading that fails prints the
VISA error instead. Exit code: 0 when every reading succeeded, 1 otherwise.
"""
import argparse
import sys

import pyvisa


def measure(rm, resource, count=3, frequency=None, offset=None, unit="DBM", averages=None):
    """Identity and readings of one sensor (None for a reading that failed, with its error)."""
    inst = rm.open_resource(resource)
    try:
        inst.write_termination = "\n"
        inst.timeout = 5000
        identity = inst.query("*IDN?").strip()
        inst.write("*RST")
        if frequency is not None:
            inst.write("SENS:FREQ %g" % frequency)
        if offset is not None:
            inst.write("SENS:CORR:OFFS %g" % offset)
        if averages is not None:
            inst.write("SENS:AVER:COUN %d" % averages)
            inst.write("SENS:AVER:STAT ON")
        inst.write("UNIT:POW %s" % unit)
        readings = []
        for _ in range(count):
            try:
                readings.append(float(inst.query("READ?")))
            except pyvisa.errors.VisaIOError as error:
                readings.append(error)
        return identity, readings
    finally:
        inst.close()


def main(argv=None):
    parser = argparse.ArgumentParser(description="Power readings through VISA")
    parser.add_argument("resource", nargs="?")
    parser.add_argument("--count", type=int, default=3)
    parser.add_argument("--frequency", type=float)
    parser.add_argument("--offset", type=float)
    parser.add_argument("--unit", default="DBM", choices=["DBM", "W"])
    args = parser.parse_args(argv)

    rm = pyvisa.ResourceManager()
    try:
        resources = rm.list_resources()
        if not resources:
            print("No sensor found")
            return 1
        resource = args.resource or resources[0]
        identity, readings = measure(rm, resource, args.count, args.frequency, args.offset, args.unit)
    finally:
        rm.close()
    print("Sensor: %s (%s)" % (identity, resource))
    unit = "dBm" if args.unit == "DBM" else "W"
    for number, reading in enumerate(readings, 1):
        if isinstance(reading, float):
            print("Reading %d: %.4g %s" % (number, reading, unit))
        else:
            print("Reading %d: failed: %s" % (number, reading))
    return 0 if all(isinstance(r, float) for r in readings) else 1


if __name__ == "__main__":
    sys.exit(main())
