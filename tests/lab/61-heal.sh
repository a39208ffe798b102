# timeout: 500
# The event listener alone: nobody runs a command while the cable is cut and put back, and the volume is writable again.
# Also when the listener died in the meantime.
T=$IQN:t1
connect_state_is() { [ "$(target_key 1 conn_state)" = "$1" ]; }
takes_writes() { mounted a && dd if=/dev/zero of=/mnt/VV/a/probe bs=4k count=1 conv=fsync 2>/dev/null; }
refuses_writes() { ! takes_writes; }
listener_start() {
    remvol-events &
    listener=$!
}
no_tool() { ! pgrep -x remvol; }
listener_stop() {
    kill "$listener"
    wait "$listener" || fail "the listener ended with status $?"
}

target_start
target_add 1 $T
lun_add 1 1 64M
works --init
# Less patience than usual, so that an outage need not be long; not so little that a busy build machine makes one while
# the volume is formatted.
sed -i -e 's/\(replacement_timeout\).*/\1 = 5/' -e 's/\(noop_out_.*\) = .*/\1 = 4/' /etc/iscsi/iscsid.conf
listener_start
volume_add t1 1 a
works --connect -n $T
wait_for 60 no_tool
expect_equal "connect state before the cut" 1 "$(target_key 1 conn_state)"
echo "first text" >/mnt/VV/a/file
sync

say "the cable is cut until the file system takes no more writes"
cable_cut 0
dd if=/dev/zero of=/mnt/VV/a/lost bs=64k count=32 conv=fsync 2>/dev/null && fail "a write went through a cut cable"
wait_for 20 connect_state_is 3
expect "it takes no writes" refuses_writes
cable_plug 0
wait_for 60 takes_writes
wait_for 20 no_tool
expect_equal "connect state" 1 "$(target_key 1 conn_state)"
expect_equal "volume" Running "$(lun_key 1 1 status)"
expect_equal "the synced file" "first text" "$(cat /mnt/VV/a/file)"

say "the listener dies while the cable is cut, and starts when the session is back"
cable_cut 0
dd if=/dev/zero of=/mnt/VV/a/lost bs=64k count=32 conv=fsync 2>/dev/null && fail "a write went through a cut cable"
wait_for 20 connect_state_is 3
wait_for 20 no_tool
kill -KILL "$listener"
cable_plug 0
wait_for 60 session_is $T LOGGED_IN
expect "it takes no writes" refuses_writes
listener_start
wait_for 60 takes_writes
wait_for 20 no_tool
expect_equal "connect state" 1 "$(target_key 1 conn_state)"
expect_equal "the synced file" "first text" "$(cat /mnt/VV/a/file)"
listener_stop
