"""The object tree of the application: objects, selection, the active clip, attributes, channels
with their keys, and parameters, against real hosts. Each test changes a demo scene of its own."""
import _Client3 as m
import pytest

BAD = 999_999_999  # an id that names nothing


def at(app, path):
    return app.SceneGetObject(path)[0]


def tree(app):
    """Every object below the root as (path, type): the whole state of the tree."""
    ids, types = app.ObjectGetDescendants(at(app, "/"))
    return [(app.ObjectGetPath(i), t) for i, t in zip(ids, types)]


def attribute(app, obj, name):
    return app.ObjectGetAttributeValue(obj, name)


def channel(app, obj, name):
    return int(app.ObjectGetChannel(obj, name)[2])


def test_demo_scene_as_a_tree(app):
    root = at(app, "/")
    assert app.ObjectGetType(root) == "Scene" and app.ObjectGetPath(root) == "/"
    assert app.ObjectGetParent(root) == (0, "")
    ids, types = app.ObjectGetChildren(root)
    assert [app.ObjectGetPath(i) for i in ids] == ["/Alice", "/Bob", "/Camera1", "/Camera2", "/Camera3", "/Camera4", "/Walk"]
    assert types == ["Subject", "Subject", "Camera", "Camera", "Camera", "Camera", "Clip"]
    head = at(app, "/Alice/Pelvis/Thorax/Head")
    assert app.ObjectGetParent(head) == (at(app, "/Alice/Pelvis/Thorax"), "Bone")
    marker = at(app, "/Bob/LANK")
    assert app.SceneGetObject("/Bob/LANK") == (marker, "Marker")
    assert app.ObjectGetChannels(marker) == "X,Y,Z"
    subjects, kinds = app.SceneGetObjectList("Subject")
    assert [app.ObjectGetPath(i) for i in subjects] == ["/Alice", "/Bob"] and kinds == ["Subject"] * 2


def test_created_objects_get_ids_that_are_never_used_again(app):
    root = at(app, "/")
    first, kind = app.SceneCreateObject("Null", "Rig", root, "")
    assert kind == "Null" and app.ObjectGetPath(first) == "/Rig"
    child = app.SceneCreateObject("Null", "Part", first, "")[0]
    app.SceneRemoveObject(first, "")
    for gone in (first, child):
        assert app.result("ObjectGetPath", gone) == (m.ApplicationError, f"no object with id {gone}")
    again = app.SceneCreateObject("Null", "Rig", root, "")[0]
    assert again > child


CONSTRAINT_DEFAULTS = {"Active": "true", "Source": "", "Target": "", "Offset": "0,0,0", "ConstraintType": "Point"}


def test_a_created_constraint_starts_from_its_defaults(app):
    constraint = app.SceneCreateObject("Constraint", "Knee", at(app, "/Alice"), "")[0]
    assert {name: attribute(app, constraint, name)[2] for name in CONSTRAINT_DEFAULTS} == CONSTRAINT_DEFAULTS


@pytest.mark.parametrize("kind, name, parent, options, message", [
    ("Widget", "W", "/", "", "no object type named 'Widget' can be created"),
    ("Marker", "M", "/", "", "a Marker cannot be a child of a Scene ('/')"),
    ("Subject", "Alice", "/", "", "'/' already has a child named 'Alice'"),
    ("Null", "a/b", "/", "", "a name cannot hold '/' or control characters: 'a/b'"),
    ("Null", "", "/", "", "a name cannot be empty"),
    ("Null", "N", "/", "Hidden=true", "'SceneCreateObject' takes no options: 'Hidden=true'"),
])
def test_refused_creation_leaves_the_tree_as_it_was(app, kind, name, parent, options, message):
    before = tree(app)
    assert app.result("SceneCreateObject", kind, name, at(app, parent), options) == (m.ApplicationError, message)
    assert tree(app) == before


def test_a_created_subject_is_a_subject_of_the_scene(app):
    subject = app.SceneCreateObject("Subject", "Carol", at(app, "/"), "")[0]
    app.SceneCreateObject("Marker", "HEAD", subject, "")
    assert app.GetSubjectNames() == (["Alice", "Bob", "Carol"], ["Walker", "Walker", "Carol"], [True, True, True])
    assert app.GetMarkerNames("Carol") == ["HEAD"]
    assert app.GetTrajectoryAtFrame("Carol", "HEAD", 5) == (0.0, 0.0, 0.0, False)
    app.SceneRemoveObject(subject, "")
    assert app.GetSubjectNames()[0] == ["Alice", "Bob"]


