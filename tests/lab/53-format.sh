# A volume that somebody uses is formatted; meanwhile its status shows the progress.
T=iqn.2026-01.org.example:t1
LUN_DIR=/data/luns
target_start
target_add 1 $T
lun_add 1 1 64M
lun_add 1 2 1G
works --init
for lun in 1 2; do works --add -n $T -l $lun -i 10.9.0.2 -p 3260 -s s$lun; done
works --connect -n $T
for share in s1 s2; do echo $share >/mnt/VV/$share/file; done

sleep 1000 <>/mnt/VV/s1/file &
user=$!
(cd /mnt/VV/s1 && exec sleep 1000) &
guest=$!
works --format -n $T -l 1
expect_not "the file's user was killed" kill -0 $user
expect_not "the folder's guest was killed" kill -0 $guest
expect "the volume is mounted again" mounted s1
expect_not "it is empty" test -e /mnt/VV/s1/file
echo new >/mnt/VV/s1/file
expect_equal "the other volume goes on" s2 "$(cat /mnt/VV/s2/file)"
expect_equal "volume" Running "$(lun_key 1 1 status)"

# Have mke2fs write the inode tables itself: that takes a while.
sed -i 's/^\[defaults\]/&\n\tlazy_itable_init = 0/' /etc/mke2fs.conf
is_formatting() { [ "$(lun_key 1 2 format_state)" = 1 ]; }
remvol --format -n $T -l 2 >/tmp/format.out 2>&1 &
format=$!
wait_for 30 is_formatting
works --status
text=$(lun_key 1 2 status)
case $text in "Formatting "[0-9]*%) ;; *) fail "the status while a format runs is '$text'" ;; esac
expect_equal "the other volume" Running "$(lun_key 1 1 status)"
expect "the format succeeds" wait $format
expect_equal "progress" 100 "$(lun_key 1 2 format_progress)"
expect_equal "volume" Running "$(lun_key 1 2 status)"
expect_not "it is empty" test -e /mnt/VV/s2/file
expect_equal "its partition is full of it" ext4 "$(lun_key 1 2 fs_type)"

# Without its disk a volume is not formatted.
works --disconnect -n $T
refuses --format -n $T -l 1
works --connect -n $T
expect_equal "the file" new "$(cat /mnt/VV/s1/file)"
