# Volumes are added to targets that are connected and to targets that are not; what cannot be added changes nothing.
T=iqn.2026-01.org.example:t
portal="-i 10.9.0.2 -p 3260"
unchanged() {
    before=$(settings)
    refuses "$@"
    expect_equal "nothing changes after $*" "$before" "$(settings)"
}

target_start
target_add 1 ${T}1
lun_add 1 1 64M
lun_add 1 2 64M
works --init

works --add -n ${T}1 -l 1 $portal -s a
expect_not "the target is not logged in" logged_in ${T}1
expect_equal "target" Disconnected "$(target_key 1 status)"
expect_equal "volume" Offline "$(lun_key 1 1 status)"
expect_has "the node record" "10.9.0.2:3260,4294967295 ${T}1" "$(iscsiadm -m node)"

works --connect -n ${T}1
expect "the volume is mounted" mounted a
expect_equal "target" Connected "$(target_key 1 status)"
expect_equal "volume" Running "$(lun_key 1 1 status)"
expect_equal "everybody may write" 777 "$(stat -c %a /mnt/VV/a)"
expect "one partition" test -b "/dev/$(disk_of ${T}1 1)1"
expect_not "not two" test -e "/dev/$(disk_of ${T}1 1)2"
echo text >/mnt/VV/a/file

works --add -n ${T}1 -l 2 $portal -s b
expect "the second volume is mounted at once" mounted b
expect_equal "volume" Running "$(lun_key 1 2 status)"
expect_equal "the first one's file" text "$(cat /mnt/VV/a/file)"
expect_equal "one session" 1 "$(iscsiadm -m session | wc -l)"

unchanged --add -n ${T}1 -l 2 $portal -s b
unchanged --add -n ${T}1 -l 3 $portal -s a
expect_has "why" "share name a has benn used" "$(cat /tmp/remvol.out)"
expect_status 1 remvol --check_share_name -s a
expect_status 0 remvol --check_share_name -s A

for n in 2 3 4 5 6 7; do
    works --add -n $T$n -l 1 $portal -s "share $n"
done
expect_equal "LUNs in all" 8 "$(tree_get /iscsi/initiator/total_lun_count)"
unchanged --add -n ${T}1 -l 3 $portal -s more
expect_has "why" "can not add target ${T}1 with lun 3" "$(cat /tmp/remvol.out)"

works --del -n ${T}7
works --add -n ${T}8 -l 1 $portal -s "share 8"
works --del_lun -n ${T}1 -l 2
works --add -n ${T}9 -l 1 $portal -s "share 9"
expect_equal "targets" 8 "$(tree_get /iscsi/initiator/count)"
unchanged --add -n ${T}10 -l 1 $portal -s "share 10"
expect "the first volume has been there all the time" test -e /mnt/VV/a/file
