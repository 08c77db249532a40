"""Runs the tests here from the source tree: the pmxsim module of pmxsim/python and its fixtures
(the VISA library: PYVISA_LIBRARY, else the tree's build)."""
import os
import sys

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "..", "pmxsim", "python"))
from pmxsim.pytest_plugin import simulator, visa_rm  # noqa: E402,F401
