# timeout: 150
# --init on a bare appliance: daemon, modules, the initiator's files and interface records.
rm -rf /etc/iscsi/* /var/lib/iscsi/*
works --init

expect_equal "settings of the initiator's daemon" "node.startup = manual
node.session.timeo.replacement_timeout = 30
node.session.initial_login_retry_max = 5
node.conn[0].timeo.login_timeout = 10
node.conn[0].timeo.logout_timeout = 15
node.conn[0].timeo.noop_out_interval = 5
node.conn[0].timeo.noop_out_timeout = 5
node.session.err_timeo.abort_timeout = 15
node.session.err_timeo.lu_reset_timeout = 20" "$(cat /etc/iscsi/iscsid.conf)"
expect_equal "lines of that file with text" 9 "$(grep -c . /etc/iscsi/iscsid.conf)"
name=iqn.2013-03.org.example:nas-box:initiator-1b2c3d
expect_equal "the initiator's name" "InitiatorName=$name" "$(cat /etc/iscsi/initiatorname.iscsi)"
expect_key iqn "$name"

for pair in iface0:egiga0 iface1:egiga1 ifbond:bond0; do
    expect_has "record ${pair%:*}" "iface.net_ifacename = ${pair#*:}
" "$(iscsiadm -m iface -I "${pair%:*}")
"
done
for module in scsi_transport_iscsi libiscsi libiscsi_tcp iscsi_tcp; do
    expect "module $module" grep -q "^$module " /proc/modules
done
wait_for 10 one_initiator
expect_equal "the settings daemon's process" "$(pgrep -x ktree)" "$(cat /var/run/ktree_sock_vv_config.pid)"

expect_key ver 1
expect_key count 0
expect_equal "mode of the settings file" 600 "$(stat -c %a /etc/NAS_CFG/vv.xml)"
expect_has "the settings file" "$name" "$(cat /etc/NAS_CFG/vv.xml)"
expect_equal "sessions" "" "$(sessions)"
