"""Moments of the daemon's loop at which a test may act without meeting its periodic work."""

HEART_BEAT = "===> get event = EVENT_DISK_HEART_BEAT"


def quiet_moment(world, daemon):
    """Returns with the daemon idle for almost 3 s to come.

    A disk pulled in the middle of a consistency check is a mount without its
    device to that check, which ends the daemon.
    """
    mark = daemon.mark()
    world.send("#heart_beat")
    daemon.wait_log(HEART_BEAT, 40, mark)


def first_rescan_over(world, daemon):
    """Returns when the first rescan, which offers every known disk again, is over."""
    daemon.wait_log("mount dev num = ")
    quiet_moment(world, daemon)
