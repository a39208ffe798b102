# timeout: 500
# The cable is cut: briefly, and nobody notices; long, and the volume comes back writable with what was synced.
T=iqn.2026-01.org.example:t1
session_state() { [ "$(cat /sys/class/iscsi_session/session*/state)" = "$1" ]; }
mounts() { dmesg | grep -c "EXT4-fs (.*1): mounted filesystem"; }
refuses_writes() { ! dd if=/dev/zero of=/mnt/VV/a/probe bs=4k count=1 conv=fsync; }
# recover: the event that the session is back, with the course of it in /tmp/remvol.out.
recover() {
    tree_set /iscsi/initiator/dbg 1
    works --oiscsi_evt_recover -n $T
    tree_set /iscsi/initiator/dbg 0
}
degraded="access right is degraded to ro"

target_start
target_add 1 $T
lun_add 1 1 64M
works --init
# Less patience than usual, so that an outage need not be long.
sed -i -e 's/\(replacement_timeout\).*/\1 = 8/' -e 's/\(noop_out_.*\) = .*/\1 = 2/' /etc/iscsi/iscsid.conf
works --add -n $T -l 1 -i 10.9.0.2 -p 3260 -s a
works --connect -n $T
echo "first text" >/mnt/VV/a/file
sync

# Briefly: an open file goes on.
before=$(mounts)
exec 3>/mnt/VV/a/open
echo before >&3
cable_cut 0
wait_for 20 session_state FAILED
works --oiscsi_evt_reopen -n $T
expect_equal "connect state" 3 "$(target_key 1 conn_state)"
cable_plug 0
wait_for 60 session_state LOGGED_IN
recover
expect_lacks "what is found" "$degraded" "$(cat /tmp/remvol.out)"
expect_equal "connect state" 1 "$(target_key 1 conn_state)"
expect_equal "target" Connected "$(target_key 1 status)"
expect_equal "nothing was mounted anew" "$before" "$(mounts)"
echo after >&3
sync
expect_equal "the open file" "before after" "$(echo $(cat /mnt/VV/a/open))"
exec 3>&-

# An event without an outage changes nothing.
works --oiscsi_evt_recover -n $T
expect_equal "nothing was mounted anew" "$before" "$(mounts)"

# Long: the file system is lost to writes until the target is rebuilt.
cable_cut 0
dd if=/dev/zero of=/mnt/VV/a/lost bs=64k count=32 conv=fsync 2>/dev/null && fail "a write went through a cut cable"
works --oiscsi_evt_reopen -n $T
works --status
expect_equal "target" Reconnecting "$(target_key 1 status)"
expect "the volume takes no writes" refuses_writes
cable_plug 0
wait_for 60 session_state LOGGED_IN
expect "nor does it now" refuses_writes
recover
expect_has "what is found" "$degraded" "$(cat /tmp/remvol.out)"
expect_equal "target" Connected "$(target_key 1 status)"
expect_equal "connect state" 1 "$(target_key 1 conn_state)"
expect_equal "volume" Running "$(lun_key 1 1 status)"
expect_equal "the volume was mounted anew" $((before + 1)) "$(mounts)"
expect_not "it takes writes" refuses_writes
expect_equal "the synced file" "first text" "$(cat /mnt/VV/a/file)"

# A target that is not to be connected is left alone.
works --disconnect -n $T
works --oiscsi_evt_reopen -n $T
works --oiscsi_evt_recover -n $T
expect_equal "connect state" 0 "$(target_key 1 conn_state)"
expect_not "it stays logged out" logged_in $T
