"""Measures the daemon against its floor: its ordered waits and the very commands that it runs.

Every ratio is of one run: a daemon's event, then its commands once more in a world of the same
shape. Times are in seconds and stand as minimum / median / maximum. No figure fails anything.
"""

import argparse
import contextlib
import os
import sys
from pathlib import Path

from bench import idle
from bench.pair import Pair
from bench.tables import plot, spread, table
from bench.udisks import mount_times
from bench.waits import Waits

from world import CHECKOUT

SHAPES = ((1, 1), (1, 4), (4, 2), (16, 1))
COUNTS = (0, 1, 4, 16)
EVENTS = ("plug", "start", "unplug")
SECTIONS = (*EVENTS, "idle", "burst", "memory")
BUILDS = [CHECKOUT / f"build/{name}/tarn_nas_diskmanager" for name in ("release", "prompt")]
NOTE, PLOT = CHECKOUT / "docs/performance.md", CHECKOUT / "docs/performance.svg"
BEGIN, END = "<!-- bench: begin -->\n", "<!-- bench: end -->\n"


def say(text):
    print(f"bench: {text}", file=sys.stderr, flush=True)


class Bench:
    def __init__(self, options):
        self.options = options
        self.programs = [path.resolve() for path in (options.binary, options.against) if path]
        self.shapes = SHAPES[:1] if options.smoke else SHAPES
        self.counts = COUNTS[:2] if options.smoke else COUNTS
        self.plugs, self.idles = {}, {}

    def name(self, program):
        """What the tables call a program."""
        name = Waits(program).name
        alike = [other for other in self.programs if Waits(other).name == name]
        return name if len(alike) == 1 else f"{name} ({self.programs.index(program) + 1})"

    def events(self, wanted):
        """Rows of the events, all programs side by side in each round."""
        rows = []
        for disks, parts in self.shapes:
            samples = {}
            with contextlib.ExitStack() as stack:
                pairs = [stack.enter_context(Pair(program, disks, parts)) for program in self.programs]
                for number in range(self.options.rounds):
                    say(f"{disks}x{parts} disks, round {number + 1}")
                    for event in EVENTS:
                        for program, pair in zip(self.programs, pairs, strict=True):
                            samples.setdefault((event, program), []).append(getattr(pair, event)())
            rows += [self.event_row(event, disks, parts, program, found)
                     for (event, program), found in samples.items() if event in wanted]
        return rows

    def event_row(self, event, disks, parts, program, samples):
        totals = [one.total for one in samples]
        if event == "plug" and parts == 1:
            self.plugs.setdefault(self.name(program), []).append((disks, sorted(totals)[len(totals) // 2]))
        # Other work on the machine only ever adds: the best of each side are the least disturbed.
        best = min(totals) / min(one.waits + one.commands for one in samples)
        return [f"{event} {disks}×{parts}", self.name(program), spread(totals),
                spread([one.waits for one in samples], 2), spread([one.commands for one in samples]),
                spread([one.ratio for one in samples]), f"{best:.3f}", spread([1000 * one.own for one in samples], 1),
                spread([1000 * one.own_cpu for one in samples], 1)]

    def calm(self):
        """(rows of idle cost, rows of memory)."""
        costs, sizes = [], []
        for count in self.counts:
            with idle.pairs(self.programs, count) as pairs:
                for program, pair in zip(self.programs, pairs, strict=True):
                    say(f"idle with {count} disks")
                    sizes.append([count, self.name(program), *idle.memory(pair)])
                    cost = idle.idle_cost(pair, self.options.cycles)
                    self.idles.setdefault(self.name(program), []).append((count, cost.own_ms))
                    costs.append([count, self.name(program), f"{cost.own_ms:.2f}", f"{cost.commands_ms:.1f}",
                                  f"{cost.commands:.2f}", f"{cost.processes:.2f}", f"{cost.calls:.0f}",
                                  f"{cost.cycle_s:.2f}"])
        return costs, sizes

    def bursts(self):
        rows = []
        # The safe removal comes last: after it the daemon is parked.
        with idle.pairs(self.programs, 1) as pairs:
            for kind in idle.KINDS:
                for program, pair in zip(self.programs, pairs, strict=True):
                    say(f"{idle.BURST} events of {kind}")
                    total, floor, used = idle.burst(pair, kind)
                    rows.append([kind, self.name(program), f"{total:.3f}", f"{floor:.3f}",
                                 f"{total / floor:.3f}" if floor else "-", f"{used:.0f}"])
        return rows

    def text(self):
        """Everything that was asked for, as Markdown."""
        wanted = self.options.section or SECTIONS
        events = [section for section in EVENTS if section in wanted]
        texts = []
        if events:
            heads = ["event", "build", "seconds", "ordered waits", "commands", "ratio to floor", "best to best", "own ms",
                     "own processor ms"]
            texts += ["### Events\n", table(heads, self.events(events))]
            texts += ["### A desktop's way\n", mount_times(self.options.rounds)]
        if "idle" in wanted or "memory" in wanted:
            costs, sizes = self.calm()
            if "idle" in wanted:
                texts += ["### An idle cycle\n", table(
                    ["disks", "build", "own ms", "commands' ms", "commands", "processes", "own calls", "seconds"],
                    costs)]
            if "memory" in wanted:
                texts += ["### Memory, KiB\n", table(["disks", "build", "resident", "proportional", "private"], sizes)]
        if "burst" in wanted:
            texts += [f"### {idle.BURST} events at once\n",
                      table(["event", "build", "seconds", "commands", "ratio", "own processor ms"], self.bursts())]
        return "\n".join(texts)


def write(text, bench):
    """Put the text between the markers of the note, and the plot beside it."""
    head, begin, rest = NOTE.read_text().partition(BEGIN)
    _, end, tail = rest.partition(END)
    if not begin or not end:
        sys.exit(f"bench: {NOTE} lacks its markers")
    NOTE.write_text(f"{head}{BEGIN}\n{text}\n{END}{tail}")
    if bench.plugs and bench.idles:
        PLOT.write_text(plot(bench.plugs, bench.idles))


def parse():
    parser = argparse.ArgumentParser(prog="scripts/bench", description=__doc__.splitlines()[0])
    parser.add_argument("--section", action="append", choices=SECTIONS, help="only this one; may be repeated")
    parser.add_argument("--binary", type=Path, default=BUILDS[0], help="the daemon (the release build)")
    parser.add_argument("--against", type=Path, default=BUILDS[1], help="a second one beside it (the prompt build)")
    parser.add_argument("--rounds", type=int, default=5, help="of the events (5)")
    parser.add_argument("--cycles", type=int, default=20, help="idle cycles to measure (20)")
    parser.add_argument("--smoke", action="store_true", help="one round of one disk: does it still run")
    parser.add_argument("--write", action="store_true", help="put tables and plot into docs")
    options = parser.parse_args()
    if options.smoke:
        options.rounds, options.cycles = 1, 3
    return options


def main():
    options = parse()
    bench = Bench(options)
    command = " ".join(["scripts/bench", *sys.argv[1:]])
    text = (f"Made by `{command}` on {os.cpu_count()} processors of x86_64, "
            f"{options.rounds} rounds; load {os.getloadavg()[0]:.1f} at the start.\n\n{bench.text()}")
    print(text)
    if options.write:
        write(text, bench)


if __name__ == "__main__":
    main()
