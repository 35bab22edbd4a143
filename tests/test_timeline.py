"""The timeline of real hosts: one current time seen in ticks, seconds and frames, the ranges and
their order, time-code standards, frame rates, playback and the selected ranges."""
import time

import _Client3 as m
import pytest

from hostproc import wait_until

TICKS_PER_SECOND = 705_600_000


@pytest.fixture
def frames():
    return 600


@pytest.mark.parametrize("rate", [1, 24, 2000])
def test_ticks_seconds_and_frames_are_one_time(app, rate):
    app.TimelineSetFrameRate(float(rate))
    per_frame = TICKS_PER_SECOND // rate
    for frame in (1, 2, 299, 600):
        app.TimelineSetFrames(frame)
        assert app.TimelineGetTicks() == (frame - 1) * per_frame
        seconds = app.TimelineGetSecs()
        app.TimelineSetFrames(1)
        app.TimelineSetSecs(seconds)
        assert app.TimelineGetFrames() == frame
        app.TimelineSetTicks((frame - 1) * per_frame)
        assert app.TimelineGetFrames() == frame


def test_a_frame_rate_change_keeps_the_time(app):
    app.TimelineSetFrames(201)  # 2 s at 100 frames a second
    app.TimelineSetFrameRate(25.0)
    assert app.TimelineGetFrameRate() == 25.0
    assert app.TimelineGetTicks() == 2 * TICKS_PER_SECOND and app.TimelineGetFrames() == 51


@pytest.mark.parametrize("rate", [0.0, 23.976, 9999.0])
def test_unsupported_frame_rates_are_refused(app, rate):
    code, message = app.result("TimelineSetFrameRate", rate)
    assert code == m.ApplicationError and message.startswith("a frame rate must be a whole number")
    assert app.TimelineGetFrameRate() == 100.0


@pytest.mark.parametrize("operation, frame", [("TimelineSetPlayStart", 300), ("TimelineSetPlayEnd", 100),
                                              ("TimelineSetAnimStart", 300), ("TimelineSetAnimEnd", 100)])
def test_range_order_is_kept(app, operation, frame):
    app.TimelineSetPlayStart(150), app.TimelineSetPlayEnd(250)
    app.TimelineSetAnimStart(50), app.TimelineSetAnimEnd(550)
    code, message = app.result(operation, frame)
    assert code == m.ApplicationError and message.startswith("the ranges must keep animation start <= play start")
    ranges = [app.TimelineGetAnimStart(), app.TimelineGetPlayStart(), app.TimelineGetPlayEnd(), app.TimelineGetAnimEnd()]
    assert ranges == [50, 150, 250, 550]


@pytest.mark.parametrize("operation, args", [("TimelineSetFrames", (0,)), ("TimelineSetFrames", (601,)),
                                             ("TimelineSetPlayEnd", (601,)), ("TimelineSelectRange", (1, 601, 0)),
                                             ("TimelineSetSecs", (-0.001,)),
                                             ("TimelineSetSecs", (6.0,)), ("TimelineSetTicks", (6 * TICKS_PER_SECOND,))])
def test_times_outside_the_take_are_refused(app, operation, args):
    assert app.result(operation, *args)[0] == m.InvalidFrameNumber
    assert app.TimelineGetFrames() == 1 and app.TimelineGetPlayEnd() == 600 and app.TimelineGetSelectedRanges() == []


@pytest.mark.parametrize("seconds", [float("nan"), float("inf")])
def test_a_time_in_seconds_that_is_no_number_is_refused(app, seconds):
    app.TimelineSetFrames(10)
    code, message = app.result("TimelineSetSecs", seconds)
    assert code == m.ApplicationError and message.startswith("a time in seconds must be a finite number")
    assert app.TimelineGetFrames() == 10


def test_time_code_standards(app):
    assert app.TimelineGetTimeCodeStandard() == "PAL"
    for standard in ("Film", "PAL", "NTSC", "NTSCDrop", "HD50", "HD60"):
        app.TimelineSetTimeCodeStandard(standard)
        assert app.TimelineGetTimeCodeStandard() == standard
    assert app.result("TimelineSetTimeCodeStandard", "SECAM") == (
        m.ApplicationError, "'SECAM' is not a time-code standard (Film, PAL, NTSC, NTSCDrop, HD50, HD60)")


def test_play_advances_in_real_time_until_stop(app):
    app.TimelineSetPlayStart(10)
    started = time.monotonic()
    app.TimelinePlay()
    assert wait_until(lambda: app.TimelineGetFrames() >= 40)
    app.TimelineStop()
    elapsed = time.monotonic() - started
    stopped = app.TimelineGetFrames()
    # 100 frames a second: 30 frames take 0.3 s at the least.
    assert elapsed >= 0.3 and stopped <= 10 + elapsed * 100 + 2
    time.sleep(0.05)  # what could move the stopped time has a twentieth of a second to show
    assert app.TimelineGetFrames() == stopped


@pytest.mark.parametrize("steps, ranges", [
    ([(10, 20, 0), (30, 40, 1)], [10, 20, 30, 40]),
    ([(10, 20, 0), (30, 40, 0)], [30, 40]),
    ([(10, 40, 0), (20, 30, 2)], [10, 19, 31, 40]),
    ([(10, 30, 0), (20, 40, 3)], [10, 19, 31, 40]),
])
def test_selected_ranges(app, steps, ranges):
    for step in steps:
        app.TimelineSelectRange(*step)
    assert app.TimelineGetSelectedRanges() == ranges
    app.TimelineInvertSelection()
    app.TimelineInvertSelection()
    assert app.TimelineGetSelectedRanges() == ranges


def test_select_all_and_invert(app):
    app.TimelineSelectAll(0)
    assert app.TimelineGetSelectedRanges() == [1, 600]
    app.TimelineSelectRange(2, 599, 2)
    app.TimelineInvertSelection()
    assert app.TimelineGetSelectedRanges() == [2, 599]
    assert app.result("TimelineSelectRange", 9, 3, 0) == (
        m.ApplicationError, "a range runs from its first frame to its last: 9 is after 3")