@pytest.mark.parametrize("keep_world", [True, False])
def test_reparenting_keeps_or_resets_the_world_position(app, keep_world):
    shin = at(app, "/Alice/Pelvis/LeftThigh/LeftShin")
    local, world = attribute(app, shin, "Translation")[2], attribute(app, shin, "WorldTranslation")[2]
    assert local != world
    app.ObjectSetParent(shin, at(app, "/Alice"), keep_world)
    assert app.ObjectGetPath(shin) == "/Alice/LeftShin"
    assert app.GetBoneDetails("Alice", "", "LeftThigh") == ("Pelvis", [])
    # A subject has no translation of its own: under it, local and world positions are the same.
    expected = world if keep_world else local
    assert attribute(app, shin, "Translation") == (4, True, expected)
    assert attribute(app, shin, "WorldTranslation") == (4, False, expected)


def test_reparenting_under_a_descendant_is_refused(app):
    pelvis, head = at(app, "/Alice/Pelvis"), at(app, "/Alice/Pelvis/Thorax/Head")
    assert app.result("ObjectSetParent", pelvis, head, True) == (
        m.ApplicationError, f"object {pelvis} cannot be moved under itself or its descendants")
    assert app.ObjectGetPath(pelvis) == "/Alice/Pelvis"


@pytest.mark.parametrize("steps, selected", [
    ([("Alice", 0), ("Bob", 1)], ["Alice", "Bob"]),
    ([("Alice", 0), ("Bob", 0)], ["Bob"]),
    ([("Alice", 1), ("Bob", 1), ("Alice", 2)], ["Bob"]),
    ([("Alice", 3), ("Bob", 3), ("Alice", 3)], ["Bob"]),
])
def test_selection_modes(app, steps, selected):
    for name, mode in steps:
        app.SceneSelectObject(at(app, "/" + name), "", mode)
    ids, types = app.SceneGetSelectedObjects()
    assert [app.ObjectGetPath(i)[1:] for i in ids] == selected and types == ["Subject"] * len(selected)
    assert app.SceneGetPrimarySelectedObject() == (at(app, "/" + selected[0]), "Subject")


def test_select_by_type_all_and_invert(app):
    app.SceneSelectObjectsOfType("Camera", 0)
    assert app.SceneGetSelectedObjects()[1] == ["Camera"] * 4
    app.SceneInvertObjectSelection()
    selected = app.SceneGetSelectedObjects()[1]
    assert "Camera" not in selected and len(selected) == len(tree(app)) - 4
    app.SceneSelectAllObjects(2)
    assert app.SceneGetSelectedObjects() == ([], [])
    assert app.SceneGetPrimarySelectedObject() == (0, "")
    assert app.result("ObjectSelect", at(app, "/Alice"), 4) == (
        m.ApplicationError, "selection mode 4 is not one of 0 replace, 1 add, 2 remove, 3 toggle")


def test_active_clip(app):
    clip = app.SceneCreateObject("Clip", "Run", at(app, "/"), "")[0]
    app.SceneSetActiveClip("Run")
    assert app.SceneGetActiveClip() == "Run"
    assert app.result("SceneSetActiveClip", "Alice") == (m.ApplicationError, "no clip named 'Alice'")
    app.SceneRemoveObject(clip, "")
    assert app.SceneGetActiveClip() == ""


# (path, attribute, type, text given, text read back)
ATTRIBUTE_VALUES = [
    ("/Alice", "Active", 0, "0", "false"),
    ("/Camera1", "Enabled", 0, "true", "true"),
    ("/Alice/Pelvis", "Translation", 4, "1.5,-2,1e3", "1.5,-2,1000"),
    ("/Alice/Pelvis", "Translation", 4, "0.1,0.2,0.30000000000000004", "0.1,0.2,0.30000000000000004"),
    ("/Alice", "Model", 3, "Runner, v2", "Runner, v2"),
    ("/Alice/LFHD_Head", "ConstraintType", 3, "Aim", "Aim"),
]


@pytest.mark.parametrize("path, name, kind, given, expected", ATTRIBUTE_VALUES)
def test_attribute_text_reads_back_exactly(app, path, name, kind, given, expected):
    obj = at(app, path)
    app.ObjectSetAttributeValue(obj, name, given)
    assert attribute(app, obj, name) == (kind, True, expected)
    app.AttributeSetValue(obj, app.ObjectGetAttribute(obj, name), expected)
    assert app.AttributeGetValue(obj, app.ObjectGetAttribute(obj, name)) == (kind, True, expected)


