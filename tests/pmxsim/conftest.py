"""Runs the Python tests here from the source tree (see examples/python/conftest.py)."""
import os
import sys

sys.path.insert(0, os.path.join(os.path.dirname(os.path.abspath(__file__)), "..", "..", "pmxsim", "python"))
from pmxsim.pytest_plugin import simulator, visa_rm  # noqa: E402,F401
