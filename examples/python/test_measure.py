"""The measurement script against the simulated sensors: its readings follow the settings it
sends (frequency, offset, averaging, unit), repeat with the scenario's seed, and a fault the
simulator injects shows as a failed reading."""
import math
import os
import subprocess
import sys

import pytest

import measure

HERE = os.path.dirname(os.path.abspath(__file__))
SCRIPT = os.path.join(HERE, "measure.py")
NOISY = "sensors:\n  - {type: PMX-M01, serial: '100000', power: {level: -10, noise: 0.5, seed: 3}}\n"
RESOURCE = "LBPMX::0x0003::100000::INSTR"


@pytest.fixture
def noisy(simulator, tmp_path):
    path = tmp_path / "noisy.yaml"
    path.write_text(NOISY)
    simulator.load_scenario(path)
    return simulator


def readings(rm, **settings):
    identity, values = measure.measure(rm, RESOURCE, count=4, **settings)
    assert identity == "Marlowe&Tenby,PMX-M01,100000,1.20"
    assert all(isinstance(v, float) for v in values), values
    return values


def run_script(config=None):
    env = {k: v for k, v in os.environ.items() if k not in ("PMXSIM_CONFIG", "PMXSIM_DEVICES")}
    if config:
        env["PMXSIM_CONFIG"] = config
    done = subprocess.run([sys.executable, SCRIPT, "--count", "4"], env=env, capture_output=True,
                          text=True, timeout=120)
    return done.returncode, done.stdout.splitlines()


def test_script_moves_to_noise_and_a_fault_by_pmxsim_config_alone(visa_rm):
    code, lines = run_script()
    assert code == 0, lines
    assert lines[0] == "Sensor: Marlowe&Tenby,PMX-M01,100000,1.20 (%s)" % RESOURCE
    assert all(abs(float(line.split()[2]) + 20) < 0.06 for line in lines[1:]), lines

    code, lines = run_script(os.path.join(HERE, "noisy.yaml"))
    assert code == 1, lines
    assert lines[3] == "Reading 3: failed: VI_ERROR_SYSTEM_ERROR (-1073807360): " \
        "Unknown system error (miscellaneous error).", lines
    values = [float(lines[n].split()[2]) for n in (1, 2, 4)]
    assert all(abs(v + 12) < 2 for v in values) and len(set(values)) == 3, lines
    assert run_script(os.path.join(HERE, "noisy.yaml"))[1] == lines, "runs repeat"


def test_settings_shape_readings_that_repeat_with_the_seed(visa_rm, noisy):
    plain = readings(visa_rm)
    assert len(set(plain)) == 4, "Gaussian noise"
    noisy.reset()
    assert readings(visa_rm) == plain, "the same seed gives the same readings"
    noisy.reset()
    shifted = readings(visa_rm, offset=5, frequency=11e9)  # +5 dB, -0.2 dB per GHz above 1 GHz
    assert shifted == pytest.approx([p + 5 - 2 for p in plain], abs=1e-4)
    noisy.reset()
    averaged = readings(visa_rm, averages=100)  # noise / 10
    assert averaged == pytest.approx([-10 + (p + 10) / 10 for p in plain], abs=1e-4)
    noisy.reset()
    watts = readings(visa_rm, unit="W")
    assert watts == pytest.approx([math.pow(10, (p - 30) / 10) for p in plain], rel=1e-4)


def test_injected_fault_fails_one_reading(visa_rm, simulator):
    simulator.fail_next("PmxGetFloatResult", 0xD0000010)
    identity, values = measure.measure(visa_rm, RESOURCE, count=2)
    assert "VI_ERROR" in str(values[0])
    assert abs(values[1] + 20) < 0.06
