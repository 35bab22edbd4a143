from typing import Tuple

_Parameters = Tuple[Tuple[str, str], ...]

COMMANDS: Tuple[Tuple[str, str, _Parameters, _Parameters], ...]
