"""Disks pulled at any instant, again and again: no pull costs a disk its directory."""

from collections import Counter

import pytest
from storm.pulled_router import PulledRouter, histogram

pytestmark = pytest.mark.needs_fs("ext4")

WORLDS = 8
ROUNDS = {"pull": {"short": 64, "long": 400}, "bounce": {"short": 32, "long": 200},
          "hub": {"short": 16, "long": 104}, "wait": {"short": 16, "long": 104}}


def tell(figure, rounds, late_faults):
    """The figures of one world's rounds."""
    failed = [each for each in rounds if each.faults]
    figure("rounds", f"{len(rounds)}, {len(failed)} with a fault, {len(late_faults)} between them")
    figure("patterns", dict(Counter(each.pattern for each in rounds).most_common()))
    figure("pulled at", histogram([each.instant for each in rounds]))
    if failed:
        figure("faults at", histogram([each.instant for each in failed]))
        figure("faults by pattern", dict(Counter(each.pattern for each in failed).most_common()))
    for each in failed:
        print(f"{each.kind}, messages {each.pattern}: {each.story}\n  {each.faults}")


@pytest.mark.parametrize("number", range(WORLDS))
@pytest.mark.parametrize("kind", ROUNDS)
def test_no_pull_costs_a_disk_its_directory(make_world, request, long_form, figure, kind, number):
    seed = request.config.getoption("--seed") or 60_000 + number
    figure("seed", seed)
    world = make_world()
    if not world.program.exists():
        pytest.skip(f"{world.program} is not built")
    router = PulledRouter(world, seed)
    one_round = getattr(router, kind)
    count = ROUNDS[kind]["long" if long_form else "short"] // WORLDS
    rounds = []
    try:
        for _ in range(count):
            rounds.append(one_round())
    finally:
        tell(figure, rounds, router.late_faults)
    assert not [each.faults for each in rounds if each.faults]
    assert not router.late_faults
    assert router.daemon.stop() == 0
