"""Per-call cost of representative module functions, next to a call of a built-in for scale.

Run: python benchmarks/bench_calls.py
"""
import timeit

import _Client3 as m


def measure(label, statement, setup_globals, number=200_000):
    best = min(timeit.repeat(statement, globals=setup_globals, number=number, repeat=5))
    print(f"{label:<45} {best / number * 1e9:8.1f} ns")


def main():
    text = m.new_SafeString("motion capture")
    cases = [
        ("len(t) (built-in, for scale)", "len(t)"),
        ("ToString(1003)", "m.ToString(1003)"),
        ("SafeString_IsEmpty(s)", "m.SafeString_IsEmpty(s)"),
        ("SafeString_Value(s)", "m.SafeString_Value(s)"),
        ("new_SafeString() + delete_SafeString", "m.delete_SafeString(m.new_SafeString())"),
    ]
    if hasattr(m, "new_Output_CircleFitSettings"):
        cases += [
            ("Output_CircleFitSettings_NumThreads_set", "m.Output_CircleFitSettings_NumThreads_set(r, 4)"),
            ("Output_CircleFitSettings_NumThreads_get", "m.Output_CircleFitSettings_NumThreads_get(r)"),
            ("Output_Result_Error (through the cast list)", "m.Output_Result_Error(r)"),
        ]
    scope = {
        "m": m,
        "t": (1, 2, 3),
        "s": text,
        "r": m.new_Output_CircleFitSettings() if hasattr(m, "new_Output_CircleFitSettings") else None,
    }
    for label, statement in cases:
        measure(label, statement, scope)
    m.delete_SafeString(text)
    if scope["r"] is not None:
        m.delete_Output_CircleFitSettings(scope["r"])


if __name__ == "__main__":
    main()
