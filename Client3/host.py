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
STOP_SECONDS = 10


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


def listening_port(first_line: str) -> int:
    """The port in the application's first line of output, "listening on HOST:PORT"."""
    prefix = "listening on "
    if not first_line.startswith(prefix):
        raise RuntimeError(f"the application did not start: {first_line!r}")
    return int(first_line.rsplit(":", 1)[1])


def stop(process: "subprocess.Popen[str]") -> None:
    """Stops an application as SIGTERM does (killed if it has not ended within STOP_SECONDS)."""
    process.terminate()
    try:
        process.wait(STOP_SECONDS)
    except subprocess.TimeoutExpired:
        process.kill()
        process.wait()
    if process.stdout is not None:
        process.stdout.close()


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
