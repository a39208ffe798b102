# From a bare LUN to a shared folder and back: partition, file system, mount, and the same file after a reconnect.
target_start
expect "target" target_add 1 $IQN:t1
expect "LUN" lun_add 1 1 256M
works --init
volume_add t1 1 'Büro & Co "1" $HOME'
expect_key id:1/lun/id:1/status Offline
works --connect -n $IQN:t1
folder='/mnt/VV/Büro & Co "1" $HOME'
disk=$(disk_of $IQN:t1 1)
expect_equal "partition table" gpt "$(sfdisk -d "/dev/$disk" | sed -n 's/^label: //p')"
expect_equal "partitions" 1 "$(sfdisk -d "/dev/$disk" | grep -c '^/dev/')"
expect "at most 3 MiB of the disk lie outside it" \
    [ "$(($(cat "/sys/block/$disk/size") - $(cat "/sys/block/$disk/${disk}1/size")))" -le 6144 ]
expect_equal "what is mounted" "/dev/${disk}1 ext4" "$(findmnt -n -o SOURCE,FSTYPE "$folder")"
expect_equal "mode of the folder" 777 "$(stat -c %a "$folder")"
expect_key id:1/lun/id:1/status Running
expect_key id:1/lun/id:1/fs_type ext4
expect_key id:1/lun/id:1/mnt_dev "/dev/${disk}1"
expect_key id:1/lun/id:1/mnt "$folder"
expect_key id:1/lun/id:1/format_progress 100
expect_key id:1/lun/id:1/format_state 0
expect_equal "reserved blocks" 0 "$(dumpe2fs -h "/dev/${disk}1" 2>/dev/null | sed -n 's/^Reserved block count: *//p')"
expect_equal "block size" 4096 "$(dumpe2fs -h "/dev/${disk}1" 2>/dev/null | sed -n 's/^Block size: *//p')"
uuid=$(dumpe2fs -h "/dev/${disk}1" 2>/dev/null | sed -n 's/^Filesystem UUID: *//p')
echo text >"$folder/file"

works --disconnect -n $IQN:t1
expect_equal "folders left" "" "$(ls /mnt/VV)"
expect_equal "sessions" "" "$(sessions)"
expect_key id:1/status Disconnected
expect_key id:1/lun/id:1/status Offline
expect_key id:1/lun/id:1/size 0/0
expect_key id:1/conn_set 0

works --connect -n $IQN:t1
expect_equal "its file" text "$(cat "$folder/file")"
expect_equal "the same file system" "$uuid" \
    "$(dumpe2fs -h "/dev/$(disk_of $IQN:t1 1)1" 2>/dev/null | sed -n 's/^Filesystem UUID: *//p')"
expect_has "the settings file" "<conn_set>1</conn_set>" "$(cat /etc/NAS_CFG/vv.xml)"
expect_equal "the flash's copy" "$(cat /etc/NAS_CFG/vv.xml)" "$(cat /usr/local/config/vv.xml)"

# A volume that was formatted elsewhere, with vfat.
works --disconnect -n $IQN:t1
fat=$(lun_file 1 2)
truncate -s 64M "$fat"
echo 'label: gpt
,' | sfdisk -q "$fat"
expect "format" mkfs.vfat --offset=2048 "$fat" 60000 >/tmp/mkfs.out 2>&1
expect "LUN" lun_add 1 2 64M
volume_add t1 2 Fat
works --connect -n $IQN:t1
expect_equal "what is mounted" "/dev/$(disk_of $IQN:t1 2)1 vfat" "$(findmnt -n -o SOURCE,FSTYPE /mnt/VV/Fat)"
expect_key id:1/lun/id:2/status Running
expect_key id:1/lun/id:2/fs_type vfat
echo text >/mnt/VV/Fat/Grüße.txt
works --disconnect -n $IQN:t1
works --connect -n $IQN:t1
expect_equal "its file" text "$(cat /mnt/VV/Fat/Grüße.txt)"
expect_equal "everybody may write" 777 "$(stat -c %a /mnt/VV/Fat/Grüße.txt)"