@pytest.mark.parametrize("path, name, value, message", [
    ("/Alice", "Type", "Bone", "attribute 'Type' of object {} is read-only"),
    ("/Alice/Pelvis", "WorldTranslation", "0,0,0", "attribute 'WorldTranslation' of object {} is read-only"),
    ("/Alice", "Active", "yes", "'yes' is not a Bool value for attribute 'Active'"),
    ("/Alice/Pelvis", "Translation", "1,2", "'1,2' is not a Vector value for attribute 'Translation'"),
    ("/Alice/Pelvis", "Translation", "1,nan,3", "'1,nan,3' is not a Vector value for attribute 'Translation'"),
    ("/Alice/LFHD_Head", "ConstraintType", "Glue", "'Glue' is not a constraint type (Point, Aim, Orient)"),
    ("/Alice", "Name", "Bob", "'/' already has a child named 'Bob'"),
    ("/Alice", "Colour", "red", "object {} has no attribute named 'Colour'"),
])
def test_refused_attribute_values_change_nothing(app, path, name, value, message):
    obj = at(app, path)
    before = [app.AttributeGetValue(obj, a) for a in app.ObjectGetAttributes(obj)]
    assert app.result("ObjectSetAttributeValue", obj, name, value) == (m.ApplicationError, message.format(obj))
    assert [app.AttributeGetValue(obj, a) for a in app.ObjectGetAttributes(obj)] == before


def test_attributes_are_the_subject_data(app):
    alice = at(app, "/Alice")
    ids = app.ObjectGetAttributes(alice)
    assert [app.AttributeGetName(alice, a) for a in ids] == ["Name", "Type", "Model", "Active"]
    assert app.ObjectHasAttribute(alice, ids[2]) == 1 and app.ObjectHasAttribute(at(app, "/Bob"), ids[2]) == 0
    app.ObjectSetAttributeValue(alice, "Name", "Ann")
    assert app.GetSubjectNames()[0] == ["Ann", "Bob"] and app.ObjectGetPath(at(app, "/Ann/LFHD")) == "/Ann/LFHD"
    constraint = at(app, "/Ann/C7_Thorax")
    app.ObjectSetConstraint(constraint, 0)
    assert app.GetConstraintDetails("Ann", "", "C7_Thorax")[0] is False
    assert attribute(app, constraint, "Active") == (0, True, "false")


def test_trajectory_and_channels_are_the_same_data(app):
    marker = at(app, "/Alice/LANK")
    x, y, z = (channel(app, marker, axis) for axis in "XYZ")
    app.SetTrajectoryAtFrame("Alice", "LANK", 10, 1.25, 2.5, 3.75, True)
    assert [app.ChannelGetValue(marker, c, 10, 0, 0, "")[2] for c in (x, y, z)] == ["1.25", "2.5", "3.75"]
    app.ChannelSetValue(marker, y, 11, 0, 0, "-7.5", "")
    assert app.GetTrajectoryAtFrame("Alice", "LANK", 11)[1] == -7.5
    app.ChannelDeleteKey(marker, z, 12)
    assert app.ChannelHasKey(marker, z, 12) == "false" and app.ChannelHasKey(marker, x, 12) == "true"
    assert app.GetTrajectoryAtFrame("Alice", "LANK", 12)[3] is False
    assert app.ChannelGetGaps(marker, z, 0) == "12-12"


def test_gaps_of_the_demo_and_values_where_there_is_no_key(app):
    wrist = at(app, "/Alice/LWRA")
    x = channel(app, wrist, "X")
    assert app.ChannelGetGaps(wrist, x, 0) == "121-132"
    assert app.ChannelGetName(wrist, x) == "X" and app.ObjectHasChannel(wrist, x) == 1
    app.ChannelSetDefaultValue(wrist, x, "-1.5")
    assert app.ChannelGetDefaultValue(wrist, x) == (2, True, "-1.5")
    assert app.ChannelGetValue(wrist, x, 125, 0, 0, "")[2] == "-1.5"
    before, after = (float(app.ChannelGetValue(wrist, x, f, 0, 0, "")[2]) for f in (120, 133))
    linear = float(app.ChannelGetValue(wrist, x, 126, 0, 1, "")[2])
    assert linear == pytest.approx(before + (after - before) * 6 / 13)


@pytest.mark.parametrize("frames", [10])
def test_key_selection(app):
    marker = at(app, "/Bob/C7")
    x = channel(app, marker, "X")
    app.ChannelDeleteKey(marker, x, 2)
    app.TimelineSelectRange(1, 4, 0)
    app.ChannelSelectKeysFromRanges(marker, x, 0)  # keys 1, 3, 4
    app.ChannelInvertKeySelection(marker, x)       # keys 5 to 10
    app.ChannelDeleteSelectedKeys(marker, x)
    assert app.ChannelGetGaps(marker, x, 0) == "2-2,5-10"
    app.ChannelSelectAllKeys(marker, x, 0)
    app.TimelineSelectAll(2)
    app.TimelineSelectRangeFromKeys(0)
    assert app.TimelineGetSelectedRanges() == [1, 4]
    app.ChannelDeleteAllKeys(marker, x)
    assert app.ChannelGetGaps(marker, x, 0) == "1-10"
    assert app.result("ChannelDeleteKey", marker, x, 3) == (m.ApplicationError, "channel 'X' has no key at frame 3")


