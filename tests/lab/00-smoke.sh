# timeout: 150
# The lab itself: a real initiator logs in to a real target, by the commands alone.
for module in scsi_transport_iscsi libiscsi libiscsi_tcp iscsi_tcp; do
    expect "load the module" insmod "/usr/local/modules/driver/$module.ko"
done
echo 'InitiatorName=iqn.2026-01.org.example:lab' >/etc/iscsi/initiatorname.iscsi
iscsid
target_start
expect "add a target" target_add 1 $IQN:t1
expect "add a LUN" lun_add 1 1 64M
expect "discover" iscsiadm -m discovery -t sendtargets -p 10.9.0.2
expect "log in" iscsiadm -m node -T $IQN:t1 -p 10.9.0.2:3260 --login
wait_for 10 disk_of $IQN:t1 1
disk=$(disk_of $IQN:t1 1)
expect_equal "size in sectors" $((64 * 1024 * 2)) "$(cat "/sys/block/$disk/size")"
expect "format" mke2fs -q -F -t ext4 "/dev/$disk"
expect "mount" mount "/dev/$disk" /mnt
echo text >/mnt/file
expect "unmount" umount /mnt
expect "mount again" mount "/dev/$disk" /mnt
expect_equal "what the file holds" text "$(cat /mnt/file)"
expect "unmount" umount /mnt
expect "log out" iscsiadm -m node -u
expect_status 21 iscsiadm -m session
