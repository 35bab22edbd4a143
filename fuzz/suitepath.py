"""Puts the test suite's helpers (tests/hostproc.py, tests/companion.py) on the import path of the long
checks in this folder, once, when they run on their own; under the suite they are there already."""
import os
import sys

TESTS = os.path.join(os.path.dirname(os.path.dirname(os.path.abspath(__file__))), "tests")
if TESTS not in sys.path:
    sys.path.append(TESTS)
