# timeout: 600
# The connection comes back while a volume is being formatted: the format goes on, the target is rebuilt afterwards.
T=iqn.2026-01.org.example:t1
LUN_DIR=/data/luns
target_start
target_add 1 $T
lun_add 1 1 64M
lun_add 1 2 1G
works --init
for lun in 1 2; do works --add -n $T -l $lun -i 10.9.0.2 -p 3260 -s s$lun; done
works --connect -n $T
echo text >/mnt/VV/s1/file

sed -i 's/^\[defaults\]/&\n\tlazy_itable_init = 0/' /etc/mke2fs.conf # a format that takes a while
# The format stands still for as long as it is needed.
halted() { [ "$(lun_key 1 2 format_state)" = 1 ] && pkill -STOP -x mke2fs; }
remvol --format -n $T -l 2 >/tmp/format.out 2>&1 &
format=$!
wait_for 60 halted
umount /mnt/VV/s1 # it did not survive the outage
works --oiscsi_evt_reopen -n $T
tree_set /iscsi/initiator/dbg 1
# Its result in the tree is at once that of the run that it leaves behind.
recover() { remvol --oiscsi_evt_recover -n $T >/tmp/remvol.out 2>&1; }
expect "the recovery is put off" recover
tree_set /iscsi/initiator/dbg 0
expect_has "why not" "One of target:$T 's LUN is formatting or waitting for format" "$(cat /tmp/remvol.out)"
expect_equal "connect state" 3 "$(target_key 1 conn_state)"

# The event comes back by itself, and as often as it must.
postponed_run() { pgrep -f "remvol -w 10 --oiscsi_evt_recover -n $T" >/tmp/run; }
expect "another run waits" postponed_run
first_run=$(cat /tmp/run)
another_run() { postponed_run && [ "$(cat /tmp/run)" != "$first_run" ] && ! kill -0 "${first_run%%[!0-9]*}"; }
wait_for 60 another_run
expect_equal "connect state" 3 "$(target_key 1 conn_state)"
expect_not "nothing is mounted yet" mounted s1
pkill -CONT -x mke2fs
expect "the format succeeds" wait $format
recovered() { [ "$(target_key 1 conn_state)" = 1 ] && mounted s1 && mounted s2; }
wait_for 180 recovered
no_run_is_left() { ! pgrep -x remvol; }
wait_for 60 no_run_is_left
expect_equal "the file" text "$(cat /mnt/VV/s1/file)"
expect_equal "the formatted volume" Running "$(lun_key 1 2 status)"
expect_equal "format state" 0 "$(lun_key 1 2 format_state)"
