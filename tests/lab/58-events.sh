# timeout: 800
# Twenty recover events for eight targets at once: one run does the work, the others queue their targets, and every target
# ends connected without another event. A run that cannot get at the queue in its four waits (twenty programs start on one
# emulated processor) fails and says that its event is lost; who sent it sends it again.
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
# send EVENT TARGET: until it is taken, as a rule at the first try.
send() {
    for try in 1 2 3 4 5 6 7 8 9 10; do
        remvol --oiscsi_evt_recover -n "$2" >"/tmp/run.$1.$try" 2>&1 && return 0
        grep -q "lock failed for $2, skip and exit" "/tmp/run.$1.$try" || return 1
    done
    return 1
}
senders=
for event in 1 2 3 4 5 6 7 8 9 10 11 12 13 14 15 16 17 18 19 20; do
    send $event $T$((event % 8 + 1)) &
    senders="$senders $!"
done
for sender in $senders; do expect "an event is taken" wait "$sender"; done
lost=$(grep -l 'skip and exit' /tmp/run.* | wc -l)
say "20 events: $(grep -L 'skip and exit' /tmp/run.* | xargs grep -l '==> insert queue' | wc -l) were queued, $lost lost and sent again"
expect_equal "runs that did the work" 1 "$(grep -l '==> Processing' /tmp/run.* | wc -l)"
tree_set /iscsi/initiator/dbg 0
expect_equal "nothing is left in the queue" "" "$(tree_get /temp/remvol/recover/queue/id:1/target_name)"
for n in $targets; do
    expect_equal "target $n" Connected "$(target_key $n status)"
    expect_equal "connect state of target $n" 1 "$(target_key $n conn_state)"
    expect_equal "the file of target $n" $n "$(cat /mnt/VV/s$n/file)"
    expect "the volume of target $n is mounted" mounted s$n
done
