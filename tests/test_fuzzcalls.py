"""A bounded batch of the random-argument fuzzer (fuzzcalls.py): every module function called with
random arguments, in child interpreters, crashes nothing and leaves no SystemError behind."""
import fuzzcalls

# Long runs: python fuzz/fuzzcalls.py --calls 1000000
CALLS, BATCH = 40000, 10000


def test_random_calls_crash_nothing():
    crashes, system_errors = fuzzcalls.fuzz(seed=1, calls=CALLS, batch=BATCH, jobs=2, timeout=300)
    assert crashes == []
    assert system_errors == []

