# The road through remvol and through a plain script, in turns. bench/road.sh says what for.
# timeout: 900
T=iqn.2026-01.org.example:t1
ROUNDS=5
node="iscsiadm -m node -I default -T $T -p 10.9.0.2:3260"
# Runs a shell command as system(3), by which the tool has to run all of its commands, does: by a shell of its own.
run() { sh -c "$1"; }
reload() { run "winshare_reload ; macshare_reload"; }
# What every successful command that changes something ends with.
finish() {
    ktreec -S "$TREE_SOCKET" -D /etc/NAS_CFG/vv.xml
    run 'flashrun "cp -f /etc/NAS_CFG/vv.xml /usr/local/config/"'
    reload
}
listed() { run "iscsiadm -m session >/tmp/road.tmp 2>&1"; }
listed_in_detail() { run "iscsiadm -m session -P3 >/tmp/road.tmp 2>&1"; }
record() {
    run "$node -o delete"
    run "$node -o new"
    run "$node -o update -n node.session.auth.authmethod -v None"
}

plain_road() {
    # add
    listed
    listed
    record
    finish
    # connect
    listed
    record
    run "$node --login"
    listed
    listed
    listed_in_detail
    sleep 1
    disk=/dev/$(disk_of $T 1)
    run "printf 'label: gpt\n,\n' | sfdisk -q $disk"
    run "fuser -mk ${disk}1"
    run "dd if=/dev/zero of=${disk}1 bs=1M count=1"
    sleep 1
    run "MKE2FS_SYNC=100 mke2fs -j -m0 -b4096 -T ext4 ${disk}1" | cat >/dev/null
    run "mkdir -p /mnt/VV/road"
    run "mount -t ext4 ${disk}1 /mnt/VV/road"
    run "resize2fs -fp ${disk}1 &"
    run "chmod 777 /mnt/VV/road"
    listed
    reload
    finish
    # disconnect
    run "fuser -mk ${disk}1"
    run "mount -o remount /mnt/VV/road"
    run "fuser -mk /mnt/VV/road" # nobody uses it, so it fails, and is tried three times with a wait of up to 0.2 s
    sleep 0.1
    run "fuser -mk /mnt/VV/road"
    sleep 0.1
    run "fuser -mk /mnt/VV/road"
    sleep 1
    run "umount -f /mnt/VV/road"
    run "rm -rf /mnt/VV/road"
    reload
    run "iscsiadm -m node -T $T --logout"
    listed_in_detail
    listed
    finish
}

remvol_road() {
    remvol --add -n $T -l 1 -i 10.9.0.2 -p 3260 -s road
    remvol --connect -n $T
    remvol --disconnect -n $T
}

blank_lun() { truncate -s 0 "$(lun_file 1 1)" && truncate -s 256M "$(lun_file 1 1)"; }

# measure ROAD FILE: appends the milliseconds that it takes on a blank LUN to the file.
measure() {
    blank_lun
    began=$(date +%s%N)
    "$1" >/tmp/road.out 2>&1
    echo $((($(date +%s%N) - began) / 1000000)) >>"$2"
}

median() { sort -n "$1" | sed -n "$(((ROUNDS + 1) / 2))p"; }

target_start
target_add 1 $T
lun_add 1 1 256M
remvol --init >/dev/null 2>&1
round=0
while [ $round -lt $ROUNDS ]; do
    measure remvol_road /tmp/remvol.times
    expect_equal "the volume was formatted" 100 "$(tree_get /iscsi/initiator/id:1/lun/id:1/format_progress)"
    remvol --del -n $T >/dev/null 2>&1
    measure plain_road /tmp/plain.times
    round=$((round + 1))
done
through_remvol=$(median /tmp/remvol.times)
plain=$(median /tmp/plain.times)
say "the road through remvol: $through_remvol ms   through a plain script: $plain ms   (medians of $ROUNDS)"
say "ratio: $((through_remvol * 100 / plain)) percent, at most 110"
expect "at most 1.1 times as long" [ $((through_remvol * 100)) -le $((plain * 110)) ]
