# Runs open-iscsi, mount and Samba by hand in the virtual appliance and keeps what they and the kernel say; lab/record-samples
# starts it.
# needs: samba
# timeout: 300
OUT=/data/output
mkdir -p $OUT

# record NAME COMMAND...: its standard output into NAME.out, its standard error (if any) into NAME.err.
record() {
    name=$1
    shift
    "$@" >$OUT/"$name".out 2>$OUT/"$name".err
    status=$?
    [ -s $OUT/"$name".err ] || rm $OUT/"$name".err
    printf '| %s | %d | `%s` |\n' "$name" $status "$*" >>$OUT/commands
}

listings() {
    record "$1"-session iscsiadm -m session
    record "$1"-session-P3 iscsiadm -m session -P 3
}

target_with_luns() {
    target_add "$1" "$IQN:$2" || fail "target $2"
    lun=1
    while [ $lun -le "$3" ]; do
        lun_add "$1" $lun 64M
        lun=$((lun + 1))
    done
}

node_record() { iscsiadm -m node -T "$IQN:$1" -p "$2" -I "$3" -o new; }
login() { iscsiadm -m node -T "$IQN:$1" -p "$2" -I "$3" --login; }
state_is() { [ "$(cat /sys/class/iscsi_session/session*/state | sort -u)" = "$1" ]; }

for module in scsi_transport_iscsi libiscsi libiscsi_tcp iscsi_tcp; do
    insmod /usr/local/modules/driver/$module.ko
done
cat >/etc/iscsi/iscsid.conf <<END
node.startup = manual
node.session.timeo.replacement_timeout = 30
node.session.initial_login_retry_max = 5
node.conn[0].timeo.login_timeout = 10
node.conn[0].timeo.logout_timeout = 15
node.conn[0].timeo.noop_out_interval = 5
node.conn[0].timeo.noop_out_timeout = 5
node.session.err_timeo.abort_timeout = 15
node.session.err_timeo.lu_reset_timeout = 20
END
echo "InitiatorName=$IQN:nas-box:initiator-1b2c3d" >/etc/iscsi/initiatorname.iscsi
record iscsid-absent iscsiadm -m session
iscsid
for port in 0 1; do
    record iface$port-new iscsiadm -m iface -I iface$port -o new
    record iface$port-update iscsiadm -m iface -I iface$port -o update -n iface.net_ifacename -v egiga$port
done
listings none

target_start
record discovery-no-targets iscsiadm -m discovery -t sendtargets -p 10.9.0.2:3260
target_with_luns 1 t1 12
target_with_luns 2 t10 2
target_with_luns 3 t1-x 1
target_with_luns 4 controller-only 0
target_with_luns 5 secret 1
target_chap 5 user secret-of-12-
record discovery iscsiadm -m discovery -t sendtargets -p 10.9.0.2:3260
record discovery-iface0 iscsiadm -m discovery -t sendtargets -p 10.9.0.2:3260 -I iface0
record discovery-ipv6 iscsiadm -m discovery -t sendtargets -p '[fd00:9:0::2]:3260'
record discovery-ipv6-iface0 iscsiadm -m discovery -t sendtargets -p '[fd00:9:0::2]:3260' -I iface0
record discovery-link-local iscsiadm -m discovery -t sendtargets -p '[fe80::2]:3260' -I iface0
record discovery-refused iscsiadm -m discovery -t sendtargets -p 10.9.0.2:3261
record node-list iscsiadm -m node

# One target after the other, with records made as the tool makes them.
for name in controller-only t1 t10 t1-x secret; do
    record "new-$name" node_record $name 10.9.0.2:3260 default
