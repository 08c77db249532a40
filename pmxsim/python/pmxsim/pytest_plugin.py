"""pytest fixtures for tests against the simulated sensors, through pyvisa.

Enable with `pytest -p pmxsim.pytest_plugin`, or import the two fixtures into a conftest.py.
The VISA library is the one PYVISA_LIBRARY names; unset, a module running from the source tree
takes the tree's build (build/dev, else build/release), as the project's checks do, and sets
PYVISA_LIBRARY to it for the scripts under test.

- `visa_rm`: one pyvisa ResourceManager for the whole test run.
- `simulator`: a fresh simulator for one test: reset before the test (sensors, delays and
  faults from PMXSIM_CONFIG or PMXSIM_DEVICES), and after it, once the sessions the test left
  open are closed; a scenario the test loaded is dropped again.
"""
import os

import pytest

import pmxsim


def _tree_library():
    if os.environ.get("PYVISA_LIBRARY"):
        return ""
    tree = os.path.abspath(os.path.join(os.path.dirname(__file__), "..", "..", ".."))
    name = "visa.dll" if os.name == "nt" else "libvisa.so"
    for build in ("dev", "release"):
        path = os.path.join(tree, "build", build, "bin", name)
        if os.path.isfile(path):
            return path
    return ""


@pytest.fixture(scope="session")
def visa_rm():
    import pyvisa

    library = _tree_library()
    if library:
        # Scripts under test that open their own ResourceManager find the same runtime.
        os.environ["PYVISA_LIBRARY"] = library
    rm = pyvisa.ResourceManager(library)
    yield rm
    rm.close()


@pytest.fixture
def simulator(visa_rm):
    config = os.environ.get("PMXSIM_CONFIG")
    sim = pmxsim.Simulator()
    sim.reset()
    yield sim
    for resource in list(visa_rm.list_opened_resources()):
        resource.close()
    if config is None:
        os.environ.pop("PMXSIM_CONFIG", None)
    else:
        os.environ["PMXSIM_CONFIG"] = config
    sim.reset()
