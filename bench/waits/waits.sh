# Where the time of each command goes that a person waits for: bench/waits.py says how it is seen.
# timeout: 900
# brings: build/bench-meter/bench_meter build/bench-meter/bench_meter.so
T=iqn.2026-01.org.example:t1
ROUNDS=3
TIMES=/tmp/times

# metered NAME OPTION...: a run of remvol that must succeed, measured.
metered() {
    name=$1
    shift
    /brought/build/bench-meter/bench_meter $TIMES "$name" remvol "$@" >/tmp/run.out 2>&1 || {
        cat /tmp/run.out
        fail "remvol $*"
    }
}

session_state() { session_is $T "$1"; }
disks_at_rest() { ! pgrep 'resize2fs|mke2fs|e2fsck'; }
blank_luns() { truncate -s 0 "$(lun_file 1 1)" "$(lun_file 1 2)" && truncate -s 256M "$(lun_file 1 1)" "$(lun_file 1 2)"; }

# cable_lost: the target loses the connection and gets it back, so quickly that no volume turns read-only.
cable_lost() {
    cable_cut 0
    wait_for 30 session_state FAILED
    works --oiscsi_evt_reopen -n $T
    cable_plug 0
    wait_for 60 session_state LOGGED_IN
}

# volume_lost: the same for so long that the volume takes no writes any more.
volume_lost() {
    cable_cut 0
    dd if=/dev/zero of=/mnt/VV/a/lost bs=64k count=32 conv=fsync 2>/dev/null && fail "a write went through a cut cable"
    works --oiscsi_evt_reopen -n $T
    cable_plug 0
    wait_for 60 session_state LOGGED_IN
}

one_round() {
    metered "search" --search -i 10.9.0.2 -p 3260
    metered "search, into a file" --search -i 10.9.0.2 -p 3260 -o /tmp/found.xml
    metered "search_lun" --search_lun -n $T -i 10.9.0.2 -p 3260 -c 0
    metered "add" --add -n $T -l 1 -i 10.9.0.2 -p 3260 -s a
    metered "connect, with a format" --connect -n $T
    expect_equal "the volume was formatted" 100 "$(lun_key 1 1 format_progress)"
    wait_for 30 disks_at_rest
    metered "status" --status
    metered "disconnect" --disconnect -n $T
    metered "connect, formatted before" --connect -n $T
    wait_for 30 disks_at_rest
    metered "format" --format -n $T -l 1
    wait_for 30 disks_at_rest
    metered "modify" --modify -n $T -c 0
    wait_for 30 disks_at_rest
    expect "the system goes down" remvol --system_off
    metered "init, one target" --init
    expect "the volume is back" mounted a
    wait_for 30 disks_at_rest
    sed -i -e 's/\(replacement_timeout\).*/\1 = 8/' -e 's/\(noop_out_.*\) = .*/\1 = 2/' /etc/iscsi/iscsid.conf
    works --disconnect -n $T
    works --connect -n $T
    wait_for 30 disks_at_rest
    cable_lost
    metered "recovery, the volume intact" --oiscsi_evt_recover -n $T
    if [ "$round" = $ROUNDS ]; then
        volume_lost
        metered "recovery, the volume read-only" --oiscsi_evt_recover -n $T
        wait_for 30 disks_at_rest
    fi
    metered "add, to a connected target" --add -n $T -l 2 -i 10.9.0.2 -p 3260 -s b
    wait_for 30 disks_at_rest
    metered "del_lun" --del_lun -n $T -l 2
    metered "del" --del -n $T
    blank_luns
}

target_start
target_add 1 $T
lun_add 1 1 256M
lun_add 1 2 256M
ktree -n config -s /var/run/ktree_sock & # the machine's general tree, which takes what a search finds
works --init
round=1
while [ $round -le $ROUNDS ]; do
    one_round
    round=$((round + 1))
done
say "---- times"
cat $TIMES
