"""Builds and imports the test-only peer module, a second module of the same family as _Client3.

The peer compiles the runtime sources of this repository together with tests/peer/peer.cpp into
its own shared object, so it carries its own copy of every runtime static, as any other module of
the family would.
"""
import importlib
import importlib.machinery
import os
import subprocess
import sys
import sysconfig

HERE = os.path.dirname(os.path.abspath(__file__))
ROOT = os.path.dirname(os.path.dirname(HERE))
NAME = "_Client3Peer"
SOURCES = [
    "runtime/proxy.cpp",
    "runtime/registry.cpp",
    "runtime/errors.cpp",
    "runtime/types.cpp",
    "library/StringFactory.cpp",
]


def build(directory):
    """Compiles the peer into `directory`; returns the path of the shared object."""
    suffix = importlib.machinery.EXTENSION_SUFFIXES[0]
    target = os.path.join(str(directory), NAME + suffix)
    command = [
        os.environ.get("CXX", "g++"), "-std=c++20", "-O1", "-fPIC", "-shared",
        "-fvisibility=hidden", "-fvisibility-inlines-hidden", "-Wall", "-Wextra",
        "-I", sysconfig.get_paths()["include"], "-I", ROOT, "-I", os.path.join(ROOT, "include"),
        *[os.path.join(ROOT, source) for source in SOURCES], os.path.join(HERE, "peer.cpp"),
        "-o", target,
    ]
    done = subprocess.run(command, capture_output=True, text=True)
    if done.returncode != 0:
        raise RuntimeError("building the peer module failed:\n" + done.stderr)
    return target


def load(path):
    """Imports the peer module from `path` (its start-up joins the shared type ring)."""
    directory = os.path.dirname(path)
    if directory not in sys.path:
        sys.path.insert(0, directory)
    return importlib.import_module(NAME)


def import_lines(path):
    """Script lines that import the peer from `path` as `peer` in another interpreter."""
    return "import sys\nsys.path.insert(0, %r)\nimport %s as peer\n" % (os.path.dirname(path), NAME)


_peer = None


def peer(directory_factory):
    """The peer module, built and imported once per process; `directory_factory()` gives the
    directory to build in."""
    global _peer
    if _peer is None:
        _peer = load(build(directory_factory()))
    return _peer
