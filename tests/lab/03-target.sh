# The lab itself: what a target can do to its initiators.
T=$IQN:t1
login() { iscsiadm -m node -T $T -p 10.9.0.2:3260 --login; }

for module in scsi_transport_iscsi libiscsi libiscsi_tcp iscsi_tcp; do
    expect "load the module" insmod "/usr/local/modules/driver/$module.ko"
done
cat >/etc/iscsi/iscsid.conf <<END
node.startup = manual
node.session.timeo.replacement_timeout = 5
node.session.initial_login_retry_max = 2
node.conn[0].timeo.login_timeout = 5
node.conn[0].timeo.noop_out_interval = 1
node.conn[0].timeo.noop_out_timeout = 2
END
echo 'InitiatorName=iqn.2026-01.org.example:lab' >/etc/iscsi/initiatorname.iscsi
iscsid
target_start
expect "add a target" target_add 1 $T
expect "add a LUN" lun_add 1 1 64M
expect "add a write-protected LUN" lun_add 1 2 64M readonly=1
expect "ask for a secret" target_chap 1 user secret-of-12-
expect "make a record" iscsiadm -m node -T $T -p 10.9.0.2:3260 -o new
expect_status 24 login
expect "name the secret" iscsiadm -m node -T $T -o update -n node.session.auth.authmethod -v CHAP \
    -n node.session.auth.username -v user -n node.session.auth.password -v secret-of-12-
expect "log in" login
wait_for 10 disk_of $IQN:t1 2
wait_for 10 disk_of $IQN:t1 1
disk1=$(disk_of $IQN:t1 1)
expect_equal "LUN 1 is writable" 0 "$(cat "/sys/block/$disk1/ro")"
expect_equal "LUN 2 is write-protected" 1 "$(cat "/sys/block/$(disk_of $IQN:t1 2)/ro")"

# A LUN grows; a new login sees it.
expect "log out" iscsiadm -m node -u
expect "grow" lun_grow 1 1 96M
expect "log in" login
wait_for 10 disk_of $IQN:t1 1
expect_equal "sectors" $((96 * 2048)) "$(cat "/sys/block/$(disk_of $IQN:t1 1)/size")"

# The cable is cut and put back: the session heals. The target dies: it does not, until the target is back.
expect "cut the cable" cable_cut 0
wait_for 30 session_is $IQN:t1 FREE
expect "put the cable back" cable_plug 0
wait_for 60 session_is $IQN:t1 LOGGED_IN
expect "kill the target" target_kill
wait_for 30 session_is $IQN:t1 FREE
target_start
expect "add the target again" target_add 1 $T
expect "add its LUN again" lun_add 1 1 96M
expect "ask for the secret again" target_chap 1 user secret-of-12-
wait_for 60 session_is $IQN:t1 LOGGED_IN
wait_for 10 dd if="/dev/$disk1" of=/dev/null bs=4k count=1
