"""Scene files against real hosts: a new scene, saving and loading (everything comes back in a fresh
application), atomic writes, and damaged or hostile files refused with the scene left as it was."""
import _Client3 as m
import pytest


@pytest.fixture
def frames():
    return 50


def at(app, path):
    return app.SceneGetObject(path)[0]


def snapshot(app):
    """Every query of the scene, with the paths of objects in place of their ids (ids are new after a load)."""
    path = app.ObjectGetPath
    state = {"name": app.GetSceneName()[0], "frames": app.GetFrameCount(), "clip": app.SceneGetActiveClip(),
             "selected": [path(i) for i in app.SceneGetSelectedObjects()[0]],
             "timeline": [app.TimelineGetTicks(), app.TimelineGetFrameRate(), app.TimelineGetPlayStart(), app.TimelineGetPlayEnd(),
                          app.TimelineGetAnimStart(), app.TimelineGetAnimEnd(), app.TimelineGetTimeCodeStandard(),
                          app.TimelineGetSelectedRanges()]}
    ids, types = app.ObjectGetDescendants(at(app, "/"))
    for obj, kind in zip(ids, types):
        state[path(obj)] = (
            kind,
            [(app.AttributeGetName(obj, a), app.AttributeGetValue(obj, a)) for a in app.ObjectGetAttributes(obj)],
            [tuple(app.ParameterGet(obj, p, 0, f) for f in ("Name", "Kind", "Value", "Default", "Unit", "Required"))
             for p in app.ObjectGetParameters(obj, 0)],
        )
        for name in filter(None, app.ObjectGetChannels(obj).split(",")):
            c = int(app.ObjectGetChannel(obj, name)[2])
            state[path(obj) + ":" + name] = (app.ChannelGetDefaultValue(obj, c), app.ChannelGetGaps(obj, c, 0),
                                             [app.ChannelGetValue(obj, c, f, 0, 0, "")[2] for f in (1, 17, 50)])
    for subject in app.GetSubjectNames()[0]:
        state[subject] = [app.GetTrajectory(subject, marker) for marker in app.GetMarkerNames(subject)]
    return state


def edit(app):
    """Changes of every kind that a scene file must keep."""
    assert app.SetSceneName("Edited scene") is True
    rig = app.SceneCreateObject("Null", "Rig 1/2".replace("/", "%"), at(app, "/"), "")[0]
    app.ObjectSetAttributeValue(rig, "Translation", "0.1,-2.5,1e-300")
    app.SceneCreateObject("Clip", "Run", at(app, "/"), "")
    app.SceneSetActiveClip("Run")
    alice = at(app, "/Alice")
    app.ObjectSetAttributeValue(alice, "Model", "Walker, v2 = \"new\"")
    note = app.ParameterCreate(alice, "Note", 2)
    app.ParameterSet(alice, note, 2, "Value", "line one\nline two; 100%")
    marker = at(app, "/Alice/LANK")
    x = int(app.ObjectGetChannel(marker, "X")[2])
    app.ChannelDeleteKey(marker, x, 17)
    app.ChannelSetDefaultValue(marker, x, "0.30000000000000004")
    app.ChannelSelectAllKeys(marker, x, 0)
    app.SceneSelectObject(marker, "", 0)
    app.SceneSelectObject(rig, "", 1)
    app.TimelineSetFrameRate(120.0)
    app.TimelineSetFrames(33)
    app.TimelineSetPlayEnd(40)
    app.TimelineSetTimeCodeStandard("Film")
    app.TimelineSelectRange(5, 9, 0)


def test_saved_scene_loads_the_same_in_a_fresh_application(app, start_host, clients, tmp_path):
    edit(app)
    path = str(tmp_path / "walk é.c3scene")
    app.SaveFile(path, "")
    assert app.GetSceneName() == ("Edited scene", path)
    before = snapshot(app)
    other = clients(start_host("--frames", "5"))
    other.LoadFile(path)
    assert other.GetSceneName() == ("Edited scene", path)
    assert snapshot(other) == before
    assert snapshot(clients(start_host("--scene", path))) == before


def test_new_scene_is_empty_and_keeps_the_take_length(app):
    app.NewScene()
    assert app.GetSceneName() == ("Untitled", "")
    assert app.GetSubjectNames() == ([], [], [])
    assert app.GetFrameCount() == 50 and app.SceneGetActiveClip() == "Take"


def test_saving_replaces_the_file_and_leaves_nothing_else(app, tmp_path):
    (tmp_path / "files").mkdir()
    path = tmp_path / "files" / "scene.c3scene"
    path.write_text("old")
    app.SaveFile(str(path), "")
    assert path.read_text().startswith("client3-scene 1\n")
    assert [p.name for p in path.parent.iterdir()] == ["scene.c3scene"]


def test_refused_saves_name_their_reason_and_keep_the_scene(app, tmp_path):
    missing = tmp_path / "no such directory" / "scene.c3scene"
    assert app.result("SaveFile", str(missing), "") == (m.ApplicationError, f"cannot write the file '{missing}'")
    assert app.result("SaveFile", str(tmp_path / "s"), "Compress=yes") == (
        m.ApplicationError, "'SaveFile' takes no options: 'Compress=yes'")
    assert app.GetSceneName() == ("Demo", "")


def damaged_files(text):
    """Ways a scene file can be wrong: cut short at many places, and lines changed to hostile values."""
    lines = text.split("\n")
    yield from (text[:cut] for cut in (0, 10, len(text) // 3, len(text) // 2, len(text) - 5, len(text) - 1))
    swaps = {"frames 50": "frames 999999999", "timeline 100 ": "timeline 0 ", "ranges -": "ranges 40-3",
             "active ": "active 1", "selection": "selection 99999", "end": "end\nmore"}
    for old, new in swaps.items():
        index = next(i for i, line in enumerate(lines) if line.startswith(old))
        yield "\n".join(lines[:index] + [lines[index].replace(old, new, 1)] + lines[index + 1:])
    yield text.replace("object 1 0 Subject Alice", "object 1 0 Marker Alice")
    yield text.replace("object 2 1 Marker", "object 2 2 Marker")
    yield text.replace("attribute ConstraintType Point", "attribute ConstraintType Glue", 1)
    yield text.replace("attribute Active true", "attribute Active maybe", 1)
    yield text.replace(",", ",,", 1)
    yield text.replace("%", "%G", 1) if "%" in text else text + "\x00"
    yield "\x89PNG\r\n\x1a\n" + text


def test_damaged_files_are_refused_and_the_scene_is_kept(app, tmp_path):
    good = tmp_path / "good.c3scene"
    app.SaveFile(str(good), "")
    assert app.SetSceneName("Current") is True
    before = snapshot(app)
    text = good.read_text(encoding="utf-8")
    bad = tmp_path / "bad.c3scene"
    for damaged in damaged_files(text):
        bad.write_bytes(damaged.encode("utf-8", "surrogateescape"))
        code, message = app.result("LoadFile", str(bad))
        assert code == m.ApplicationError and message.startswith("the scene file is damaged at line "), damaged[:80]
    assert app.result("LoadFile", str(tmp_path / "none")) == (m.ApplicationError, f"cannot read the file '{tmp_path / 'none'}'")
    assert app.result("LoadFile", str(tmp_path)) == (m.ApplicationError, f"cannot read the file '{tmp_path}'")
    assert snapshot(app) == before
