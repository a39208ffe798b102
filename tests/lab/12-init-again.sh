# --init on a running appliance: volumes stay, nothing runs twice, a stored prefix renames the initiator.
target_start
expect "target" target_add 1 $IQN:t1
expect "LUN" lun_add 1 1 64M
works --init
volume_add t1 1 Data
works --connect -n $IQN:t1
exec 7>/mnt/VV/Data/open
echo before >&7
iscsid=$(initiators)
ktree=$(pgrep -x ktree)
expect "prefix" tree_set /iscsi/initiator/prefix iqn.2000-01.org.example:

works --init
expect_equal "settings daemon" "$ktree" "$(pgrep -x ktree)"
wait_for 10 one_initiator
expect_not "the initiator's daemon is a new one" [ "$iscsid" = "$(initiators)" ]
expect_key iqn iqn.2000-01.org.example:nas-box:initiator-1b2c3d
expect_equal "sessions" "$IQN:t1" "$(sessions)"
expect_key id:1/status Connected
expect_key id:1/conn_state 1
expect_key id:1/conn_set 1
expect_key id:1/lun/id:1/status Running
expect_key id:1/lun/id:1/volume_state 0
expect_key id:1/lun/id:1/dev "$(disk_of $IQN:t1 1)"
expect "the volume is mounted" mounted Data
expect_equal "mounts of the disk" 1 "$(grep -c ' /mnt/VV/Data ' /proc/self/mounts)"
echo after >&7
exec 7>&-
expect_equal "a file that was open all the time" "before
after" "$(cat /mnt/VV/Data/open)"
