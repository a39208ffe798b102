# timeout: 900
# after: installed
# The package is installed again while clients are busy on its volumes, which stay; then the machine is shut down under them.
as_client() { target_run timeout 30 smbclient "//10.9.1.1/$1" -U maria%secret -m SMB3 -c "$2"; }

busy_client() {
    number=0
    while :; do
        number=$((number + 1))
        as_client "$1" "put /tmp/sent file-$number" >/dev/null 2>&1 && echo $number >>/data/written-$1
        sleep 15
    done
}

# A local program that never closes its file.
busy_program() { sh -c "while :; do date; sleep 1; done >/mnt/VV/$1/busy 2>/dev/null" & }

main_pids() { for unit in remvol-tree remvol-general-tree; do systemctl show -P MainPID $unit; done | xargs; }
mounts() { for share in Photos Music; do stat -c %d:%i /mnt/VV/$share/file; done | xargs; }

if [ "$PHASE" = 2 ]; then
    booted
    went_down_in_order
    expect_lacks "the end before" Failed "$(journalctl -b -1 -o cat --no-pager _PID=1)"
    expect_lacks "the kernel's words before" "I/O error" "$(journalctl -b -1 -k -o cat --no-pager)"
    expect_lacks "the kernel's words now" "recovery complete" "$(journalctl -b -k -o cat --no-pager)"
    for share in Photos Music; do
        expect "$share is mounted" mounted $share
        expect_equal "the file of $share" "text of $share" "$(cat /mnt/VV/$share/file)"
        expect "the last file that a client has put there" cmp /data/sent "/mnt/VV/$share/file-$(tail -n 1 /data/written-$share)"
    done
    exit 0
fi

useradd --no-create-home --shell /usr/sbin/nologin maria
printf 'secret\nsecret\n' | smbpasswd -s -a maria >/dev/null
head -c 1000 /dev/urandom >/tmp/sent
cp /tmp/sent /data/sent
for share in Photos Music; do
    busy_client $share &
    busy_program $share
    wait_for 60 test -s /data/written-$share
done

before="$(main_pids) $(mounts) $(initiators)"
apt_quiet install --reinstall /lab/packages/*.deb || fail "the package is not installed again"
expect_equal "trees, mounts and the initiator" "$before" "$(main_pids) $(mounts) $(initiators)"
expect_active remvol remvol-tree remvol-general-tree remvol-events remvol-keeper
wait_for 30 vvstat
for share in Photos Music; do
    written=$(wc -l </data/written-$share)
    goes_on() { [ "$(wc -l </data/written-$share)" -gt "$written" ]; }
    wait_for 60 goes_on
done
watch_the_shutdown
reboot_machine
