# timeout: 900
# after: installed
# The initiator's daemon dies, the volumes are started anew, open-iscsi is installed again, a stranger logs out and
# another one unmounts: the volumes are always there again, without hands.
# As in lab/lib.sh, but whoever started them.
initiators() {
    for process in $(pgrep -x iscsid); do
        parent=$(ps -o ppid= -p "$process" | tr -d ' ')
        [ "$(cat "/proc/$parent/comm" 2>/dev/null)" = iscsid ] || echo "$process"
    done
}

tree_restarts() { systemctl show -P NRestarts remvol-tree; }

all_well() { mounted Photos && mounted Music && one_initiator && vvstat >/dev/null; }

expect_well() {
    wait_for 90 all_well
    for share in Photos Music; do
        expect "$share takes files, $1" sh -c "echo $1 >/mnt/VV/$share/now && sync /mnt/VV/$share/now"
    done
    for unit in remvol remvol-tree remvol-events; do expect_active $unit; done
}

provokes_loss

# Another one, and the sessions are its own: they heal after the cable was out.
old=$(initiators)
kill -KILL "$old"
died() { ! kill -0 "$old"; }
wait_for 5 died
died_at=$(uptime_seconds)
wait_for 30 one_initiator
within "another daemon is there" $(($(uptime_seconds) - died_at)) 5
cable_cut 0
wait_for 60 session_is $IQN:t1 FAILED
cable_plug 0
wait_for 60 session_is $IQN:t1 LOGGED_IN
wait_for 60 session_is $IQN:t2 LOGGED_IN
expect_well "after the daemon died"

systemctl restart remvol
expect_well "after a restart"
restarts=$(tree_restarts)
sleep 15
expect_equal "restarts of the tree since" "$restarts" "$(tree_restarts)"
expect_equal "the tree is its unit's" "$(systemctl show -P MainPID remvol-tree)" "$(cat /run/ktree_sock_vv_config.pid)"

began=$(uptime_seconds)
before=$(stat -c %i:%d /mnt/VV/Photos/file)
initiator=$(initiators)
apt_quiet install --reinstall open-iscsi || fail "open-iscsi is not installed again"
expect "the volume stayed" mounted Photos
expect_equal "it is the same mount" "$before" "$(stat -c %i:%d /mnt/VV/Photos/file)"
expect_equal "the daemon" "$initiator" "$(initiators)"
for unit in iscsid.socket iscsid.service open-iscsi.service; do
    expect_equal "$unit" masked "$(systemctl is-enabled $unit)"
done
expect_well "after open-iscsi was installed again"

iscsiadm -m session -u >/dev/null
says_so() { ! vvstat >/tmp/vvstat.out; }
wait_for 30 says_so
wait_for 120 vvstat
expect_well "after a stranger logged out"

other=$(stat -c %d:%i /mnt/VV/Music/now)
sessions=$(ls /sys/class/iscsi_session)
expect "a stranger unmounts" umount /mnt/VV/Photos
wait_for 30 says_so
wait_for 120 vvstat
expect_well "after a stranger unmounted"
expect_equal "the other volume stayed" "$other" "$(stat -c %d:%i /mnt/VV/Music/now)"
expect_equal "the sessions stayed" "$sessions" "$(ls /sys/class/iscsi_session)"
keeper_says_so() { messages remvol-keeper | grep -qx 'remvol-keeper: Photos is mounted again'; }
wait_for 30 keeper_says_so
