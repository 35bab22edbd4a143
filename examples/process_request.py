"""Runs commands by name: describes one, runs it with ProcessRequest, and runs another as a PSL line.

    python examples/process_request.py                   # starts its own application
    python examples/process_request.py HOST PORT         # uses a running one
"""
from __future__ import annotations

import sys

import Client3
from Client3.testing import connected


def by_name(client: Client3.ZarvoPelluxPostClient) -> None:
    print(f"{len(client.GetCommandList().check().Commands)} commands")

    # A command's description, its inputs with their defaults and its outputs.
    info = client.GetCommandInfo("GetServerInfo").check()
    print(info.DefaultOutputString())

    # Run it by name with the described inputs; the outputs come back as name and text pairs,
    # shown here through the description, whose outputs they replace.
    reply = client.ProcessRequest("GetServerInfo", info.InputParameters).check()
    info.OutputParameters = reply.OutputParameters
    print(info.DefaultOutputString())

    # A command with arguments, written as one line.
    line = client.PSL('GetSubjectParamDetails Subject=Alice Skeleton="" Parameter=Height').check()
    print(line.Str, end="")


def main(argv: list[str]) -> None:
    with connected(argv[1:]) as client:
        by_name(client)


if __name__ == "__main__":
    main(sys.argv)
