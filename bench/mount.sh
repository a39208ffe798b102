#!/bin/bash
# Measures the mounting of a LUN that is formatted already, on a loop device, beside a shell loop that runs the same
# shell commands as system(3) does and nothing else: bench/mount.sh [BUILD FOLDER]. The two take turns; the figure is
# the median of their ratio within a turn. No step of such a mount waits; the start of the process that mounts is not
# counted, a run mounts many LUNs. Exits 1 when the tool costs more than 1.1 times the loop. As root; it runs in
# namespaces of its own, on one processor and before all other processes, and leaves nothing behind.
set -euo pipefail
limit=1.1
turns=${TURNS:-101}

if [ -z "${BENCH_INSIDE:-}" ]; then
  build=$(realpath "${1:-$(dirname "$0")/../build/release}")
  BENCH_INSIDE=1 exec chrt --fifo 50 taskset -c 0 unshare --mount --pid --ipc --net --fork --mount-proc "$0" "$build"
fi
build=$1

# A world of its own. The disk's file lies beside the build, on a real disk.
work=$(mktemp -d "$build/bench-mount.XXXXXX")
mkdir "$work/bin"
mount -t tmpfs bench /mnt
mount -t tmpfs bench /run
export PATH=$work/bin:$build/tests/harness:$build/bin:$PATH
socket=/run/ktree_sock_vv

truncate -s 1G "$work/disk"
disk=$(losetup --show -f "$work/disk")
finish() {
  ! mountpoint -q /mnt/VV/Data || umount /mnt/VV/Data
  partx -d "$disk"
  losetup -d "$disk"
  rm -r "$work"
}
trap finish EXIT
echo 'label: gpt
start=2048,type=L' | sfdisk -q --no-reread --no-tell-kernel "$disk"
partx -a "$disk"
mke2fs -q -j -m0 -b4096 -T ext4 "${disk}p1"

ktree -n config -s $socket &
lun=/iscsi/initiator/id:1/lun/id:1
until ktreec -S $socket -s /iscsi/initiator/id:1/target iqn.t 2>/dev/null; do sleep 0.01; done
ktreec -S $socket -s $lun/lun 0
ktreec -S $socket -s $lun/share Data
ktreec -S $socket -s $lun/dev "${disk#/dev/}"

cat >"$work/bin/loop" <<END
#!/bin/sh
sh -c 'mkdir -p "/mnt/VV/Data"'
sh -c 'mount -t ext4 ${disk}p1 "/mnt/VV/Data"'
sh -c 'resize2fs -fp ${disk}p1 &'
sh -c 'chmod 777 "/mnt/VV/Data"'
sh -c 'winshare_reload ; macshare_reload'
END
chmod +x "$work/bin/loop"

now() { echo "${EPOCHREALTIME/./}"; }
# Puts the disk back to where it was; nothing of that is measured.
unmount() {
  mountpoint -q /mnt/VV/Data
  while pgrep -x resize2fs >/dev/null; do sleep 0.01; done
  umount /mnt/VV/Data
  chattr -i /mnt/VV/Data 2>/dev/null || :  # the tool makes the folder below a volume immutable
  rmdir /mnt/VV/Data
  sync "${disk}p1"
}

for ((turn = 0; turn < turns; turn++)); do
  tool=$(volume_driver mount 1 1 0 1 2>/dev/null | sed -n 's/.*took = \([0-9]*\) .*/\1/p')
  unmount
  began=$(now)
  loop >"$work/output" 2>&1
  ended=$(now)
  unmount
  echo "$tool $((ended - began))"
done >"$work/times"
[ "$(ktreec -S $socket -g $lun/volume_state)" = 0 ]

median() { awk "{print $1}" "$work/times" | sort -n | awk '{value[NR] = $1} END {print value[int((NR + 1) / 2)]}'; }
ratio=$(median '$1 / $2')
printf '| mount of a formatted LUN | milliseconds, median of %d |\n|---|---|\n' "$turns"
printf '| remvol | %s |\n| shell loop | %s |\n| ratio, at most %s | %s |\n' \
  "$(median '$1 / 1000')" "$(median '$2 / 1000')" $limit "$ratio"
awk "BEGIN {exit !($ratio <= $limit)}"
