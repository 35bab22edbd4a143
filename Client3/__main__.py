"""python -m Client3 --version: the version of the installed package."""
from __future__ import annotations

import argparse
import sys
from typing import List, Optional

import Client3


def main(argv: Optional[List[str]] = None) -> int:
    parser = argparse.ArgumentParser(
        prog="python -m Client3",
        description="Scripts for the Pellux Post application: help(Client3) in Python is the guide; "
                    "python -m Client3.host runs the application, python -m Client3.batch a job over many takes.",
    )
    parser.add_argument("--version", action="version", version=f"Client3 {Client3.__version__}")
    parser.parse_args(argv)
    parser.print_help()
    return 0


if __name__ == "__main__":
    sys.exit(main())
