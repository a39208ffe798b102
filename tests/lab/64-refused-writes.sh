# timeout: 120
# A file system that refuses every write, which the mount tables of this kernel do not show, and one whose disk is gone: vvstat
# says so, people are told, and the command that vvstat shows heals it.
T=$IQN:t1
takes_writes() { mounted a && dd if=/dev/zero of=/mnt/VV/a/probe bs=4k count=1 conv=fsync 2>/dev/null; }
as_vvstat_says() {
    local command
    command=$(vvstat | grep '^    vv ') || fail "vvstat says nothing to type"
    expect "what vvstat says" eval "$command"
}
last_event() { remvol-notify 2>&1 | tail -n 1; }

target_start
target_add 1 $T
lun_add 1 1 64M
works --init
volume_add t1 1 a
works --connect -n $T
expect "it is well" vvstat
remvol-notify

say "the file system meets an error"
mount -o remount,errors=remount-ro /mnt/VV/a
echo "an error" >"/sys/fs/ext4/$(lun_key 1 1 dev)1/trigger_fs_error"
takes_writes && fail "it takes writes"
expect_has "the mount" "/mnt/VV/a ext4 rw," "$(cat /proc/mounts)"
report=$(vvstat) && fail "vvstat calls it healthy"
expect_has "vvstat" "a: became read-only" "$report"
expect_has "what people are told" "Volume a: became read-only" "$(last_event)"
as_vvstat_says
expect "it takes writes" takes_writes
expect "it is well" vvstat

say "its disk is taken away, the session stays"
echo 1 >"/sys/block/$(lun_key 1 1 dev)/device/delete"
report=$(vvstat) && fail "vvstat calls it healthy"
expect_has "vvstat" "a: its disk is gone" "$report"
as_vvstat_says
expect "it takes writes" takes_writes
expect "it is well" vvstat
