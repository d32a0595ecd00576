#!/bin/sh
# shellcheck shell=dash disable=SC2034,SC2154
#
# What disks there are: read into variables from the status file, the mount list and sysfs. The plugin that sources this
# sets `running` to "true" or "false" before it reads the status file.
#
# No disk is touched: a sleeping one sleeps on.

STATUS=/tmp/tarn_nas/disk.json
MOUNT_BASE=/tmp/mountd

# The daemon's own limits.
MAX_DISKS=16
MAX_PARTS=8
SMALL_PART_MAX_MIB=999
# The daemon's buffers take 31 characters of a name in a message.
MAX_NAME=31

# The daemon renames a whole status file into place; who writes it in another way may be halfway through. What is no
# document is read again, at once and then after whole seconds, as not every busybox counts others.
STATUS_TRIES=5
STATUS_TRIES_AT_ONCE=3

# Names that reach a shell variable or a message are these and no others.
is_plain_device() {
	case "$1" in
		'' | *[!a-z0-9]*) return 1 ;;
	esac
	[ ${#1} -le "$MAX_NAME" ]
}

is_plain_directory() {
	case "$1" in
		'' | .* | *[!a-zA-Z0-9._-]*) return 1 ;;
	esac
	[ ${#1} -le "$MAX_NAME" ]
}

# The daemon goes by these prefixes.
is_handled() {
	case "$1" in
		sd?* | hd?* | mmcblk*) is_plain_device "$1" ;;
		*) return 1 ;;
	esac
}

# Devices that nobody plugs, and the areas of an eMMC chip where nobody's files ever are.
is_no_disk() {
	case "$1" in
		loop* | ram* | zram* | mtdblock* | ubiblock* | mmcblk*boot* | mmcblk*rpmb*) return 0 ;;
		*) return 1 ;;
	esac
}

# disk_of <device>: sets `disk` to the name of the disk that a device is, or is a part of.
disk_of() {
	case "$1" in
		mmcblk*) disk="${1%p[0-9]*}" ;;
		*) disk="${1%%[0-9]*}" ;;
	esac
}

# read_mounts: sets `at_DEVICE` to the directories that each disk or partition is mounted on, with blanks around each,
# and `ours` to the devices that are mounted in a directory of the disk manager's.
read_mounts() {
	local line device directory rest IFS='
'

	ours=''
	set -f
	# The builtin read would take a system call for each byte.
	# shellcheck disable=SC2013
	for line in $(cat /proc/mounts); do
		device="${line%% *}"
		rest="${line#* }"
		directory="${rest%% *}"
		device="${device#/dev/}"
		is_handled "$device" || continue
		eval "at_$device=\"\${at_$device:- }\$directory \""
		case "$directory" in
			"$MOUNT_BASE"/*) ours="$ours $device" ;;
		esac
	done
	set +f
}

# mounts_of <device>: sets `mounts` to its directories; false when there are none.
mounts_of() {
	eval "mounts=\"\${at_$1:-}\""
	[ -n "$mounts" ]
}

# read_system: sets `system` to the numbers of the devices that the router runs from, whatever their names.
read_system() {
	local line IFS='
'

	system=' '
	set -f
	# shellcheck disable=SC2013
	for line in $(cat /proc/self/mountinfo); do
		IFS=' '
		# shellcheck disable=SC2086  # fields
		set -- $line
		case "$5" in
			/ | /rom | /overlay | /boot) system="$system$3 " ;;
		esac
	done
	set +f
}

# is_system_disk <disk>: true when the router runs from it or from one of its partitions.
is_system_disk() {
	local file number

	for file in "/sys/block/$1/dev" "/sys/block/$1/$1"*/dev; do
		number=''
		{ read -r number <"$file"; } 2>/dev/null
		case "$system" in
			*" $number "*) return 0 ;;
		esac
	done
	return 1
}

# quote <text>: sets `quoted` to the text as a JSON string.
quote() {
	local rest="$1" char

	case "$1" in
		*[\"\\]* | *[[:cntrl:]]*) ;;
		*) quoted="\"$1\""; return ;;
	esac

	quoted='"'
	while [ -n "$rest" ]; do
		char="${rest%"${rest#?}"}"
		rest="${rest#?}"
		case "$char" in
			[\"\\]) quoted="$quoted\\$char" ;;
			[[:cntrl:]]) quoted="$quoted$(printf '\\u%04x' "'$char")" ;;
			*) quoted="$quoted$char" ;;
		esac
	done
	quoted="$quoted\""
}

