#!/bin/sh
# shellcheck shell=dash
#
# disk_get_label.sh <device>: prints the volume label of a block device, given by its bare kernel name (sda1), as the
# first line of the output. Without a label it prints nothing.
#
# The disk manager reads labels from blkid's line of all values, where it ends them at the first space. With this
# script in place it takes the whole first line of the output instead, spaces and UTF-8 included.

NEWLINE='
'

# line_label <line>: the label in a line such as
#     /dev/sda1: LABEL="My \"new\" disk" UUID="…" TYPE="ext4" PARTLABEL="data"
# Only a key that begins after a space counts: PARTLABEL holds another name. The value ends at the quote before the
# next key, because some versions of blkid leave quotes within a value as they are, and others put a backslash before.
line_label() {
	local rest

	rest="${1#* LABEL=\"}"
	case "$rest" in
		"$1" | \"*) return 0 ;;
	esac
	printf '%s\n' "$rest" | sed -e 's/" [A-Z_]*=".*$//' -e 's/"[[:space:]]*$//' -e 's/\\\(["\\]\)/\1/g'
}

# print_label <device>
print_label() {
	local text line

	# /dev/null as the cache: the label of now, not the one of the disk that had this name before.
	text="$(blkid -c /dev/null -o value -s LABEL "/dev/$1" 2>/dev/null)"
	[ -n "$text" ] || return 0

	line="${text%%"$NEWLINE"*}"
	case "$line" in
		# busybox's blkid knows no options and prints its line as ever.
		"/dev/$1: "*=\"*) line_label "$line" ;;
		*) printf '%s\n' "$line" ;;
	esac
}

case "$1" in
	'' | *[!A-Za-z0-9]*)
		echo "usage: $0 <device name, for example sda1>" >&2
		exit 1
		;;
esac
[ -b "/dev/$1" ] || exit 1

print_label "$1"
