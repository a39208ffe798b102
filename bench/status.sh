#!/bin/bash
# Measures `remvol --status` on eight targets, with an iscsiadm that answers at once (a shell script that copies
# a file out), beside a shell loop that runs the same shell commands as system(3) does and nothing else:
# bench/status.sh [BUILD FOLDER]. The two take turns; the figure is the median of their ratio within a turn.
# Exits 1 when the tool costs more than 1.25 times the loop. As root; it runs in namespaces of its own, on one
# processor and before all other processes, and leaves nothing behind.
set -euo pipefail
limit=1.25
turns=${TURNS:-201}

if [ -z "${BENCH_INSIDE:-}" ]; then
  build=$(realpath "${1:-$(dirname "$0")/../build/release}")
  BENCH_INSIDE=1 exec chrt --fifo 50 taskset -c 0 unshare --mount --pid --ipc --net --fork --mount-proc "$0" "$build"
fi
build=$1

# A world of its own, in memory. The programs are copied first: they may lie below what is covered.
mount -t tmpfs bench /mnt
mkdir /mnt/bin /mnt/lib /mnt/etc /mnt/work
cp "$build"/bin/{remvol,ktree,ktreec} /mnt/bin
cp -P "$build"/lib/*.so* /mnt/lib
cat >/mnt/bin/iscsiadm <<'END'
#!/bin/sh
case $3 in
  -P3) cat /mnt/session-P3 ;;
  *) cat /mnt/session ;;
esac
END
chmod +x /mnt/bin/iscsiadm
export LD_LIBRARY_PATH=/mnt/lib
mount -t overlay bench -o lowerdir=/etc,upperdir=/mnt/etc,workdir=/mnt/work /etc
mount -t tmpfs bench /run
mount -t tmpfs bench /tmp
mkdir -p /etc/NAS_CFG
export PATH=/mnt/bin:$PATH
socket=/run/ktree_sock_vv

ktree -n config -s $socket &
until ktreec -S $socket -s /iscsi/initiator/count 8 2>/dev/null; do sleep 0.01; done
ktreec -S $socket -s /iscsi/initiator/ver 1
for n in {1..8}; do
  target=/iscsi/initiator/id:$n
  name=iqn.2026-01.org.example:t$n
  while read -r key value; do ktreec -S $socket -s "$target/$key" "$value"; done <<END
target $name
ip 10.9.0.2
port 3260
conn_set 1
lun/count 1
lun/id:1/lun 1
lun/id:1/share share$n
lun/id:1/enable 1
END
  printf 'tcp: [%d] 10.9.0.2:3260,1 %s (non-flash)\n' "$n" "$name" >>/mnt/session
  printf 'Target: %s (non-flash)\n\tCurrent Portal: 10.9.0.2:3260,1\n\t\tiSCSI Session State: LOGGED_IN\n' "$name" >>/mnt/session-P3
  printf '\t\tHost Number: %d\tState: running\n\t\tscsi%d Channel 00 Id 0 Lun: 1\n' "$n" "$n" >>/mnt/session-P3
  printf '\t\t\tAttached scsi disk sd%s\t\tState: running\n' "$(printf %b "\\x$((60 + n))")" >>/mnt/session-P3
done

cat >/mnt/bin/loop <<'END'
#!/bin/sh
for n in 1 2 3 4 5 6 7 8; do
  sh -c 'iscsiadm -m session -P3 >/tmp/remvol.tmp 2>&1'
  sh -c 'iscsiadm -m session >/tmp/remvol_session.tmp 2>&1'
done
END
chmod +x /mnt/bin/loop

now() { echo "${EPOCHREALTIME/./}"; }
for ((turn = 0; turn < turns; turn++)); do
  a=$(now)
  remvol --status >/dev/null
  b=$(now)
  loop
  c=$(now)
  echo "$((b - a)) $((c - b))"
done >/tmp/times
[ "$(ktreec -S $socket -g /iscsi/initiator/id:8/status)" = Connected ]
[ "$(ktreec -S $socket -g /iscsi/initiator/id:8/lun/id:1/dev)" = sdh ]

median() { awk "{print $1}" /tmp/times | sort -n | awk '{value[NR] = $1} END {print value[int((NR + 1) / 2)]}'; }
ratio=$(median '$1 / $2')
printf '| --status of 8 targets | milliseconds, median of %d |\n|---|---|\n' "$turns"
printf '| remvol | %s |\n| shell loop | %s |\n| ratio, at most %s | %s |\n' \
  "$(median '$1 / 1000')" "$(median '$2 / 1000')" $limit "$ratio"
awk "BEGIN {exit !($ratio <= $limit)}"