# jshn prints a document as a row of calls, one for each value. jshn.sh has functions of these names that keep a whole
# document in variables, which takes 40 ms for 16 disks of 8 partitions; these take each value as it comes.
#
# `level` counts the arrays and objects around a value. Arguments stand on level 0, and so does the number of disks; the
# fields of a disk stand on level 2, those of a partition on level 4.
json_init() { level=0; }
json_add_object() { level=$((level + 1)); }
json_add_array() { level=$((level + 1)); }
json_close_array() { level=$((level - 1)); }
json_add_boolean() { :; }
json_add_double() { :; }
json_add_null() { :; }

json_add_string() {
	case "$level $1" in
		"0 $argument_name") argument="$2" ;;
		'4 dev_name') dev_name="$2" ;;
		'4 disk_name') disk_name="$2" ;;
		'4 fs_type') fs_type="$2" ;;
		'4 uid') uid="$2" ;;
		'4 label') label="$2" ;;
	esac
}

json_add_int() {
	case "$level $1" in
		'0 disk_number') disk_number="$2" ;;
		'2 sd_card') sd_card="$2" ;;
		'4 total_len') total_len="$2" ;;
		'4 free_size') free_size="$2" ;;
	esac
}

json_close_object() {
	case "$level" in
		4) end_of_part ;;
		2) end_of_disk ;;
	esac
	level=$((level - 1))
}

# read_argument <name>: sets `argument` to the string of that name; false when there is none.
read_argument() {
	local input=''

	argument_name="$1"
	argument=''
	read -r input
	eval "$(jshn -r "$input" 2>/dev/null)"
	argument_name=''
	[ -n "$argument" ]
}

# read_status: goes through the status file, see end_of_part and end_of_disk; false when no whole document is there.
read_status() {
	local calls tries=0

	disk_number=0
	disks=''
	parts=''
	disk=''
	sd_card=0
	listed=' '
	while [ "$tries" -lt "$STATUS_TRIES" ] && [ -e "$STATUS" ]; do
		if calls="$(jshn -R "$STATUS" 2>/dev/null)" && [ -n "$calls" ]; then
			eval "$calls"
			return 0
		fi
		tries=$((tries + 1))
		[ "$tries" -lt "$STATUS_TRIES_AT_ONCE" ] || sleep 1
	done
	return 1
}

# sector_bytes <disk>: sets `sector` to the size of the disk's own sectors.
sector_bytes() {
	sector=''
	{ read -r sector <"/sys/block/$1/queue/hw_sector_size"; } 2>/dev/null
	case "$sector" in
		'' | 0 | *[!0-9]*) sector=512 ;;
	esac
}

# add_text <field> <text>: adds a field to the partition at the end of `parts`.
add_text() {
	quote "$2"
	parts="$parts,\"$1\":$quoted"
}

# end_of_part: a partition of the status file has been read; adds it to `parts`.
end_of_part() {
	local state

	is_plain_device "$dev_name" || return
	disk_of "$dev_name"
	listed="$listed$dev_name:$disk_name "
	# The daemon multiplies the kernel's units of 512 bytes with the disk's own sectors.
	[ -n "$parts" ] || sector_bytes "$disk"
	[ "$sector" -eq 512 ] || total_len=$((total_len * 512 / sector))

	reason_of_listed
	if [ -n "$reason" ]; then
		state="\"mounted\":false,\"reason\":\"$reason\""
		# What the file has then is the free space of an empty directory in memory.
		free_size=0
	else
		state='"mounted":true'
	fi
	parts="$parts,{\"dev_name\":\"$dev_name\""
	add_text disk_name "$disk_name"
	add_text fs_type "$fs_type"
	add_text uid "$uid"
	add_text label "$label"
	parts="$parts,\"total_len\":$total_len,\"free_size\":$free_size,$state}"
}

# end_of_disk: a disk of the status file has been read; adds it with its partitions to `disks`.
end_of_disk() {
	local card=false

	[ "$sd_card" = 0 ] || card=true
	[ -z "$parts" ] || disks="$disks,{\"dev_name\":\"$disk\",\"sd_card\":$card,\"part\":[${parts#,}]}"
	parts=''
}

