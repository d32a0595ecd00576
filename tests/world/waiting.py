"""Bounded waiting: the only way in which anything here waits for anything."""

import time


class WaitTimeout(AssertionError):
    """What was waited for did not come true in time; the text says what."""


def wait_for(condition, timeout, what, interval=0.05):
    """Call `condition` until it returns something true, and return that.

    Raises WaitTimeout naming `what` (a text, or a function that makes one) after
    `timeout` seconds.  The condition is always tried at least once, and once
    more at the end.
    """
    deadline = time.monotonic() + timeout
    while True:
        last_try = time.monotonic() >= deadline
        result = condition()
        if result:
            return result
        if last_try:
            text = what() if callable(what) else what
            raise WaitTimeout(f"waited {timeout} s for {text}")
        time.sleep(interval)
