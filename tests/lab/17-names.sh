# Targets whose names begin alike keep their own disks and states.
target_start
for row in '1 t1 65' '2 t10 66' '3 t1-x 67'; do
    # shellcheck disable=SC2086
    set -- $row
    target_add "$1" "$IQN:$2" && lun_add "$1" 1 "$3M" || fail "target $2"
done
works --init
volume_add t1 1 One
volume_add t10 1 Ten
volume_add t1-x 1 Ex

works --connect -n $IQN:t10
works --status
expect_key id:1/status Disconnected
expect_key id:2/status Connected
expect_key id:1/lun/id:1/dev ""
works --connect -n $IQN:t1
expect_key id:1/lun/id:1/dev "$(disk_of $IQN:t1 1)"
expect_key id:2/lun/id:1/dev "$(disk_of $IQN:t10 1)"
expect_equal "sectors" $((65 * 2048)) "$(cat "/sys/block/$(tree_get /iscsi/initiator/id:1/lun/id:1/dev)/size")"
expect_equal "sectors" $((66 * 2048)) "$(cat "/sys/block/$(tree_get /iscsi/initiator/id:2/lun/id:1/dev)/size")"
works --disconnect -n $IQN:t1
works --status
expect_key id:1/status Disconnected
expect "t10 is still mounted" mounted Ten

# A name that goes on with anything but a letter or digit counts as the shorter name's session.
works --connect -n $IQN:t1-x
works --status
expect_key id:3/status Connected
expect_key id:1/status Connected
expect_key id:1/lun/id:1/dev ""
