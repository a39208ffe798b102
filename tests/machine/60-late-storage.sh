# timeout: 900
# after: installed
# The storage server is not there at boot: the boot does not wait for it, the texts say so, and the volumes come when it does.
if [ "$PHASE" = 1 ]; then
    target_at_boot off
    allows_loss # the volumes are being brought up for all this time, which is no news
    reboot_machine
fi
reached() { systemctl is-active --quiet multi-user.target; }
wait_for 120 reached
left() { systemctl show -P InactiveExitTimestampMonotonic "$1"; }
started() { [ "$(left remvol.service)" != 0 ]; }
wait_for 30 started
[ "$(left multi-user.target)" -le "$(left remvol.service)" ] || fail "the boot waited for the volumes"
says_so() { ! vvstat >/tmp/vvstat.out && ! grep -q Running /tmp/vvstat.out; }
wait_for 60 says_so
finished() { systemctl is-active --quiet remvol; }
wait_for 200 finished
sleep 100 # the keeper's own tries
expect "the texts are right" says_so
lines=$(messages remvol-events remvol-keeper | grep -c $IQN:t1)
expect_has "the log" "Could not login to [iface: default, target: $IQN:t1," "$(messages remvol)"
target_start
all_there() { mounted Photos && mounted Music && vvstat; }
wait_for 75 all_there
booted
sleep 5
[ "$lines" -le 3 ] || fail "$lines lines in the log before the storage was there"
expect_equal "the file" "text of Photos" "$(cat /mnt/VV/Photos/file)"
