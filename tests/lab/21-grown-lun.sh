# A LUN grows on the target: at the next connect the partition and the file system have grown, the files are intact.
# Growth by less than 100 MB is left alone.
kib() { df -k --output=size "/mnt/VV/$1" | tail -n 1; }
larger() { [ "$(kib Data)" -gt "$1" ]; }

target_start
expect "target" target_add 1 $IQN:t1
expect "LUN" lun_add 1 1 100M
works --init
volume_add t1 1 Data
works --connect -n $IQN:t1
dd if=/dev/urandom of=/mnt/VV/Data/file bs=1M count=20 2>/dev/null
sum=$(sha256sum </mnt/VV/Data/file)
small=$(kib Data)
works --disconnect -n $IQN:t1

expect "grow by 50 MiB" lun_grow 1 1 150M
works --connect -n $IQN:t1
expect_equal "size after little growth" "$small" "$(kib Data)"
works --disconnect -n $IQN:t1

expect "grow by 200 MiB" lun_grow 1 1 350M
works --connect -n $IQN:t1
wait_for 60 larger $((300 * 1024))
expect_equal "the file" "$sum" "$(sha256sum </mnt/VV/Data/file)"
disk=$(disk_of $IQN:t1 1)
expect "the backup table is at the new end" sfdisk -V "/dev/$disk"
works --disconnect -n $IQN:t1

works --connect -n $IQN:t1
expect_equal "the file" "$sum" "$(sha256sum </mnt/VV/Data/file)"
works --disconnect -n $IQN:t1
