"""The pmxsim Python module controls the library instance the VISA runtime of the process
loaded, and never loads one of its own."""
import os
import subprocess
import sys

import pytest

import pmxsim

HERE = os.path.dirname(os.path.abspath(__file__))


def test_controls_the_instance_the_visa_runtime_loaded(visa_rm, simulator):
    simulator.attach("PMX-M02", "4711")
    assert "LBPMX::0x0004::4711::INSTR" in visa_rm.list_resources()
    with pytest.raises(pmxsim.PmxSimError) as failure:
        simulator.attach("PMX-M02", "4711")
    assert failure.value.code == pmxsim.ALREADY_ATTACHED
    assert "Serial number already attached" in str(failure.value)

    inst = visa_rm.open_resource("LBPMX::0x0004::4711::INSTR")
    inst.write_termination = "\n"
    inst.write("FREQ 2e9")
    assert simulator.last_command("4711") == ("freq 2e9\n", 0)
    inst.write("FREQ " + "0" * 20000 + "1e9")  # longer than the first buffer the module offers
    assert simulator.last_command("4711") == ("freq " + "0" * 20000 + "1e9\n", 0)
    inst.close()
    simulator.detach("4711")
    assert "LBPMX::0x0004::4711::INSTR" not in visa_rm.list_resources()
    with open("/proc/self/maps") as maps:
        paths = {line.split()[-1] for line in maps if "libPmxControl2_64" in line}
    assert len(paths) == 1, paths


def test_a_malformed_scenario_leaves_no_sensor(visa_rm, simulator, tmp_path):
    path = tmp_path / "bad.yaml"
    path.write_text("sensors:\n  - {type: PMX-M01}\n")
    simulator.load_scenario(path)
    assert visa_rm.list_resources() == ()
    simulator.load_scenario(os.path.join(HERE, "..", "..", "pmxsim", "scenarios", "example.yaml"))
    assert len(visa_rm.list_resources()) == 3


def test_without_a_visa_runtime_nothing_is_loaded():
    code = "import pmxsim\ntry:\n    pmxsim.Simulator()\nexcept pmxsim.PmxSimError as e:\n    print(e)"
    env = dict(os.environ, PYTHONPATH=os.path.join(HERE, "..", "..", "pmxsim", "python"))
    done = subprocess.run([sys.executable, "-c", code], env=env, capture_output=True, text=True,
                          timeout=60)
    assert "not loaded in this process" in done.stdout, done
