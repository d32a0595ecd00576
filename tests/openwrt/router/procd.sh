#!/bin/sh
# shellcheck shell=dash
# The part of procd that an init script talks to. Every call is noted in /run/procd/calls.

STATE=/run/procd
mkdir -p "$STATE"

# A service's script runs once at a time: the next one waits here until the last process that has the lock open is gone.
exec 9>"$STATE/lock"
flock 9

note() {
	echo "$*" >>"$STATE/calls"
}

# process_runs: the service's process has not ended (a zombie has).
process_runs() {
	[ -e "$STATE/pid" ] && [ -n "$(readlink "/proc/$(cat "$STATE/pid")/exe")" ]
}

# What waits to start it again, if anything.
forget_supervisor() {
	[ ! -e "$STATE/supervisor" ] || kill -KILL "$(cat "$STATE/supervisor")" 2>/dev/null
	rm -f "$STATE/supervisor"
}

procd_open_service() {
	note "open_service $*"
}

procd_open_instance() {
	note "open_instance"
}

procd_set_param() {
	note "set_param $*"
	[ "$1" != command ] || echo "$2" >"$STATE/command"
}

procd_close_instance() {
	note "close_instance"
}

procd_close_service() {
	note "close_service"
	if process_runs; then
		[ ! -e "$STATE/halt" ] || note "fault: started while the old process still runs"
		return 0
	fi
	forget_supervisor
	rm -f "$STATE/halt"
	setsid /bin/sh /lib/procd_supervise >/dev/null 2>&1 9>&- &
	echo $! >"$STATE/supervisor"
}

procd_kill() {
	note "kill $1"
	if process_runs; then
		: >"$STATE/halt"
		kill -TERM "$(cat "$STATE/pid")"
	elif [ -e "$STATE/supervisor" ]; then
		forget_supervisor
	else
		echo "Command failed: Not found" >&2
		return 4
	fi
}
