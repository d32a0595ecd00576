#!/bin/sh
# shellcheck shell=dash
#
# What the package checks of an OpenWrt feed run once a package is installed: test.sh <package> <version>.

set -e

case "$1" in
	tarn-nas-diskmanager)
		# It prints its version and ends with status 1.
		tarn_nas_diskmanager -v | grep -Fx "version:$2"
		sh -n /etc/init.d/tarn_nas_diskmanager
		sh -n /etc/hotplug.d/block/60-tarn_nas_diskmanager
		for script in run_daemon tarn_nas_disk_log heart_beat; do
			sh -n "/usr/lib/tarn-nas-diskmanager/$script"
		done
		[ "$(uci get tarn_nas_diskmanager.log.full)" = 0 ]
		;;
	tarn-nas-diskmanager-label)
		disk_get_label.sh 2>&1 | grep -F 'usage: '
		;;
	*)
		echo "Untested package: $1" >&2
		exit 1
		;;
esac