done
login controller-only 10.9.0.2:3260 default
listings controller-only
record login login t1 10.9.0.2:3260 default
wait_for 20 disk_of $IQN:t1 12
record login-again login t1 10.9.0.2:3260 default
listings two-targets
login t10 10.9.0.2:3260 default
login t1-x 10.9.0.2:3260 default
record login-no-secret login secret 10.9.0.2:3260 default
record login-unknown-target login no-such-record 10.9.0.2:3260 default
listings four-targets
disk=/dev/$(disk_of $IQN:t1-x 1)
echo , | sfdisk -q -X gpt "$disk" || fail "partition"
record mke2fs-ext2 env MKE2FS_SYNC=100 mke2fs -m0 -b4096 "$disk"1
record mke2fs-ext3 env MKE2FS_SYNC=100 mke2fs -j -m0 -b4096 "$disk"1
record mke2fs-ext4 env MKE2FS_SYNC=100 mke2fs -j -m0 -b4096 -T ext4 "$disk"1

# The disk's volume, as the kernel, mount(8) and Samba speak of it. A name that the kernel's tables have to write in another way.
session_values() {
    cd /sys/class/iscsi_session || return
    for value in */targetname */state */recovery_tmo */tpgt; do echo "$value: $(cat "$value")"; done
}
volume="/mnt/VV/Grüße aus \\Köln"
mkdir -p "$volume"
mount -t ext4 "$disk"1 "$volume" || fail "mount"
record kernel-version uname -rm
record kernel-mountinfo cat /proc/self/mountinfo
record kernel-mounts cat /proc/mounts
record kernel-session session_values
record kernel-disk readlink -f "/sys/block/${disk#/dev/}/device"
record util-linux-version mount --version
cd "$volume" || fail "the volume"
record util-linux-umount-in-use umount -f "$volume"
cd / || fail "the root"
mount -o remount,ro "$volume" || fail "remount"
record kernel-mountinfo-read-only cat /proc/self/mountinfo
umount "$volume" || fail "umount"
record util-linux-umount-not-mounted umount -f "$volume"
mount -t ext4 "$disk"1 "$volume" || fail "mount"
record util-linux-mount-again mount -t ext4 "$disk"1 "$volume"
while umount "$volume" 2>/dev/null; do :; done
record util-linux-mount-other-type mount -t xfs "$disk"1 "$volume"
record util-linux-mount-no-disk mount -t ext4 /dev/sdzz1 "$volume"
mkdir -p /etc/samba /var/lib/samba/private /var/cache/samba /var/log/samba /run/samba
printf '[global]\n   load printers = no\n   disable spoolss = yes\n' >/etc/samba/smb.conf
printf 'nobody:x:65534:65534::/:/bin/false\n' >>/etc/passwd
printf 'nogroup:x:65534:\n' >>/etc/group
record samba-version smbd --version
record samba-reload-without-server smbcontrol all reload-config
smbd -D || fail "smbd"
wait_for 30 smbcontrol smbd ping
record samba-reload smbcontrol all reload-config
record samba-close-share smbcontrol smbd close-share Photos
pkill smbd

record logout iscsiadm -m node -T $IQN:t1-x --logout
record logout-again iscsiadm -m node -T $IQN:t1-x --logout
record delete-in-use iscsiadm -m node -I default -T $IQN:t10 -p 10.9.0.2:3260 -o delete

# Two interfaces, two portals, and IPv6.
for way in 'iface0 10.9.0.2:3260 iface0' 'iface1 10.9.1.2:3260 iface1' 'iface0 [fd00:9:0::2]:3260 ipv6' \
    'iface0 [fe80::2]:3260 link-local'; do
    # shellcheck disable=SC2086
    set -- $way
    node_record t10 "$2" "$1"
    record "login-$3" login t10 "$2" "$1"
done
listings two-interfaces

# The cable is cut, first while the kernel still waits for the session, then after it gave up.
iscsiadm -m node -T $IQN:t10 --logout >/dev/null
iscsiadm -m node -T $IQN:controller-only --logout >/dev/null
cable_cut 0
wait_for 60 state_is FAILED
listings cable-cut
wait_for 90 state_is FREE
listings cable-cut-given-up
cable_plug 0
wait_for 60 state_is LOGGED_IN
listings cable-back
target_kill
wait_for 60 state_is FAILED
listings target-killed
record discovery-dead-target iscsiadm -m discovery -t sendtargets -p 10.9.0.2:3260
record iscsiadm-version iscsiadm --version
