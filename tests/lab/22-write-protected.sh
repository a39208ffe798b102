# A write-protected LUN with a file system is a read-only volume; one without is not formatted and says so.
target_start
expect "target" target_add 1 $IQN:t1
expect "LUN" lun_add 1 1 64M
works --init
volume_add t1 1 Data
works --connect -n $IQN:t1
echo text >/mnt/VV/Data/file
works --disconnect -n $IQN:t1
expect "delete the LUN on the target" lun_delete 1 1
expect "bring it back write-protected" lun_add 1 1 64M readonly=1
expect "another, bare and write-protected" lun_add 1 2 64M readonly=1
volume_add t1 2 Bare

works --connect -n $IQN:t1
expect "mounted" mounted Data
expect_equal "its file" text "$(cat /mnt/VV/Data/file)"
expect_key id:1/lun/id:1/vol_access_right 0
expect_key id:1/lun/id:1/status "Running ( Read Only )"
expect_key id:1/lun/id:1/volume_state 0
expect_not "the bare one is not mounted" mounted Bare
expect_has "what the share service says" 'volume "Bare" is not shared: it could not be made or mounted' "$(winshare_reload 2>&1)"
expect_key id:1/lun/id:2/volume_state 3
expect_key id:1/lun/id:2/status "Create Volume Failed"
expect_equal "bytes that are not zero on the bare one" 0 "$(tr -d '\0' <"$(lun_file 1 2)" | wc -c)"
works --disconnect -n $IQN:t1
