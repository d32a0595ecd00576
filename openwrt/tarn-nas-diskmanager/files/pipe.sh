# shellcheck shell=dash
#
# How a line gets into the daemon's event pipe without harm to anybody. Read by the scripts that have one to send.

PIPE=/tmp/tarn_nas/pipe_disk_add_remove
PIDFILE=/tmp/tarn_nas//disk_manager_pid
# Seconds that a line may take. Only a pipe that is full (64 KiB, over 3,000 lines) takes any time at all.
WRITE_WAIT=2

# daemon_pipe: prints a path of the pipe as the running daemon holds it; false when none does.
#
# The pipe's own path would not do: opened while the daemon replaces its pipes, it would come into being as a plain
# file, in which no event ever arrives. A path under /proc only opens what is there, and only while the daemon lives.
daemon_pipe() {
	local pid='' fd

	[ -p "$PIPE" ] && [ -r "$PIDFILE" ] || return 1
	# The file has no newline, which read counts as a failure.
	read -r pid <"$PIDFILE"
	for fd in "/proc/$pid/fd"/*; do
		if [ "$fd" -ef "$PIPE" ]; then
			printf '%s' "$fd"
			return 0
		fi
	done
	return 1
}

# send <pipe> <line>: writes the line at once, so that lines of several senders do not mix; false when the pipe stayed
# full. Opened for reading too, the pipe makes nobody wait for a reader. A write that a full pipe blocks is given up: a
# daemon that hangs must not hold up the sender.
send() {
	local guard writer given_up=0

	sleep "$WRITE_WAIT" &
	guard=$!
	{
		printf '%s\n' "$2" 1<>"$1"
		kill -KILL "$guard"
	} 2>/dev/null &
	writer=$!

	# The guard ends by the writer's hand, or in its own time when the writer hangs.
	if wait "$guard" 2>/dev/null; then
		kill -KILL "$writer" 2>/dev/null
		given_up=1
	fi
	wait "$writer" 2>/dev/null
	return "$given_up"
}
