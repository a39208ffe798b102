# timeout: 500
# Portals: IPv4, global IPv6, and link-local IPv6 behind either port, each through the right interface.
session_line() { # NAME TEXT
    iscsiadm -m session -P 1 | sed -n "/^Target: $IQN:$1 /,/^Target/s/^[[:space:]]*$2: *//p" | head -n 1
}

target_start
for number in 1 2 3 4; do
    target_add $number "$IQN:t$number" && lun_add $number 1 64M || fail "target $number"
done
works --init
volume_add t1 1 Four 10.9.0.2
volume_add t2 1 Six fd00:9:0::2
volume_add t3 1 Local0 fe80::2
volume_add t4 1 Local1 fe80::12
expect_key id:2/ip '[fd00:9::2]'
expect_key id:3/ip '[fe80::2]'
for row in '1 Four default 10.9.0.2:3260,1' '2 Six default [fd00:9::2]:3260,1' \
    '3 Local0 iface0 [fe80::2]:3260,1' '4 Local1 iface1 [fe80::12]:3260,1'; do
    # shellcheck disable=SC2086
    set -- $row
    works --connect -n "$IQN:t$1"
    expect_key "id:$1/status" Connected
    expect "mounted" mounted "$2"
    expect_equal "interface of t$1" "$3" "$(session_line "t$1" 'Iface Name')"
    expect_equal "portal of t$1" "$4" "$(session_line "t$1" 'Persistent Portal')"
done
expect_equal "sessions" 4 "$(sessions | wc -l)"
works --disconnect -n $IQN:t3
expect_key id:3/status Disconnected
expect_not "no longer mounted" mounted Local0
