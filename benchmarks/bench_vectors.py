"""Converting a list of one million floats into a vectord, against array('d', ...) on the same list.

Run with the built module on PYTHONPATH:  python3 benchmarks/bench_vectors.py
"""
import sys
import timeit
from array import array

import _Client3

SIZE = 1_000_000
REPEAT = 7


def best(statement, number=3):
    return min(timeit.repeat(statement, number=number, repeat=REPEAT)) / number


def main():
    floats = [float(i) * 0.5 for i in range(SIZE)]
    mixed = tuple(i if i % 2 else float(i) for i in range(SIZE))
    made = []

    def to_vector(source):
        vector = _Client3.new_vectord(source)
        made.append(vector)  # kept: the proxy class that frees vectors is not registered here
        return vector

    reference = best(lambda: array("d", floats))
    cases = {
        "new_vectord(list of floats)": lambda: to_vector(floats),
        "new_vectord(tuple of ints and floats)": lambda: to_vector(mixed),
        "vectord___setslice__(v, 0, n, list)": lambda: _Client3.vectord___setslice__(target, 0, SIZE, floats),
    }
    target = _Client3.new_vectord()
    print(f"array('d', list): {reference * 1e3:8.2f} ms")
    for name, call in cases.items():
        seconds = best(call)
        print(f"{name}: {seconds * 1e3:8.2f} ms  ratio {seconds / reference:5.2f}")
        made.clear()
    assert _Client3.vectord_size(to_vector(floats)) == SIZE
    return 0


if __name__ == "__main__":
    sys.exit(main())
