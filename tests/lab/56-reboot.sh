# timeout: 600
# The appliance is switched off, once in good order and once not: every volume comes back under its name with its files.
T=iqn.2026-01.org.example:t
LUN_DIR=/data/luns
target_start
for n in 1 2 3; do
    target_add $n $T$n
    lun_add $n 1 64M
done
lun_add 1 2 64M
works --init

all_back() {
    for share in a "b b" 'c$d'; do
        expect_equal "the file in $share" "$share" "$(cat "/mnt/VV/$share/file")"
        echo "phase $PHASE" >"/mnt/VV/$share/phase" || fail "$share cannot be written"
    done
    expect_equal "target 1" Connected "$(target_key 1 status)"
    expect_equal "target 2" Connected "$(target_key 2 status)"
    expect_equal "target 3 was not to be connected" Disconnected "$(target_key 3 status)"
    expect_not "and is not" logged_in ${T}3
    expect_equal "volumes" 3 "$(ls /mnt/VV | wc -l)"
    expect_equal "targets" 3 "$(tree_get /iscsi/initiator/count)"
}

case $PHASE in
1)
    works --add -n ${T}1 -l 1 -i 10.9.0.2 -p 3260 -s a
    works --add -n ${T}1 -l 2 -i 10.9.0.2 -p 3260 -s "b b"
    works --add -n ${T}2 -l 1 -i fd00:9:1::2 -p 3260 -s 'c$d'
    works --add -n ${T}3 -l 1 -i 10.9.0.2 -p 3260 -s later
    for n in 1 2; do works --connect -n $T$n; done
    for share in a "b b" 'c$d'; do echo "$share" >"/mnt/VV/$share/file"; done
    all_back
    remvol --system_off >/tmp/remvol.out 2>&1
    expect_equal "nothing is mounted" "" "$(ls /mnt/VV)"
    power_cycle
    ;;
2)
    all_back
    # The initiator's records are written without a sync: this is what the power may leave of them.
    truncate -s 0 $(find /etc/iscsi /var/lib/iscsi -path "*/nodes/${T}1/*" -type f -o -path '*/ifaces/iface0')
    sync
    power_pull
    ;;
3) all_back ;;
esac
