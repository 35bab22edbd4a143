"""The application, started from Python: `python -m Client3.host` takes the same options as
`client3-host` and behaves exactly as it does (it becomes that program where the system allows)."""
from __future__ import annotations

import os
import shutil
import subprocess
import sys
import sysconfig
from typing import List, Optional

PROGRAM = "client3-host"


def executable() -> str:
    """The path of the application installed beside this package, or the one on PATH."""
    for directory in (sysconfig.get_path("scripts"), os.path.dirname(sys.executable)):
        found = shutil.which(PROGRAM, path=directory)
        if found:
            return found
    found = shutil.which(PROGRAM)
    if found is None:
        raise FileNotFoundError(f"{PROGRAM} is not installed; install this package with pip")
    return found


def main(argv: Optional[List[str]] = None) -> int:
    arguments = sys.argv[1:] if argv is None else argv
    program = executable()
    if os.name == "posix":
        sys.stdout.flush()
        os.execv(program, [program, *arguments])  # does not return
    try:
        return subprocess.call([program, *arguments])
    except KeyboardInterrupt:
        return 0


if __name__ == "__main__":
    sys.exit(main())
