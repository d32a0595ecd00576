"""Sends signals to a process as fast as the kernel takes them, in bursts, until told to stop."""

import json
import os
import random
import signal
import sys
import time

KINDS = [signal.SIGPIPE, signal.SIGUSR1, signal.SIGUSR2, signal.SIGALRM, signal.SIGHUP,
         signal.SIGCHLD, signal.SIGTERM]
# Some hundred a second: the storm is to last as long as there is something to disturb.
LONGEST_BURST = 64
LONGEST_REST_SECONDS = 0.12


def main(pid, total, seed):
    """Prints how many of each kind were sent; ends early when the process does."""
    choose = random.Random(seed)
    sent = dict.fromkeys((kind.name for kind in KINDS), 0)
    try:
        while sum(sent.values()) < total:
            for kind in choose.choices(KINDS, k=choose.randint(1, LONGEST_BURST)):
                os.kill(pid, kind)
                sent[kind.name] += 1
            time.sleep(choose.uniform(0, LONGEST_REST_SECONDS))
    except ProcessLookupError:
        pass
    print(json.dumps(sent))


main(*(int(word) for word in sys.argv[1:]))
