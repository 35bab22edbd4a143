"""Builds and imports the test-only peer module, a second module of the same family as _Client3: it compiles
the runtime sources with peer.cpp into its own shared object, so it has its own copy of every runtime static."""
import importlib
import importlib.machinery
import os
import subprocess
import sys
import sysconfig

import hostproc

HERE = os.path.dirname(os.path.abspath(__file__))
ROOT = os.path.dirname(os.path.dirname(HERE))
NAME = "_Client3Peer"
SOURCES = ["runtime/proxy.cpp", "runtime/registry.cpp", "runtime/errors.cpp", "types/types.cpp",
           "library/StringFactory.cpp"]


def import_lines(path):
    """Script lines that import the peer from `path` as `peer` in another interpreter."""
    return "import sys\nsys.path.insert(0, %r)\nimport %s as peer\n" % (os.path.dirname(path), NAME)


def peer(directory):
    """Builds the peer module into `directory` and imports it (it joins the shared type ring)."""
    target = os.path.join(str(directory), NAME + importlib.machinery.EXTENSION_SUFFIXES[0])
    command = [
        os.environ.get("CXX", "g++"), "-std=c++20", "-O1", "-fPIC", "-shared", "-fvisibility=hidden",
        "-fvisibility-inlines-hidden", "-Wall", "-Wextra", "-I", sysconfig.get_paths()["include"], "-I", ROOT,
        "-I", os.path.join(ROOT, "include"), *[os.path.join(ROOT, s) for s in SOURCES],
        os.path.join(HERE, "peer.cpp"), "-o", target,
    ]
    done = subprocess.run(command, capture_output=True, text=True, env=hostproc.tool_environment())
    if done.returncode != 0:
        raise RuntimeError("building the peer module failed:\n" + done.stderr)
    sys.path.insert(0, str(directory))
    return importlib.import_module(NAME)
