"""The waits that a daemon was built with, from the header that orders them."""

import re

from shared.waits import is_prompt
from world import CHECKOUT

_HEADER = (CHECKOUT / "src/util/waits.h").read_text()


class Waits:
    """One table, in seconds: `work_due`, and the pauses before each look after a mount."""

    def __init__(self, program):
        self.name = "prompt" if is_prompt(program) else "steady"
        looks = re.search(rf"{self.name.upper()}_MOUNT\[\] = {{([^}}]*)}}", _HEADER).group(1)
        self.mount = [int(look) / 1000 for look in looks.split(",")]
        table = re.search(rf"wait_table {self.name} = {{([^}}]*)}}", _HEADER).group(1)
        self.work_due = int(table.split(",")[2]) / 1000

    def of_mounts(self, log):
        """The pauses behind the mount commands of a log, by the looks that followed each."""
        behind = re.split(r"exec cmd = mount(?: -|\.)", log)[1:]
        looks = [piece.split("mount OK")[0].count("exec cmd = mount > ") for piece in behind]
        return sum(sum(self.mount[:count]) for count in looks)
