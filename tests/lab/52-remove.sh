# timeout: 600
# Targets are disconnected, volumes and targets deleted; what is not meant stays.
T=iqn.2026-01.org.example:t
target_start
for n in 1 2; do target_add $n $T$n; done
for lun in 1 2 3; do lun_add 1 $lun 64M; done
lun_add 2 1 64M
works --init
for lun in 1 2 3; do works --add -n ${T}1 -l $lun -i 10.9.0.2 -p 3260 -s s$lun; done
works --add -n ${T}2 -l 1 -i 10.9.1.2 -p 3260 -s other
for n in 1 2; do works --connect -n $T$n; done
for share in s1 s2 s3 other; do
    expect "$share is mounted" mounted $share
    echo $share >/mnt/VV/$share/file
done

# One target; somebody works in its folder.
sleep 1000 <>/mnt/VV/s1/file &
works --disconnect -n ${T}1
for share in s1 s2 s3; do
    expect_not "$share is unmounted" mounted $share
    expect_not "the folder of $share is gone" test -e /mnt/VV/$share
done
expect_not "logged out" logged_in ${T}1
expect_equal "target" Disconnected "$(target_key 1 status)"
expect_equal "wish" 0 "$(target_key 1 conn_set)"
expect_equal "the other target goes on" other "$(cat /mnt/VV/other/file)"
works --connect -n ${T}1
for share in s1 s2 s3; do expect_equal "file" $share "$(cat /mnt/VV/$share/file)"; done

# All of them; the wishes stay.
works --disconnect
for share in s1 s2 s3 other; do expect_not "$share is unmounted" mounted $share; done
expect_status 21 iscsiadm -m session
expect_equal "wish" 1 "$(target_key 1 conn_set)"
refuses --disconnect
for n in 1 2; do works --connect -n $T$n; done

# The middle one of three.
works --del_lun -n ${T}1 -l 2
expect_not "its volume is unmounted" mounted s2
expect_equal "the third moved down" s3 "$(lun_key 1 2 share)"
expect_equal "LUNs of the target" 2 "$(target_key 1 lun/count)"
expect_equal "LUNs in all" 3 "$(tree_get /iscsi/initiator/total_lun_count)"
for share in s1 s3 other; do expect_equal "file" $share "$(cat /mnt/VV/$share/file)"; done
works --add -n ${T}1 -l 2 -i 10.9.0.2 -p 3260 -s again
expect_equal "its data was not deleted" s2 "$(cat /mnt/VV/again/file)"

# A target, then the last LUN of the other one.
works --del -n ${T}1
for share in s1 again s3; do expect_not "$share is unmounted" mounted $share; done
expect_not "logged out" logged_in ${T}1
expect_lacks "its node record" ${T}1 "$(iscsiadm -m node)"
expect_equal "the second target moved up" ${T}2 "$(target_key 1 target)"
expect_equal "its file" other "$(cat /mnt/VV/other/file)"
works --del_lun -n ${T}2 -l 1
expect_equal "targets" 0 "$(tree_get /iscsi/initiator/count)"
expect_status 21 iscsiadm -m session
expect_status 21 iscsiadm -m node
expect_equal "nothing is left below /mnt/VV" "" "$(ls /mnt/VV)"
refuses --del -n ${T}1
refuses --del_lun -n ${T}2 -l 1
