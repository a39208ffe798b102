#!/bin/sh
# Measures the configuration tree beside a bare echo and redis-server, on this machine, in one run, and says for every
# figure whether it is what it has to be. Exit status: 0 when all are, 1 when one is not, 2 when it cannot measure.
#
# usage: bench/tree.sh [BUILD_FOLDER]        (build/release)
set -u
top=$(cd "$(dirname "$0")/.." && pwd)
build=${1:-$top/build/release}
most_kib=4096

for program in "$build/bin/ktree" "$build/bin/bench_tree"; do
  if [ ! -x "$program" ]; then
    echo "bench/tree.sh: $program is not built; build with REMVOL_TESTS=ON" >&2
    exit 2
  fi
done
if ! command -v redis-server >/dev/null; then
  "$top/scripts/install-packages" bench || exit 2
fi

work=$(mktemp -d) || exit 2
ktree_pid=
redis_pid=
finish() {
  for pid in $ktree_pid $redis_pid; do
    kill "$pid" 2>/dev/null
  done
  wait
  rm -rf "$work"
}
trap finish EXIT
trap 'exit 2' INT TERM

wait_for_socket() {
  tries=100
  while [ ! -S "$1" ]; do
    tries=$((tries - 1))
    if [ "$tries" -eq 0 ]; then
      echo "bench/tree.sh: nothing listens on $1" >&2
      exit 2
    fi
    sleep 0.05
  done
}

resident() { awk '/^VmRSS:/ { print $2 }' "/proc/$1/status"; }

"$build/bin/ktree" -n bench -s "$work/ktree" &
ktree_pid=$!
redis-server --port 0 --unixsocket "$work/redis" --save '' --appendonly no --dir "$work" --daemonize no \
  >"$work/redis.log" 2>&1 &
redis_pid=$!
wait_for_socket "$work/ktree"
wait_for_socket "$work/redis"
redis_empty=$(resident "$redis_pid")

# Measures with the servers and the echo on the processors of the list $2, and the client on those of $1.
measure() {
  taskset -apc "$2" "$ktree_pid" >/dev/null && taskset -apc "$2" "$redis_pid" >/dev/null || exit 2
  "$build/bin/bench_tree" "$work/ktree" "$work/redis" "$1" "$2"
  case $? in
    0) ;;
    1) status=1 ;;
    *) exit 2 ;;
  esac
}

# Where two processes that talk to each other run decides the figures more than anything else: so the scheduler's
# choice, which is what a user gets, and both choices that it has.
status=0
all=0-$(($(nproc) - 1))
echo "Client and servers where the scheduler puts them:"
measure "$all" "$all"
echo
echo "Client and servers on one processor:"
measure 0 0
if [ "$(nproc)" -gt 1 ]; then
  echo
  echo "Client on one processor, servers on another:"
  measure 0 1
fi

size=$(resident "$ktree_pid")
verdict=pass
if [ "$size" -ge "$most_kib" ]; then
  verdict=FAIL
  status=1
fi
echo
echo "Resident with 8 targets and 8 LUNs:"
printf '%-32s %6d KiB   (under %d)  %s\n' ktree "$size" "$most_kib" "$verdict"
printf '%-32s %6d KiB   (%d empty)\n' redis-server "$(resident "$redis_pid")" "$redis_empty"
exit $status
