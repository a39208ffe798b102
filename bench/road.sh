#!/bin/sh
# Measures in the virtual appliance, in one boot, the whole road of a volume (add, connect with partition and format of a
# 256 MB LUN, disconnect) through remvol, beside a script that runs the same shell commands as system(3) does, with the
# same waits, and does nothing else. Exit status: 0 when remvol takes at most 1.1 times as long, 1 when not.
#
# usage: bench/road.sh
exec "$(dirname "$0")/../lab/run" "$(dirname "$0")/road/scenario.sh"