# reason_of_listed: sets `reason` to why the partition just read is not mounted; empty when it is.
reason_of_listed() {
	reason=''
	if mounts_of "$dev_name"; then
		case "$mounts" in
			*" $MOUNT_BASE/$disk_name "*) return ;;
		esac
		reason=elsewhere
	elif [ ! -e "/sys/class/block/$dev_name" ]; then
		reason=gone
	else
		case "$fs_type" in
			'ERR FS') reason=no_filesystem ;;
			MBR | EFI | EXTENDED) reason='type' ;;
			*) reason=not_mounted ;;
		esac
		[ "$running" = true ] || reason=not_running
	fi
}

# reason_of_unlisted <device> <disk> <partitions> <sectors>: sets `reason` to why the disk manager does not have what
# the kernel has. A disk without a partition table is asked about with 0 partitions.
reason_of_unlisted() {
	if mounts_of "$1"; then
		reason=elsewhere
		# Not yet in the list, or taken out of it while a file was in use.
		case "$mounts" in
			*" $MOUNT_BASE"/*) reason=busy ;;
		esac
		return
	fi
	sector_bytes "$2"
	if [ "$3" -gt 0 ] && [ $((($4 * sector) >> 20)) -le "$SMALL_PART_MAX_MIB" ]; then
		reason=small
	elif [ "$running" = false ]; then
		reason=not_running
	elif [ "$3" -gt "$MAX_PARTS" ]; then
		reason=full
	elif [ "$disk_number" -ge "$MAX_DISKS" ] && ! is_listed_disk "$2"; then
		reason=full
	elif [ "$3" -eq 0 ]; then
		reason=no_filesystem
	else
		reason=removed
	fi
}

is_listed() {
	case "$listed" in
		*" $1:"*) return 0 ;;
		*) return 1 ;;
	esac
}

is_listed_disk() {
	is_listed "$1" && return 0
	case "$listed" in
		*" $1"[0-9]*:* | *" $1p"[0-9]*:*) return 0 ;;
		*) return 1 ;;
	esac
}

# add_unused <device> <disk> <sectors>: adds a device to `unused`, with its size in units of 512 bytes.
add_unused() {
	unused="$unused,{\"dev_name\":\"$1\",\"disk\":\"$2\",\"total_len\":$(($3 >> 11)),\"reason\":\"$reason\"}"
}

# read_sectors <directory>: sets `sectors` to a device's size; false when it has none, as a reader without its card.
read_sectors() {
	sectors=0
	{ read -r sectors <"$1/size"; } 2>/dev/null
	[ "${sectors:-0}" -gt 0 ]
}

# find_unused: sets `unused` to what sysfs has and the status file has not.
find_unused() {
	local path name

	unused=''
	for path in /sys/block/*; do
		name="${path##*/}"
		case "$name" in
			*[\"\\]*) continue ;;
		esac
		is_no_disk "$name" && continue
		read_sectors "$path" || continue
		if is_handled "$name"; then
			find_unused_on "$name"
		else
			reason=name
			add_unused "$name" "$name" "$sectors"
		fi
	done
}

# find_unused_on <disk>: the same of one disk, whose size is in `sectors`.
find_unused_on() {
	local part name count

	set -- "$1" "/sys/block/$1/$1"*/partition
	count=$(($# - 1))
	if is_system_disk "$1"; then
		reason=system
		add_unused "$1" "$1" "$sectors"
		return
	fi
	if [ ! -e "$2" ]; then
		is_listed "$1" && return
		reason_of_unlisted "$1" "$1" 0 "$sectors"
		add_unused "$1" "$1" "$sectors"
		return
	fi
	disk="$1"
	shift
	for part in "$@"; do
		part="${part%/partition}"
		name="${part##*/}"
		is_listed "$name" && continue
		is_plain_device "$name" || continue
		read_sectors "$part" || continue
		# The container of logical partitions, which are listed by themselves.
		[ "$sectors" -gt 2 ] || continue
		reason_of_unlisted "$name" "$disk" "$count" "$sectors"
		add_unused "$name" "$disk" "$sectors"
	done
}
