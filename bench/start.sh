#!/bin/bash
# Measures a whole run of the tool that answers from the tree, its dump included and the settings folder in memory,
# beside one read by redis-cli: remvol --check_share_name on a tree of 8 targets and 8 LUNs has to take less time, and
# less than 4 MB of memory. Exit status: 0 when it does, 1 when not, 2 when it cannot measure. Run as root.
#
# usage: bench/start.sh [BUILD_FOLDER]        (build/release)
set -euo pipefail
top=$(cd "$(dirname "$0")/.." && pwd)
build=$(realpath "${1:-$top/build/release}")
most_kib=4000
rounds=401

if [ "${2:-}" != inside ]; then
  command -v redis-server redis-cli >/dev/null || "$top/scripts/install-packages" bench || exit 2
  exec unshare --mount --pid --fork --kill-child "$0" "$build" inside
fi

# The tool's paths are fixed: /run, /tmp and the settings folder are this run's own. A build below one of them is
# put back into its place.
mount --bind "$build" /mnt
mount -t tmpfs run /run
mount -t tmpfs tmp /tmp
[ -d "$build" ] || { mkdir -p "$build" && mount --bind /mnt "$build"; }
mkdir -p /run/etc/upper /run/etc/work
mount -t overlay etc -o lowerdir=/etc,upperdir=/run/etc/upper,workdir=/run/etc/work /etc
mkdir -p /etc/NAS_CFG
mount -t tmpfs settings /etc/NAS_CFG

"$build/bin/ktree" -n config -s /run/ktree_sock_vv &
redis-server --port 0 --unixsocket /run/redis --save '' --appendonly no >/dev/null &
for socket in /run/ktree_sock_vv /run/redis; do
  for _ in $(seq 100); do [ -S $socket ] && break; sleep 0.05; done
done

key() { "$build/bin/ktreec" -S /run/ktree_sock_vv -s "/iscsi/initiator/$1" "$2"; }
for n in 1 2 3 4 5 6 7 8; do
  key "id:$n/target" "iqn.2026-01.org.example:storage.disk$n"
  for pair in ip=10.9.0.2 port=3260 chap=1 chap_name=user chap_pwd=secret-of-16-byte conn_set=1 conn_state=1 \
    status=Connected lun/count=1 lun/id:1/lun=0 "lun/id:1/share=volume$n" lun/id:1/enable=1 \
    lun/id:1/vol_access_right=1 lun/id:1/format_state=0 lun/id:1/format_progress=100 lun/id:1/volume_state=0 \
    lun/id:1/status=Running lun/id:1/size=1000000/100000000 lun/id:1/fs_type=ext4 lun/id:1/dev=sdb \
    lun/id:1/mnt_dev=/dev/sdb1 "lun/id:1/mnt=/mnt/VV/volume$n"; do
    key "id:$n/${pair%%=*}" "${pair#*=}"
  done
done
key count 8
redis-cli -s /run/redis SET name value >/dev/null

{ read -r tool_us tool_kib; read -r redis_us _; read -r true_us _; } < <(
  "$build/bin/bench_spawn" $rounds "$build/bin/remvol" --check_share_name -s X -- \
    redis-cli -s /run/redis GET name -- /bin/true)

verdict=pass
[ "$tool_us" -lt "$redis_us" ] && [ "$tool_kib" -lt $most_kib ] && [ -s /etc/NAS_CFG/vv.xml ] || verdict=FAIL
echo "Medians of $rounds rounds:"
printf '%-32s %6d us  %6d KiB at most (under %d)  %s\n' 'remvol --check_share_name' "$tool_us" "$tool_kib" \
  $most_kib $verdict
printf '%-32s %6d us\n' 'redis-cli GET' "$redis_us" '/bin/true' "$true_us"
[ $verdict = pass ]
