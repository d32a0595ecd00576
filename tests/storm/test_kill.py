"""SIGKILL at any instant, again and again: the next run puts everything right."""

from collections import Counter

import pytest
from storm.stormy_router import StormyRouter

pytestmark = pytest.mark.needs_fs("ext4")

WORLDS = 8
KILLS = {"short": 5, "long": 40}


@pytest.mark.parametrize("number", range(WORLDS))
def test_whatever_instant_it_is_killed_at_the_next_run_puts_everything_right(
        make_world, request, long_form, figure, number):
    seed = request.config.getoption("--seed") or 20_000 + number
    figure("seed", seed)
    world = make_world()
    if not world.program.exists():
        pytest.skip(f"{world.program} is not built")
    router = StormyRouter(world, seed)
    moments, left = Counter(), Counter()
    # The very first runs are killed before anything is remembered.
    router.start()
    moment = router.storm(actions=False)
    while True:
        if moment:
            moments[moment] += 1
        left.update(router.after_the_end())
        router.litter()
        if router.random.random() < 0.5:
            router.shuffle()
        router.start_and_settle()
        if moments.total() >= KILLS["long" if long_form else "short"]:
            break
        at_start = router.random.random() < 0.5
        if at_start:
            router.restart()
        moment = router.storm(actions=not at_start)
    figure("kills", moments.total())
    figure("killed at", dict(moments.most_common()))
    figure("left to clean up", dict(left.most_common()))
    figure("ended by its own self-check", router.self_checks)
    assert router.daemon.stop() == 0
