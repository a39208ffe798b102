# timeout: 800
# Twenty recover events for eight targets at once: one run does the work, the others queue their targets. A run that
# cannot get at the queue in its four waits (on a busy machine) says that its event is lost; the event sent again then
# does it. In the end every target is connected.
T=iqn.2026-01.org.example:t
targets="1 2 3 4 5 6 7 8"
target_start
for n in $targets; do
    target_add $n $T$n
    lun_add $n 1 32M
done
works --init
for n in $targets; do
    works --add -n $T$n -l 1 -i 10.9.0.2 -p 3260 -s s$n
    works --connect -n $T$n
    echo $n >/mnt/VV/s$n/file
done
for n in $targets; do works --oiscsi_evt_reopen -n $T$n; done
# Two of them did not survive: a volume that is not mounted any more cannot be checked.
umount /mnt/VV/s3 /mnt/VV/s6

tree_set /iscsi/initiator/dbg 1
runs=
for event in 1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 16 17 18 19 20; do
    (
        status=0
        remvol --oiscsi_evt_recover -n $T$((event % 8 + 1)) >/tmp/run.$event 2>&1 || status=$?
        echo $status >/tmp/status.$event
    ) &
    runs="$runs $!"
done
wait $runs
lost=0
for event in 1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 16 17 18 19 20; do
    n=$((event % 8 + 1))
    if grep -q "lock failed for $T$n, skip and exit" /tmp/run.$event; then
        lost=$((lost + 1))
        expect_equal "status of a run that lost its event" 255 "$(cat /tmp/status.$event)"
    else
        expect_equal "status of run $event" 0 "$(cat /tmp/status.$event)"
        expect_equal "target $n, whose event was taken" 1 "$(target_key $n conn_state)"
    fi
done
say "20 events: $(grep -l '==> insert queue' /tmp/run.* | wc -l) came while another run was at work, $lost were lost"
expect_equal "runs that did the work" 1 "$(grep -l '==> Processing' /tmp/run.* | wc -l)"
tree_set /iscsi/initiator/dbg 0
for n in $targets; do
    [ "$(target_key $n conn_state)" = 1 ] || works --oiscsi_evt_recover -n $T$n
done
expect_equal "nothing is left in the queue" "" "$(tree_get /temp/remvol/recover/queue/id:1/target_name)"
for n in $targets; do
    expect_equal "target $n" Connected "$(target_key $n status)"
    expect_equal "connect state of target $n" 1 "$(target_key $n conn_state)"
    expect_equal "the file of target $n" $n "$(cat /mnt/VV/s$n/file)"
    expect "the volume of target $n is mounted" mounted s$n
done
