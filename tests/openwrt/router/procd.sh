#!/bin/sh
# shellcheck shell=dash
# The part of procd that an init script talks to. Every call is noted in /run/procd/calls. Each instance has a directory
# below /run/procd/instances with its parameters, one file each, one value a line.

STATE=/run/procd
mkdir -p "$STATE/instances"

# A service's script runs once at a time: the next one waits here until the last process that has the lock open is gone.
exec 9>"$STATE/lock"
flock 9

note() {
	echo "$*" >>"$STATE/calls"
}

# process_runs <instance directory>: its process has not ended (a zombie has).
process_runs() {
	[ -e "$1/pid" ] && [ -n "$(readlink "/proc/$(cat "$1/pid")/exe")" ]
}

# forget_supervisor <instance directory>: what waits to start it again, if anything.
forget_supervisor() {
	[ ! -e "$1/supervisor" ] || kill -KILL "$(cat "$1/supervisor")" 2>/dev/null
	rm -f "$1/supervisor"
}

procd_open_service() {
	note "open_service $*"
	rm -rf "$STATE/new"
	mkdir "$STATE/new"
	: >"$STATE/order"
}

procd_open_instance() {
	note "open_instance $1"
	instance="$1"
	mkdir "$STATE/new/$instance"
	echo "$instance" >>"$STATE/order"
}

procd_set_param() {
	note "set_param $instance $*"
	name="$1"
	shift
	printf '%s\n' "$@" >"$STATE/new/$instance/$name"
}

procd_close_instance() {
	note "close_instance $instance"
}

procd_add_reload_trigger() {
	note "add_reload_trigger $*"
}

# supervise <instance directory>: procd runs it, so it has procd's signals and not those of whoever called the script.
supervise() {
	rm -f "$1/halt"
	/usr/bin/env --default-signal=TERM,INT,PIPE setsid /bin/sh /lib/procd_supervise "$1" >/dev/null 2>&1 9>&- &
	echo $! >"$1/supervisor"
}

# stop_instance <instance directory>: procd's SIGTERM, and its SIGKILL later.
stop_instance() {
	: >"$1/halt"
	kill -TERM "$(cat "$1/pid")"
}

# update_instance <name>: what has not changed runs on; what has, or is about to end, is started anew when it has ended.
update_instance() {
	dir="$STATE/instances/$1"
	if ! process_runs "$dir"; then
		[ ! -e "$dir/supervisor" ] || forget_supervisor "$dir"
		rm -rf "$dir"
		mv "$STATE/new/$1" "$dir"
		supervise "$dir"
		return
	fi
	[ ! -e "$dir/halt" ] || : >"$dir/restart"
	for file in "$STATE/new/$1"/*; do
		cmp -s "$file" "$dir/${file##*/}" || : >"$dir/restart"
	done
	[ -e "$dir/restart" ] || return 0
	note "restart $1"
	cp "$STATE/new/$1"/* "$dir"
	kill -TERM "$(cat "$dir/pid")"
}

procd_close_service() {
	note "close_service"
	service_triggers
	while read -r name; do
		update_instance "$name"
	done <"$STATE/order"
}

# end_instance <instance directory>: false when there is none.
end_instance() {
	if process_runs "$1"; then
		stop_instance "$1"
	elif [ -e "$1/supervisor" ]; then
		forget_supervisor "$1"
	else
		return 1
	fi
}

procd_kill() {
	note "kill $*"
	found=''
	for dir in "$STATE/instances"/${2:-*}; do
		! end_instance "$dir" || found=1
	done
	[ -n "$found" ] || {
		echo "Command failed: Not found" >&2
		return 4
	}
}

procd_running() {
	process_runs "$STATE/instances/$2"
}
