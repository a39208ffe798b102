# The packages are installed as an operator does it, beside a storage server with two targets, and each has a volume.
booted
target_start
remember target_add 1 $IQN:t1
remember target_add 2 $IQN:t2
remember lun_add 1 1 64M
remember lun_add 2 1 64M
install_packages
booted
expect_active remvol remvol-tree remvol-events
volume_add t1 1 Photos
volume_add t2 1 Music
works --connect -n $IQN:t1
works --connect -n $IQN:t2
for share in Photos Music; do
    expect "$share can be written" sh -c "echo text of $share >/mnt/VV/$share/file"
    expect_has "what Samba is to offer" "[$share]" "$(testparm -s 2>/dev/null)"
done
sync
