# timeout: 900
# Somebody else has a session of his own before the package is installed: a record that he made, a disk of it mounted below /srv, and a
# program that holds a file open there. He is named at the installation, and whatever becomes of the volumes, all of this stays.
HIS=$IQN:his
PORTAL=10.9.0.2:3260

his_session() {
    for session in /sys/class/iscsi_session/session*; do
        [ "$(cat "$session/targetname")" != $HIS ] || echo "${session##*/}, given up after $(cat "$session/recovery_tmo") s"
    done
}

his_record() { iscsiadm -m node -T $HIS -p $PORTAL -I default; }

# What must stay as it is.
his() {
    his_session
    his_record
    stat -c 'mount %d, file %i, %s bytes' /srv/his/file
    md5sum </srv/his/file
}

# he_stays WHEN: he does, and can write.
he_stays() {
    say "$1"
    expect_equal "what is his, $1" "$before" "$(his)"
    expect "his program runs, $1" [ -e "/proc/$program/exe" ]
    expect "his disk takes files, $1" sh -c "echo '$1' >>/srv/his/list && sync /srv/his/list"
    echo "$1" >>/tmp/list
}

without_word() { "$@" >/tmp/printed 2>&1; }
both_are() { session_is $IQN:t1 "$1" && session_is $HIS "$1"; }

booted
target_start
remember target_add 1 $IQN:t1
remember lun_add 1 1 64M
remember target_add 2 $HIS
remember lun_add 2 1 64M
iscsiadm -m node -o new -T $HIS -p $PORTAL >/dev/null
iscsiadm -m node -o update -T $HIS -p $PORTAL -n node.session.timeo.replacement_timeout -v 77
expect "he logs in" iscsiadm -m node -T $HIS -p $PORTAL --login
his_disk() { disk_of $HIS 1; }
wait_for 20 his_disk
mke2fs -q -t ext4 "/dev/$(his_disk)"
mkdir -p /srv/his
mount "/dev/$(his_disk)" /srv/his
head -c 1000000 /dev/urandom >/srv/his/file
sync
sleep 100000 <>/srv/his/held &
program=$!
before=$(his)

install_packages
for line in "  connected: $HIS" "  recorded: $HIS at $PORTAL"; do
    expect "the installation says '$line'" grep -qxF "$line" /tmp/apt.log
done
booted
he_stays "after the installation"

volume_add t1 1 Photos
works --connect -n $IQN:t1
expect "the volume is mounted" mounted Photos
he_stays "after a connect"

provokes_loss
cable_cut 0
wait_for 60 both_are FAILED
cable_plug 0
wait_for 60 both_are LOGGED_IN
wait_for 60 vvstat
expect_has "the listener" "$IQN:t1: the session is back" "$(messages remvol-events)"
he_stays "after a cut of the cable"

works --disconnect -n $IQN:t1
he_stays "after a disconnection"
works --connect -n $IQN:t1
works --disconnect
expect_not "the volume's session is there" logged_in $IQN:t1
he_stays "after a disconnection of everything"
works --del -n $IQN:t1
he_stays "after a deletion"

volume_add t1 1 Photos
works --connect -n $IQN:t1
systemctl restart remvol
wait_for 60 mounted Photos
he_stays "after a restart of the volumes"
# The second one cannot unload the modules, which he uses. What has to heal his session is started again each time.
ends_all() {
    expect_not "the volume's session is there, after $1" logged_in $IQN:t1
    wait_for 60 pgrep -x iscsid
    he_stays "after $1"
    systemctl restart remvol
    wait_for 60 mounted Photos
}
expect_status 0 without_word remvol --system_off
ends_all --system_off
expect_status 255 without_word remvol --deinit
ends_all --deinit
systemctl stop remvol
expect_not "the volume is mounted" mounted Photos
he_stays "after a stop of the volumes"
systemctl start remvol
wait_for 60 mounted Photos

apt_quiet remove remvol || fail "the package is not removed"
expect_not "the volume's session is there" logged_in $IQN:t1
he_stays "after the removal"
apt_quiet purge remvol libremvol1 || fail "the package is not purged"
he_stays "after the purge"
# The initiator's daemon has its own words for every session.
expect_equal "what ours say of his target" "" "$(journalctl -b --no-pager -u 'remvol*' | grep -v 'iscsid\[' | grep -F $HIS)"

# What is his works as before, with the initiator that was given back.
cable_cut 0
wait_for 60 session_is $HIS FAILED
cable_plug 0
wait_for 60 session_is $HIS LOGGED_IN
he_stays "after a cut without the package"
kill $program
expect "he unmounts" umount /srv/his
expect "his file system has no faults" e2fsck -fn "/dev/$(his_disk)"
expect "he logs out" iscsiadm -m node -T $HIS -p $PORTAL --logout
expect "he logs in again" iscsiadm -m node -T $HIS -p $PORTAL --login
wait_for 20 his_disk
mount "/dev/$(his_disk)" /srv/his
expect_has "what he had before" "$(md5sum </srv/his/file)" "$before"
expect "all that he wrote is there" cmp /tmp/list /srv/his/list
