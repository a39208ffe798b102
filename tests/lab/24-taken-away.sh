# timeout: 400
# What is open keeps its name, and a run that takes everything away pulls no disk from under a volume that another is
# just mounting.
T=iqn.2026-01.org.example:t
target_start

for n in 1 2; do
    target_add $n $T$n
    lun_add $n 1 64M
done
works --init
volume_add t1 1 a
volume_add t2 1 b
works --connect -n ${T}1
echo a >/mnt/VV/a/file

# Without its session, too: so a mke2fs that has begun writes to no other disk.
name=$(disk_of ${T}1 1)
exec 3<"/dev/$name"
works --disconnect -n ${T}1
works --connect -n ${T}2
expect_not "the name is another disk's" test "$name" = "$(disk_of ${T}2 1)"
exec 3<&-
works --disconnect -n ${T}2

for pause in 0.3 0.8 1.3 1.8; do
    remvol --connect -n ${T}1 >/tmp/connect.out 2>&1 &
    connect=$!
    sleep $pause
    remvol --disconnect >/tmp/disconnect.out 2>&1
    wait $connect
    if mounted a; then
        disk=$(sed -n 's|^/dev/\([a-z]*\)1 /mnt/VV/a .*|\1|p' /proc/mounts)
        expect "its disk is there, $pause s" test -e "/sys/block/$disk"
    else
        expect_not "nothing is left of it, $pause s" test -e /mnt/VV/a
    fi
    remvol --disconnect >/tmp/disconnect.out 2>&1
    expect_not "everything is closed, $pause s" logged_in ${T}1
done
works --connect -n ${T}1
expect_equal "the file" a "$(cat /mnt/VV/a/file)"
