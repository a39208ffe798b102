# timeout: 400
# A target is off when the appliance starts, and another one's disk gets the name that its disk had: nothing is done to
# that disk in its name. Two runs that bring up the same empty disk do not undo each other's work.
T=iqn.2026-01.org.example:t
LUN_DIR=/data/luns
target_start

stored_disk() { echo "/dev/$(lun_key 1 1 dev)"; }

case $PHASE in
1)
    for n in 1 2; do
        target_add $n $T$n
        lun_add $n 1 64M
    done
    works --init
    volume_add t1 1 a
    volume_add t2 1 b
    for n in 1 2; do works --connect -n $T$n; done
    for share in a b; do echo $share >/mnt/VV/$share/file; done
    remvol --system_off >/tmp/remvol.out 2>&1
    power_cycle
    ;;
2)
    target_add 2 ${T}2
    lun_add 2 1 64M
    works --init
    expect_not "the first target is off" logged_in ${T}1
    expect_equal "its disk's name is the other's by now" "$(stored_disk)" "/dev/$(disk_of ${T}2 1)"
    expect_equal "its volume's node as well" "$(lun_key 1 1 mnt_dev)" "$(lun_key 2 1 mnt_dev)"
    sleep 1000 <>/mnt/VV/b/file &
    user=$!

    before=$(settings)
    refuses --format -n ${T}1 -l 1
    expect_has "it says why" "is not the disk of LUN 1 of ${T}1, it is left alone" "$(cat /tmp/remvol.out)"
    expect_equal "nothing is changed by the refusal" "$before" "$(settings)"
    works --disconnect -n ${T}1
    expect "the other volume's user lives" kill -0 $user
    expect_equal "its file" b "$(cat /mnt/VV/b/file)"

    # The name of a disk of the machine itself: the one that /data is on.
    data=$(sed -n 's|^/dev/\([a-z]*\)[0-9]* /data .*|\1|p' /proc/mounts)
    expect "the machine's own disk" test -b "/dev/$data"
    tree_set /iscsi/initiator/id:2/lun/id:1/dev "$data"
    refuses --format -n ${T}2 -l 1
    expect_has "it says why" "$data is not the disk of LUN 1 of ${T}2" "$(cat /tmp/remvol.out)"
    expect "/data is there" test -e "$(lun_file 2 1)"
    expect "the volume is still mounted" mounted b

    works --connect -n ${T}2
    expect_equal "the disk is found by its session again" "$(disk_of ${T}2 1)" "$(lun_key 2 1 dev)"
    kill $user
    works --format -n ${T}2 -l 1
    expect_not "its own format works" test -e /mnt/VV/b/file

    # An empty disk, and a mke2fs that writes the inode tables itself: that takes a while.
    sed -i 's/^\[defaults\]/&\n\tlazy_itable_init = 0/' /etc/mke2fs.conf
    target_add 3 ${T}3
    lun_add 3 1 1G
    volume_add t3 1 c
    remvol --connect -n ${T}3 >/tmp/first.out 2>&1 &
    first=$!
    sleep 2
    works --connect -n ${T}3
    expect "the first run succeeds as well" wait $first
    expect "the volume is mounted" mounted c
    slot=$(ktreec -S "$TREE_SOCKET" -t | sed -n "s|^/iscsi/initiator/id:\([0-9]\)/target=${T}3\$|\1|p")
    expect_equal "its state" Running "$(lun_key "$slot" 1 status)"
    echo c >/mnt/VV/c/file
    works --disconnect -n ${T}3
    works --connect -n ${T}3
    expect_equal "what was written after both" c "$(cat /mnt/VV/c/file)"
    ;;
esac
