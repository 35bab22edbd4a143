"""The settings of the processing stages against real hosts: every field's default and range, records
applied whole or not at all, getters that hand out copies, and the settings kept in scene files."""
import _Client3 as m
import pytest

# Every field of every record in declared order: (name, default) for a flag, (name, default, least,
# most) for a number, (name, default, [allowed words]) for a text.
FIELDS = {
    "CircleFit": [("Enabled", True), ("NumThreads", 0, 0, 64), ("EnableVideoCentroids", False)],
    "Reconstruct": [
        ("EnvironmentalDriftTolerance", 1.5, 0, 10), ("MinCamsToStartTrajectory", 3, 2, 16),
        ("MinCamsToContinueTrajectory", 2, 2, 16), ("ReconMinSeparation", 14, 0, 1000),
        ("MinCentroidRadius", 0, 0, 50), ("MaxCentroidRadius", 50, 0, 1000),
        ("MinReconstructionRadius", 0, 0, 100), ("MaxReconstructionRadius", 1000, 0, 10000),
        ("FitMethod", "Fast", ["Fast", "Accurate"]), ("PredicationMatchFactor", 1, 0, 10),
        ("MinTrajectoryLength", 2, 1, 1000), ("StartupError", 150, 0, 1000), ("PredicationError", 150, 0, 1000),
        ("ComputeRadius", True),
        ("MinVolumeX", -10000, -100000, 100000), ("MinVolumeY", -10000, -100000, 100000), ("MinVolumeZ", -1000, -100000, 100000),
        ("MaxVolumeX", 10000, -100000, 100000), ("MaxVolumeY", 10000, -100000, 100000), ("MaxVolumeZ", 5000, -100000, 100000),
        ("NumThreads", 0, 0, 64),
    ],
    "LabelROM": [("StandardDeviation", 2, 0.1, 10), ("SeparationDistance", 30, 0, 500)],
    "Labeling": [
        ("UseLabelingClusters", True), ("LabelCompletenessEntranceThreshold", 0.75, 0, 1), ("UseRobustBooting", True),
        ("BootingQuality", 0.5, 0, 1), ("BootingVersusTracking", 1, 0, 10), ("TrackingQuality", 0.5, 0, 1),
        ("SmoothingFactor", 0.5, 0, 1), ("SinglePassLabel", False), ("NumThreads", 0, 0, 64),
    ],
    "LabelingSubjectCalibration": [
        ("RestImportance", 1, 0, 100), ("MarkerImportance", 1, 0, 100), ("SegmentImportance", 1, 0, 100),
        ("Quality", "Medium", ["Low", "Medium", "High"]), ("StatsMode", "Full", ["Full", "Basic"]),
        ("CalibrationMode", "Static", ["Static", "Dynamic"]), ("ActiveFrames", 200, 1, 100000),
        ("AutoSaveZSK", False), ("AutoSavePreCalHDF", False), ("OverwriteRangeTemplates", False), ("ShowCovariance", False),
    ],
    "OcclusionFixing": [
        ("Enabled", True), ("ApplyFixedMarkers", True), ("MarkerSmoothing", 0, 0, 1), ("DataFidelity", 1, 0, 1),
        ("TransitionTime", 0.5, 0, 10),
    ],
    "Solving": [
        ("PriorImportance", 1, 0, 100), ("MeanPoseRatio", 1, 0, 10), ("NumThreads", 0, 0, 64),
        ("ExtrapolateFingers", False), ("FingerMultiplier", 1, 0, 10),
    ],
}
NUMBERS = [(record, f[0], f[2], f[3]) for record, fields in FIELDS.items() for f in fields if len(f) == 4]
WORDS = [(record, f[0], f[2]) for record, fields in FIELDS.items() for f in fields if len(f) == 3]


@pytest.fixture
def frames():
    return 50


def get(app, record):
    return app.record(f"OfflineGet{record}Settings")


def put(settings, record, field, value):
    if isinstance(value, str):
        value = m.new_SafeString(value)
    getattr(m, f"Output_{record}Settings_{field}_set")(settings, value)


def set_setting(app, record, field, value):
    """Sets one field of a stage's settings, the others kept (a refusal fails the test)."""
    settings = get(app, record)
    put(settings, record, field, value)
    getattr(app, f"OfflineSet{record}Settings")(settings)


def values(app, record):
    return getattr(app, f"OfflineGet{record}Settings")()


def ranged(least, most):
    plain = [str(int(v)) if v == int(v) else str(v) for v in (least, most)]
    return f"from {plain[0]} to {plain[1]}"


@pytest.mark.parametrize("record, field, least, most", NUMBERS)
def test_a_number_is_taken_at_both_ends_of_its_range_and_refused_beyond_them(app, record, field, least, most):
    index = [f[0] for f in FIELDS[record]].index(field)
    for value in (least, most):
        if field.startswith("Min") and value == most or field.startswith("Max") and value == least:
            continue  # the pair's order rule, tested on its own
        settings = get(app, record)
        put(settings, record, field, value)
        app.record(f"OfflineSet{record}Settings", settings)
        assert values(app, record)[index] == pytest.approx(value)
    before = values(app, record)
    for beyond in (least - 1, most + 1):
        settings = get(app, record)
        put(settings, record, field, beyond)
        code, text = app.result(f"OfflineSet{record}Settings", settings)
        assert code != m.Success
        assert f"'{field}' must be {ranged(least, most)}" in text, beyond
        assert values(app, record) == before


