"""The reference page against the catalogue: its command table lists every command with the names and
types of its inputs and outputs and its description, as the catalogue declares them."""
import os

from Client3 import _catalogue

PAGE = os.path.join(os.path.dirname(__file__), os.pardir, "docs", "application.md")


def parameters(pairs):
    return ", ".join(f"`{name}` {kind}" for name, kind in pairs)


def table_rows():
    """The rows of the page's command table, one text a command."""
    with open(PAGE, encoding="utf-8") as page:
        section = page.read().split("\n## Command table\n", 1)[1].split("\n## ", 1)[0]
    return [line for line in section.splitlines() if line.startswith("| `")]


def test_the_command_table_is_the_catalogue():
    declared = [f"| `{name}` | {parameters(inputs)} | {parameters(outputs)} | {description} |"
                for name, description, inputs, outputs in _catalogue.COMMANDS]
    assert table_rows() == declared
