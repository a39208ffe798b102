# timeout: 600
# What can be wrong with a target or with the appliance itself: each time a clear state, in a time that the initiator's own
# limits allow, and what the user set stays as it is.
LONG=$IQN:$(printf '%0231d' 0 | tr 0 n)

# What the user set: everything but what was found out.
wishes() { settings | grep -v -e '/\(total_lun_count\|conn_state\|status\|size\|dev\|mnt_dev\|mnt\|fs_type\|volume_state\)='; }

# cannot_connect SLOT NAME SECONDS: a connect that fails, in less than that time.
cannot_connect() {
    before=$(wishes)
    began=$(uptime_seconds)
    refuses --connect -n "$2"
    took=$(($(uptime_seconds) - began))
    say "slot $1: the connect failed after $took s"
    expect "it takes less than $3 s" [ "$took" -lt "$3" ]
    expect_key "id:$1/conn_state" 4
    expect_equal "what the user set" "$before" "$(wishes)"
    goes_on
}

# says_error SLOT: the state of a failed connect, for the administration pages.
says_error() {
    works --status
    expect_key "id:$1/status" "Connect Error"
    expect_key "id:$1/lun/id:1/status" Offline
}

goes_on() { expect_equal "the file of the good volume" text "$(cat /mnt/VV/Good/file)"; }

target_start
expect "target" target_add 1 $IQN:t1
expect "LUN" lun_add 1 1 64M
works --init
volume_add t1 1 Good
works --connect -n $IQN:t1
echo text >/mnt/VV/Good/file

# Nobody has the address: five tries of ten seconds, as the daemon's settings have it.
volume_add away 1 Away 10.9.0.99
cannot_connect 2 $IQN:away 75
says_error 2
# Nobody listens at the port; less patience from here on. The portal has no target of a name as long as names get.
sed -i -e 's/\(login_retry_max\) = .*/\1 = 1/' -e 's/\(login_timeout\) = .*/\1 = 3/' /etc/iscsi/iscsid.conf
works --add -n $IQN:shut -l 1 -i 10.9.0.2 -p 3299 -s Shut
cannot_connect 3 $IQN:shut 20
says_error 3
expect_equal "characters of the long name" 255 ${#LONG}
works --add -n "$LONG" -l 1 -i 10.9.0.2 -p 3260 -s Long
cannot_connect 4 "$LONG" 20
says_error 4
expect_key id:4/target "$LONG"
works --del -n "$LONG"
expect_key count 3
expect_key id:1/status Connected

# Without iscsiadm nothing can be found out, so what is known stays.
mv /usr/sbin/iscsiadm /tmp/
before=$(settings)
works --status
expect_has "what failed" "system() of cmd 'iscsiadm -m session -P3 >/tmp/remvol.tmp 2>&1' failed" "$(cat /tmp/remvol.out)"
refuses --search -i 10.9.0.2 -p 3260
expect_equal "the tree" "$before" "$(settings)"
cannot_connect 3 $IQN:shut 10
before=$(wishes)
works --init
expect_key id:1/conn_state 4
expect_equal "what the user set" "$before" "$(wishes)"
goes_on
mv /tmp/iscsiadm /usr/sbin/
says_error 3
# At once: the iscsid of the --init before is still connecting its session anew when it is told to end.
works --init
expect_key id:1/status Connected
expect_key id:1/lun/id:1/status Running
goes_on

# Without the module that speaks to targets, neither in the firmware nor among the kernel's own.
expect "deinit" remvol --deinit >/tmp/remvol.out 2>&1
mv /usr/local/modules/driver/iscsi_tcp.ko /tmp/
find /usr/lib/modules -name 'iscsi_tcp.ko*' -delete
works --init
expect_has "what failed" "system() of cmd 'insmod /usr/local/modules/driver/iscsi_tcp.ko' failed" "$(cat /tmp/remvol.out)"
expect_key id:1/status "Connect Error"
expect_key id:1/conn_state 4
expect_equal "what the user set" "$before" "$(wishes)"
expect_not "the good volume is not mounted" mounted Good
mv /tmp/iscsi_tcp.ko /usr/local/modules/driver/
works --init
expect_key id:1/status Connected
goes_on