@pytest.mark.parametrize("record, field, words", WORDS)
def test_a_text_field_takes_only_its_words(app, record, field, words):
    index = [f[0] for f in FIELDS[record]].index(field)
    for word in words:
        settings = get(app, record)
        put(settings, record, field, word)
        assert getattr(app, f"OfflineSet{record}Settings")(settings) is None
        assert values(app, record)[index] == word
    settings = get(app, record)
    put(settings, record, field, words[0].lower() + "!")
    code, text = app.result(f"OfflineSet{record}Settings", settings)
    assert f"'{field}' must be one of {','.join(words)}" in text
    assert values(app, record)[index] == words[-1]


@pytest.mark.parametrize("low, high", [("MinCamsToContinueTrajectory", "MinCamsToStartTrajectory"),
                                       ("MinCentroidRadius", "MaxCentroidRadius"),
                                       ("MinReconstructionRadius", "MaxReconstructionRadius"),
                                       ("MinVolumeX", "MaxVolumeX"), ("MinVolumeY", "MaxVolumeY"), ("MinVolumeZ", "MaxVolumeZ")])
def test_a_lower_bound_may_not_exceed_its_upper_bound(app, low, high):
    before = values(app, "Reconstruct")
    settings = get(app, "Reconstruct")
    put(settings, "Reconstruct", low, 12)
    put(settings, "Reconstruct", high, 11)
    code, text = app.result("OfflineSetReconstructSettings", settings)
    assert f"'{low}' (12) cannot exceed '{high}' (11)" in text
    assert values(app, "Reconstruct") == before


def test_the_settings_are_kept_in_the_scene_file_and_reset_by_a_new_scene(app, tmp_path):
    changed = {"LabelROM": ("SeparationDistance", 12.5), "LabelingSubjectCalibration": ("Quality", "High"),
               "OcclusionFixing": ("ApplyFixedMarkers", False), "CircleFit": ("NumThreads", 8)}
    for record, (field, value) in changed.items():
        settings = get(app, record)
        put(settings, record, field, value)
        app.record(f"OfflineSet{record}Settings", settings)
    saved = {record: values(app, record) for record in FIELDS}
    path = str(tmp_path / "settings.scene")
    app.SaveFile(path, "")
    app.NewScene()
    assert all(values(app, record) == tuple(f[1] for f in FIELDS[record]) for record in FIELDS)
    app.LoadFile(path)
    assert {record: values(app, record) for record in FIELDS} == saved


def scene_with_line(app, path, record, line):
    """Saves the scene to `path` with the settings line of `record` replaced by `line`; returns its number."""
    app.SaveFile(str(path), "")
    lines = path.read_text().split("\n")
    at = next(i for i, text in enumerate(lines) if text.startswith(f"settings {record} "))
    lines[at] = line
    path.write_text("\n".join(lines))
    return at + 1


@pytest.mark.parametrize("line, expected", [
    # A field the line leaves out (a file saved before the field was added) keeps its default.
    ("settings Solving PriorImportance=50 MeanPoseRatio=3 ExtrapolateFingers=true FingerMultiplier=2", (50, 3, 0, True, 2)),
    ("settings Solving FingerMultiplier=2 NumThreads=4 PriorImportance=50", (50, 1, 4, False, 2)),
    ("settings Solving", (1, 1, 0, False, 1)),
    # A file written before the fields were named: every value, in the fields' order.
    ("settings Solving 50 3 4 true 2", (50, 3, 4, True, 2)),
])
def test_a_scene_file_gives_the_settings_it_names(app, tmp_path, line, expected):
    scene_with_line(app, tmp_path / "settings.scene", "Solving", line)
    app.LoadFile(str(tmp_path / "settings.scene"))
    assert values(app, "Solving") == expected


@pytest.mark.parametrize("line, message", [
    ("settings Solving PriorImportance=1 FingerMultiplier=11", "Solving setting 'FingerMultiplier' must be from 0 to 10, not '11'"),
    ("settings Solving 1 1 0 false 11", "Solving setting 'FingerMultiplier' must be from 0 to 10, not '11'"),
    ("settings Solving Speed=3", "the Solving settings have no field 'Speed'"),
    ("settings Solving NumThreads=2 NumThreads=3", "the Solving setting 'NumThreads' is given twice"),
    ("settings Solving NumThreads=2 3", "a value of the Solving settings without its field's name"),
    ("settings Solving NumThreads=two", "a bad value of Solving setting 'NumThreads'"),
    ("settings Solving 1 1 0 false", "the Solving settings need 5 values"),
])
def test_a_scene_file_with_a_bad_setting_is_refused(app, tmp_path, line, message):
    number = scene_with_line(app, tmp_path / "bad.scene", "Solving", line)
    settings = get(app, "Solving")
    put(settings, "Solving", "MeanPoseRatio", 3)
    app.OfflineSetSolvingSettings(settings)
    code, text = app.result("LoadFile", str(tmp_path / "bad.scene"))
    assert text == f"the scene file is damaged at line {number}: {message}"
    assert values(app, "Solving")[1] == 3
