"""Processes that keep a mount busy."""

HOLDER_PID = "/run/world/holder.pid"
# A zombie is in no directory any more, and none is left when the kernel has it out of the mount.
END_HOLDER = f"""pid="$(cat {HOLDER_PID})"
kill -9 "$pid"
while [ -e "/proc/$pid/cwd" ]; do sleep 0.05; done
"""


def hold(world, path):
    """Start a process that stays in `path`; returns its Popen once it is there.

    The world's end takes it down with all the others.
    """
    process = world.popen("/bin/sh", "-c",
                          f"echo $$ > {HOLDER_PID}; cd {path} && exec sleep 600")

    def place():
        text = f"readlink /proc/$(cat {HOLDER_PID})/cwd"
        return world.sh(text, check=False).stdout.strip()
    world.wait(lambda: place() == path, 30, f"a process in {path}")
    return process
