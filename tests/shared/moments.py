"""Moments of the daemon's loop at which a test may act without meeting its periodic work."""

# Under valgrind, or beside a dozen other daemons.
_PATIENCE = 120


def quiet_moment(world, daemon):
    """Returns with all done that was sent, and the daemon idle for almost 3 s to come.

    A disk pulled in the middle of a consistency check is a mount without its
    device to that check, which ends the daemon.
    """
    mark = daemon.mark()
    # Of this pipe the messages are taken last, and this one is told from any before it.
    world.send(f"#heart_beat:{mark}", pipe="remove", timeout=_PATIENCE)
    daemon.wait_log(f"get event = #heart_beat:{mark}", _PATIENCE, mark)


def first_rescan_over(world, daemon):
    """Returns when the first rescan, which offers every known disk again, is over."""
    daemon.wait_log("mount dev num = ")
    quiet_moment(world, daemon)
