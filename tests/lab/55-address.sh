# A target moves to another portal.
T=iqn.2026-01.org.example:t1
target_start
target_add 1 $T
lun_add 1 1 64M
works --init
works --add -n $T -l 1 -i 10.9.0.2 -p 3260 -s a
works --connect -n $T
echo text >/mnt/VV/a/file

works --modify_address -n $T -i 10.9.1.2 -p 3260
expect_has "why not" "$T is connecting, disconnect it before modifying its address." "$(cat /tmp/remvol.out)"
expect_equal "address" 10.9.0.2 "$(target_key 1 ip)"
expect "it goes on" mounted a

works --disconnect -n $T
# A portal that answers but does not offer the target.
target_run tgtd -C 1 --iscsi portal=10.9.0.2:3270
another_portal() { tgtadm -C 1 --lld iscsi --mode sys --op show; }
wait_for 10 another_portal
works --modify_address -n $T -i 10.9.0.2 -p 3270
expect_has "why not" "Can not find $T at IP: 10.9.0.2 Port: 3270" "$(cat /tmp/remvol.out)"
expect_equal "port" 3260 "$(target_key 1 port)"
works --modify_address -n $T -i 10.9.0.2 -p 3271
expect_has "why not" "Can not find $T at IP: 10.9.0.2 Port: 3271" "$(cat /tmp/remvol.out)"

works --modify_address -n $T -i 10.9.1.2 -p 3260
expect_equal "address" 10.9.1.2 "$(target_key 1 ip)"
works --connect -n $T
expect_equal "the file" text "$(cat /mnt/VV/a/file)"
expect_has "the session" "10.9.1.2:3260" "$(iscsiadm -m session)"

refuses --modify_address -n $T -i 10.9.1.2 -p 0
refuses --modify_address -n iqn.2026-01.org.example:nobody -i 10.9.1.2 -p 3260
expect_equal "address" 10.9.1.2 "$(target_key 1 ip)"
