"""A world that runs from a disk of its own, as a router from an SD card or a stick."""

# What stands for the directories that a root of its own would have.
_MOVE_IN = """set -e
for place in /*; do
    name=${place##*/}
    case "$name" in mnt|boot|rom|overlay|lost+found) continue ;; esac
    if [ -L "$place" ]; then
        cp -P "$place" "/mnt/$name"
    elif [ -d "$place" ]; then
        mkdir "/mnt/$name"
        mount --rbind "$place" "/mnt/$name"
    fi
done
mkdir /mnt/mnt /mnt/boot /mnt/rom /mnt/overlay
pivot_root /mnt /mnt/mnt
umount -l /mnt
"""


def run_from(world, *mount_words):
    """Make what `mount` is given the world's "/", for the processes that run there already too.

    All directories stay but /boot, /rom and /overlay, which are empty.
    """
    world.run("mount", *mount_words, "/mnt")
    world.sh(_MOVE_IN)
