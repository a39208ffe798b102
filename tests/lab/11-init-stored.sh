# --init with stored targets: one is off, one refuses the secret, one is good. The good one's file is back.
LUN_DIR=/data/luns
serve() { # SECRET-OF-THE-SECOND
    target_start
    for number in 1 2 3; do
        target_add $number "$IQN:t$number" && lun_add $number 1 64M || fail "target $number"
    done
    target_chap 2 user "$1"
}

case $PHASE in
1)
    serve secret-of-12-
    works --init
    volume_add t1 1 Off
    volume_add t2 1 Secret 10.9.0.2 -c 1 -U user -P secret-of-12-
    volume_add t3 1 Good
    works --connect -n $IQN:t2
    works --connect -n $IQN:t3
    echo text >/mnt/VV/Good/file
    expect_key count 3
    power_cycle
    ;;
2)
    serve another-secret
    works --init
    expect_equal "sessions" "$IQN:t3" "$(sessions)"
    expect_key id:1/status Disconnected
    expect_key id:1/conn_state 0
    expect_key id:1/conn_set ""
    expect_key id:2/status "Connect Error"
    expect_key id:2/conn_state 4
    expect_key id:2/conn_set 1
    expect_key id:3/status Connected
    expect_key id:3/conn_state 1
    expect_key id:3/conn_set 1
    expect_key id:3/lun/id:1/status Running
    expect_key id:3/lun/id:1/volume_state 0
    expect "the good volume is mounted" mounted Good
    expect_equal "its file" text "$(cat /mnt/VV/Good/file)"
    expect_not "the refused volume is not mounted" mounted Secret
    ;;
esac
