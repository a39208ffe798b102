# timeout: 500
# A target with eight volumes whose LUN numbers do not sort as texts: every one gets its own disk. A ninth is refused.
LUNS='1 2 3 4 10 11 12 20'
target_start
expect "target" target_add 1 $IQN:t1
for lun in $LUNS 21; do
    expect "LUN $lun" lun_add 1 "$lun" "$((64 + lun))M"
done
works --init
for lun in $LUNS; do
    volume_add t1 "$lun" "Share$lun"
done
expect_key id:1/lun/count 8
before=$(settings)
refuses --add -n $IQN:t1 -l 21 -i 10.9.0.2 -p 3260 -s Ninth
expect_equal "the tree after a ninth LUN" "$before" "$(settings)"

works --connect -n $IQN:t1
slot=0
for lun in $LUNS; do
    slot=$((slot + 1))
    expect_key "id:1/lun/id:$slot/lun" "$lun"
    expect_key "id:1/lun/id:$slot/status" Running
    expect_key "id:1/lun/id:$slot/dev" "$(disk_of $IQN:t1 "$lun")"
    disk=$(disk_of $IQN:t1 "$lun")
    expect_equal "sectors of LUN $lun" $(((64 + lun) * 2048)) "$(cat "/sys/block/$disk/size")"
    expect_equal "what is mounted for LUN $lun" "/dev/${disk}1" "$(findmnt -n -o SOURCE "/mnt/VV/Share$lun")"
done
works --disconnect -n $IQN:t1
expect_equal "folders left" "" "$(ls /mnt/VV)"
