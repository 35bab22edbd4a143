"""The script search path and the capture database against real hosts, on real directories under
the test's tmp_path: what is made on disk, what is current, marked takes, and paths that would lead
outside a database refused."""
import os

import _Client3 as m
import pytest


@pytest.fixture
def host(start_host):
    return start_host("--frames", "20")


@pytest.fixture
def app(host, clients):
    return clients(host)


def script_lines(host):
    return [line.split(" info ", 1)[1] for line in host.log().splitlines() if " info script path: " in line]


def test_script_directories_are_read_when_added_and_reparsed(app, host, tmp_path):
    tools = tmp_path / "tools"
    tools.mkdir()
    (tools / "fill.py").write_text("")
    (tools / "notes.txt").write_text("")
    (tools / "sub.py").mkdir()
    app.AddScriptPath(str(tools))
    app.AddScriptPath(str(tools) + "/")  # the same directory: no second entry
    (tools / "clean.py").write_text("")
    app.ReparseScriptPaths()
    assert script_lines(host) == [f"script path: 1 scripts in '{tools}': fill.py",
                                  f"script path: 2 scripts in '{tools}': clean.py, fill.py"]
    app.RemoveScriptPath(str(tools))
    app.ReparseScriptPaths()
    assert len(script_lines(host)) == 2


def test_script_path_refusals(app, host, tmp_path):
    gone = tmp_path / "gone"
    gone.mkdir()
    app.AddScriptPath(str(gone))
    (tmp_path / "file.py").write_text("")
    cases = [
        ("AddScriptPath", str(tmp_path / "missing")), f"no directory at '{tmp_path / 'missing'}'",
        ("AddScriptPath", str(tmp_path / "file.py")), f"no directory at '{tmp_path / 'file.py'}'",
        ("AddScriptPath", ""), "a directory path cannot be empty",
        ("RemoveScriptPath", str(tmp_path)), f"'{tmp_path}' is not on the script path",
    ]
    for args, message in zip(cases[::2], cases[1::2]):
        assert app.result(*args) == (m.ApplicationError, message)
    gone.rmdir()
    assert app.result("ReparseScriptPaths") == (m.ApplicationError, f"the script directory '{gone}' cannot be read any more")
    app.RemoveScriptPath(str(gone))  # a directory that has gone can still be taken off the path
    app.ReparseScriptPaths()


def current(app):
    return tuple(app.DatabaseGetCurrent(item) for item in ("Database", "Session", "Take"))


def test_a_new_database_becomes_current_and_its_sessions_takes_and_marks_are_read_from_disk(app, tmp_path):
    assert current(app) == ("", "", "")
    app.DatabaseCreate(str(tmp_path), "Gait lab")
    database = tmp_path / "Gait lab"
    assert sorted(os.listdir(database)) == ["Session 1", "client3.database"]
    assert (database / "client3.database").read_text() == "client3-database 1\n"
    assert current(app) == (str(database), "Session 1", "")
    for take, marked in [("Session 1/Walk 1", True), ("Session 1/Walk 2", False), ("Day 2/Run", True), ("Day 2/Jump", True)]:
        (database / take).mkdir(parents=True)
        if marked:
            (database / take / "marked").write_text("")
    app.DatabaseSetCurrent("Take", "Walk 2")
    assert current(app) == (str(database), "Session 1", "Session 1/Walk 2")
    app.DatabaseSetCurrent("Take", "Day 2/Run")
    assert current(app) == (str(database), "Day 2", "Day 2/Run")
    app.DatabaseSetCurrent("Session", "Session 1")
    assert current(app) == (str(database), "Session 1", "")
    assert app.DatabaseGetMarkedTakes() == ["Day 2/Jump", "Day 2/Run", "Session 1/Walk 1"]
    (database / "Day 2" / "Jump" / "marked").unlink()
    assert app.DatabaseGetMarkedTakes() == ["Day 2/Run", "Session 1/Walk 1"]
    app.DatabaseSetCurrent("Database", "")
    assert current(app) == ("", "", "")
    app.DatabaseSetCurrent("Database", str(database) + "/Session 1/..")
    assert current(app) == (str(database), "", "")


@pytest.mark.skipif(not hasattr(os, "symlink"), reason="no symbolic links")
def test_links_inside_a_database_are_neither_followed_nor_listed(app, tmp_path):
    app.DatabaseCreate(str(tmp_path), "db")
    database = tmp_path / "db"
    outside = tmp_path / "outside"
    (outside / "Take").mkdir(parents=True)
    (outside / "Take" / "marked").write_text("")
    os.symlink(outside, database / "Linked session")
    os.symlink(outside / "Take", database / "Session 1" / "Linked take")
    (database / "Session 1" / "Real").mkdir()
    os.symlink(outside / "Take" / "marked", database / "Session 1" / "Real" / "marked")
    assert app.DatabaseGetMarkedTakes() == []
    for item, path, message in [
        ("Session", "Linked session", "the session 'Linked session' is a link: a database may not lead outside itself"),
        ("Take", "Session 1/Linked take", "the take 'Linked take' is a link: a database may not lead outside itself"),
        ("Take", "Linked session/Take", "the session 'Linked session' is a link: a database may not lead outside itself"),
    ]:
        assert app.result("DatabaseSetCurrent", item, path) == (m.ApplicationError, message)
    assert current(app) == (str(database), "Session 1", "")


def test_database_refusals_keep_what_is_current(app, tmp_path):
    work = tmp_path / "work"  # beside the application's log
    work.mkdir()
    (work / "plain").mkdir()
    (work / "file").write_text("")
    assert app.result("DatabaseGetMarkedTakes") == (m.ApplicationError, "there is no current database")
    assert app.result("DatabaseSetCurrent", "Session", "Session 1") == (m.ApplicationError, "there is no current database")
    app.DatabaseCreate(str(work), "db")
    (work / "db" / "Session 1" / "Take 1").mkdir()
    app.DatabaseSetCurrent("Take", "Take 1")
    before = current(app)
    cases = [
        ("DatabaseCreate", str(work), "db"), f"'{work / 'db'}' exists already",
        ("DatabaseCreate", str(work / "missing"), "x"), f"no directory at '{work / 'missing'}'",
        ("DatabaseCreate", str(work), ".."), "'..' cannot name a database: it climbs out of its directory",
        ("DatabaseCreate", str(work), ""), "'' cannot name a database: it is empty",
        ("DatabaseSetCurrent", "Database", str(work / "plain")), f"'{work / 'plain'}' is not a capture database",
        ("DatabaseSetCurrent", "Session", "Session 1/.."), "'Session 1/..' cannot name a session: it holds a '/', '\\' or ':'",
        ("DatabaseSetCurrent", "Session", "Day 9"), "there is no session 'Day 9'",
        ("DatabaseSetCurrent", "Session", "client3.database"), "the session 'client3.database' is not a directory",
        ("DatabaseSetCurrent", "Take", "Session 1/../.."), "'../..' cannot name a take: it holds a '/', '\\' or ':'",
        ("DatabaseSetCurrent", "Clip", "x"), "'Clip' is not one of Database, Session, Take",
        ("DatabaseGetCurrent", "Subject"), "'Subject' is not one of Database, Session, Take",
    ]
    for args, message in zip(cases[::2], cases[1::2]):
        assert app.result(*args) == (m.ApplicationError, message)
    assert current(app) == before
    assert sorted(os.listdir(work)) == ["db", "file", "plain"]