@pytest.mark.parametrize("operation, args, code, message", [
    ("ChannelGetValue", (1001, 0, 0, ""), m.InvalidFrameNumber, "frame 1001 is outside the take (1 to 1000)"),
    ("ChannelGetValue", (1, 1, 0, ""), m.ApplicationError, "channel 'X' has one component, 0; there is no component 1"),
    ("ChannelGetValue", (1, 0, 2, ""), m.ApplicationError, "interpolation 2 is not one of 0 keys only, 1 linear"),
    ("ChannelSetValue", (1, 0, 0, "high", ""), m.ApplicationError, "'high' is not a Float value for channel 'X'"),
    ("ChannelSetValue", (0, 0, 0, "1", ""), m.InvalidFrameNumber, "frame 0 is outside the take (1 to 1000)"),
    ("ChannelSetDefaultValue", ("inf",), m.ApplicationError, "'inf' is not a Float value for channel 'X'"),
])
def test_refused_channel_operations_change_nothing(app, operation, args, code, message):
    marker = at(app, "/Alice/RANK")
    x = channel(app, marker, "X")
    before = app.GetTrajectory("Alice", "RANK")
    assert app.result(operation, marker, x, *args) == (code, message)
    assert app.GetTrajectory("Alice", "RANK") == before and app.ChannelGetDefaultValue(marker, x)[2] == "0"


def test_subject_parameters_are_the_parameters_of_the_tree(app):
    alice = at(app, "/Alice")
    height = app.ObjectGetParameter(alice, 1, "Height")
    assert app.ObjectGetParameters(alice, 0) == app.ObjectGetParameters(alice, 1)
    assert [app.ParameterGet(alice, p, 0, "Name") for p in app.ObjectGetParameters(alice, 0)] == \
        ["Height", "Mass", "LeftLegLength", "RightLegLength"]
    app.ParameterSet(alice, height, 1, "Value", "1701.5")
    app.ParameterSet(alice, height, 0, "Unit", "cm")
    assert app.GetSubjectParamDetails("Alice", "", "Height") == (1701.5, 1750.0, "cm", True)
    note = app.ParameterCreate(alice, "Note", 2)
    app.ParameterSet(alice, note, 2, "Value", "left-handed, tall")
    assert app.ParameterGet(alice, note, 0, "Value") == "left-handed, tall"
    assert app.ObjectGetParameters(alice, 2) == [note] and app.ObjectHasParameter(alice, 1, note) == 0
    assert app.GetSubjectParamNames("Alice", "") == ["Height", "Mass", "LeftLegLength", "RightLegLength"]
    app.ParameterRemove(alice, height, "")
    assert app.result("GetSubjectParamDetails", "Alice", "", "Height") == (
        m.ApplicationError, "subject 'Alice' has no parameter named 'Height'")


@pytest.mark.parametrize("operation, args, message", [
    ("ParameterCreate", ("Mass", 1), "object {obj} already has a parameter named 'Mass'"),
    ("ParameterCreate", ("Spin", 0), "a parameter is created with kind 1 number or 2 text"),
    ("ParameterSet", ("{mass}", 1, "Value", "heavy"), "'heavy' is not a Float value for field 'Value'"),
    ("ParameterSet", ("{mass}", 1, "Name", "Weight"), "field 'Name' of a parameter is read-only"),
    ("ParameterSet", ("{mass}", 2, "Value", "1"), "object {obj} has no parameter with id {mass} of that kind"),
    ("ParameterGet", ("{mass}", 3, "Value"), "parameter kind 3 is not one of 0 any, 1 number, 2 text"),
    ("ParameterGet", ("{mass}", 0, "Colour"), "a parameter has no field named 'Colour' (Name, Kind, Value, Default, Unit, Required)"),
    ("ParameterRemove", (BAD, ""), "object {obj} has no parameter with id " + str(BAD)),
])
def test_refused_parameter_operations_change_nothing(app, operation, args, message):
    bob = at(app, "/Bob")
    mass = app.ObjectGetParameter(bob, 0, "Mass")
    args = [int(a.format(mass=mass)) if a == "{mass}" else a for a in args]
    before = app.GetSubjectParamDetails("Bob", "", "Mass"), app.ObjectGetParameters(bob, 0)
    assert app.result(operation, bob, *args) == (m.ApplicationError, message.format(obj=bob, mass=mass))
    assert (app.GetSubjectParamDetails("Bob", "", "Mass"), app.ObjectGetParameters(bob, 0)) == before
