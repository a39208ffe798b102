# What a scenario finds in the virtual appliance. Every function that starts with "expect" ends the scenario with
# status 1, and says what was wrong, when it does not hold.
#
# The appliance's ports egiga0 and egiga1 are cables (veth pairs) to the target, which lives in the network namespace
# "target" and is called t0 and t1 there:
#
#   port     appliance                             target (its portals, port 3260)
#   0        10.9.0.1  fd00:9:0::1                 10.9.0.2  fd00:9:0::2  fe80::2
#   1        10.9.1.1  fd00:9:1::1                 10.9.1.2  fd00:9:1::2  fe80::12
#
# The variable PHASE is 1 at the first boot and one more after each power_pull and power_cycle. What is below /data,
# /etc/NAS_CFG, /usr/local/config, /etc/iscsi and /var/lib/iscsi outlives a boot.

# Folder of the LUNs' files. /data/luns makes them outlive a boot.
LUN_DIR=${LUN_DIR:-/tmp/luns}

TREE_SOCKET=/var/run/ktree_sock_vv

# ---- what holds ----

say() { printf '%s\n' "$*"; }

fail() {
    say "FAILED (phase $PHASE): $*"
    say "Under way: $(pgrep -af 'remvol|iscsiadm|mke2fs|e2fsck|mount' || echo nothing)"
    exit 1
}

# expect DESCRIPTION COMMAND...: the command succeeds.
expect() {
    description=$1
    shift
    "$@" || fail "$description: '$*' gave status $?"
}

# expect_not DESCRIPTION COMMAND...: the command fails.
expect_not() {
    description=$1
    shift
    ! "$@" || fail "$description: '$*' succeeded"
}

# expect_equal DESCRIPTION WANTED GOT
expect_equal() { [ "$2" = "$3" ] || fail "$1: wanted '$2', got '$3'"; }

# expect_status WANTED COMMAND...: the command ends with that status.
expect_status() {
    wanted=$1
    shift
    status=0
    "$@" || status=$?
    [ "$status" = "$wanted" ] || fail "'$*' gave status $status instead of $wanted"
}

# expect_has DESCRIPTION PART TEXT: the text contains the part.
expect_has() {
    case $3 in *"$2"*) ;; *) fail "$1: '$2' is not in '$3'" ;; esac
}

# expect_lacks DESCRIPTION PART TEXT: the text does not contain the part.
expect_lacks() {
    case $3 in *"$2"*) fail "$1: '$2' is in '$3'" ;; esac
}

# wait_for SECONDS COMMAND...: tries the command up to five times a second; fails the scenario when it does not succeed
# in time. On a busy build machine the clock runs on while the appliance stands still: so many tries there are as well.
wait_for() {
    limit=$1
    shift
    tries=0
    until_uptime=$(($(uptime_seconds) + limit))
    until "$@" >/dev/null 2>&1; do
        tries=$((tries + 1))
        read -r now_uptime _ </proc/uptime # as uptime_seconds, which costs a process
        [ "${now_uptime%.*}" -lt "$until_uptime" ] || [ $tries -lt $((5 * limit)) ] ||
            fail "waited $limit seconds for '$*'"
        sleep 0.2
    done
}

uptime_seconds() {
    read -r seconds rest </proc/uptime
    echo "${seconds%.*}"
}

# ---- the cables ----

target_run() { nsenter --net=/run/netns/target "$@"; }

# Called by lab/init.
network_up() {
    for name in default all; do
        echo 0 >/proc/sys/net/ipv6/conf/$name/accept_dad
    done
    ip -batch - <<END
netns add target
link set lo up
link add egiga0 address 00:90:a9:1b:2c:3d type veth peer name t0 netns target address 02:00:00:09:00:00
link add egiga1 address 00:90:a9:1b:2c:3e type veth peer name t1 netns target address 02:00:00:09:00:01
addr add 10.9.0.1/24 dev egiga0
addr add 10.9.1.1/24 dev egiga1
addr add fd00:9:0::1/64 dev egiga0 nodad
addr add fd00:9:1::1/64 dev egiga1 nodad
link set egiga0 up
link set egiga1 up
END
    ip -n target link set lo up
    cable_plug 0
    cable_plug 1
}

# cable_cut PORT: pulls the cable of egigaPORT; the port loses its carrier and keeps its addresses.
cable_cut() { ip -n target link set "t$1" down; }

# cable_plug PORT: puts the cable back.
cable_plug() {
    ip -n target -batch - <<END
link set t$1 up
addr replace 10.9.$1.2/24 dev t$1
addr replace fd00:9:$1::2/64 dev t$1 nodad
addr replace fe80::${1#0}2/64 dev t$1 nodad
END
}

# packets_drop PORT PERCENT: both directions lose that share of the packets; the carrier stays.
packets_drop() {
    tc qdisc replace dev "egiga$1" root netem loss "$2%"
    tc -n target qdisc replace dev "t$1" root netem loss "$2%"
}

packets_pass() {
    tc qdisc del dev "egiga$1" root
    tc -n target qdisc del dev "t$1" root
}

# portal_move PORT OLD NEW: the target's port gets another address (with the prefix length).
portal_move() {
    ip -n target addr del "$2" dev "t$1"
    ip -n target addr add "$3" dev "t$1"
}

# ---- the target ----

target_start() {
    target_run tgtd
    wait_for 10 tgtadm --lld iscsi --mode sys --op show
}

# target_kill: the target's program dies; its connections are closed. What its LUNs hold stays, its settings go.
target_kill() {
    pkill -KILL -x tgtd
    wait_for 10 target_is_gone
}

target_is_gone() { ! pgrep -x tgtd; }

# target_add NUMBER NAME: a target that everybody may use, without LUNs.
target_add() {
    tgtadm --lld iscsi --mode target --op new --tid "$1" --targetname "$2" &&
        tgtadm --lld iscsi --mode target --op bind --tid "$1" --initiator-address ALL
}

target_delete() { tgtadm --lld iscsi --mode target --op delete --force --tid "$1"; }

# lun_add TARGET LUN SIZE [PARAMETERS]: a disk of that size (a file that is made when it is not there yet). LUN numbers
# start at 1; 0 is the target's controller. PARAMETERS as tgtadm's --params takes them, such as readonly=1.
lun_add() {
    mkdir -p "$LUN_DIR"
    [ -e "$(lun_file "$1" "$2")" ] || truncate -s "$3" "$(lun_file "$1" "$2")"
    tgtadm --lld iscsi --mode logicalunit --op new --tid "$1" --lun "$2" --backing-store "$(lun_file "$1" "$2")"
    [ $# -lt 4 ] || tgtadm --lld iscsi --mode logicalunit --op update --tid "$1" --lun "$2" --params "$4"
}

lun_delete() { tgtadm --lld iscsi --mode logicalunit --op delete --tid "$1" --lun "$2"; }

lun_file() { echo "$LUN_DIR/t$1-l$2"; }

# lun_grow TARGET LUN SIZE: an initiator that logs in again sees the new size.
lun_grow() {
    lun_delete "$1" "$2"
    truncate -s "$3" "$(lun_file "$1" "$2")"
    lun_add "$1" "$2" "$3"
}

# target_chap TARGET USER SECRET: from now on the target wants this secret.
target_chap() {
    tgtadm --lld iscsi --mode account --op new --user "$2" --password "$3"
    tgtadm --lld iscsi --mode account --op bind --tid "$1" --user "$2"
}

# ---- the appliance ----

# The names of the scenarios' targets begin with this.
IQN=iqn.2026-01.org.example

# general_tree_start: the tree for what does not belong to the volumes' settings. Nothing here starts units, so what the
# installed project's unit runs is run; that it has one is seen, that it is started is seen in a full machine.
general_tree_start() {
    line=$(sed -n 's/^ExecStart=//p' /usr/lib/systemd/system/remvol-general-tree.service)
    [ -n "$line" ] || fail "the project brings no general tree"
    $line &
    wait_for 10 test -S /var/run/ktree_sock
}

# tree_get KEY: the value, nothing when there is none.
tree_get() { ktreec -S "$TREE_SOCKET" -g "$1"; }

tree_set() { ktreec -S "$TREE_SOCKET" -s "$1" "$2"; }

# result COMMAND: what the last run of remvol --COMMAND left in the tree.
result() { tree_get "/result/$1"; }

# works OPTION...: runs remvol, which must succeed and say so in the tree. What it prints is in /tmp/remvol.out.
works() { expect_result 0 0 "$@"; }

# refuses OPTION...: the same for a command that must fail.
refuses() { expect_result 255 -1 "$@"; }

expect_result() {
    wanted=$1 outcome=$2
    shift 2
    status=0
    remvol "$@" >/tmp/remvol.out 2>&1 || status=$?
    if [ "$status" != "$wanted" ]; then
        cat /tmp/remvol.out
        fail "remvol $* gave status $status instead of $wanted"
    fi
    expect_equal "the result of $1" "$outcome" "$(result "${1#--}")"
}

# volume_add TARGET LUN SHARE [ADDRESS [OPTION...]]: remvol --add of a LUN of the target IQN:TARGET, which must succeed.
volume_add() {
    add_target=$1 add_lun=$2 add_share=$3 add_address=${4:-10.9.0.2}
    shift $(($# < 4 ? $# : 4))
    works --add -n "$IQN:$add_target" -l "$add_lun" -i "$add_address" -p 3260 -s "$add_share" "$@"
}

# settings: every value of the tree but the results of commands.
settings() { ktreec -S "$TREE_SOCKET" -t | grep -v '^/result/'; }

# target_key SLOT KEY, lun_key SLOT LUNSLOT KEY: what the tree holds of a target or a LUN.
target_key() { tree_get "/iscsi/initiator/id:$1/$2"; }

lun_key() { target_key "$1" "lun/id:$2/$3"; }

# expect_key KEY VALUE: the tree holds the value below /iscsi/initiator; "" stands for none as well.
expect_key() { expect_equal "$1" "$2" "$(tree_get "/iscsi/initiator/$1")"; }

# mounted SHARE: the volume is mounted.
mounted() { grep -q " /mnt/VV/$1 " /proc/mounts; }

# initiators: the processes of the initiator's daemon. Each forks a child that takes over the sessions it finds, which is
# there for some seconds and is none of them.
initiators() { pgrep -P 1 -x iscsid; }

one_initiator() { [ "$(initiators | wc -l)" = 1 ]; }

# logged_in TARGETNAME: the target has a session.
logged_in() { grep -qsx "$1" /sys/class/iscsi_session/session*/targetname; }

# sessions: the names of the targets that have a session, as iscsiadm lists them, sorted.
sessions() { iscsiadm -m session 2>/dev/null | sed 's/.*,1 \([^ ]*\).*/\1/' | sort; }

# session_is TARGETNAME STATE: LOGGED_IN, FAILED or FREE, as the kernel says.
session_is() {
    for session in /sys/class/iscsi_session/session*; do
        [ "$(cat "$session/targetname")" = "$1" ] && [ "$(cat "$session/state")" = "$2" ] && return 0
    done
    return 1
}

# disk_of TARGETNAME LUN: the kernel name of a LUN's disk, such as sdb.
disk_of() {
    for session in /sys/class/iscsi_session/session*; do
        [ "$(cat "$session/targetname")" = "$1" ] || continue
        for disk in "$session"/device/target*/*:*:*:"$2"/block/*; do
            [ -b "/dev/${disk##*/}" ] && echo "${disk##*/}" && return 0
        done
    done
    return 1
}

# ---- the power ----

# power_pull: the power goes at once, unwritten data with it; the scenario starts again with PHASE one higher.
power_pull() {
    printf '\036again\n' >&9
    sleep 1000
}

# power_cycle: as power_pull, but what was written is kept.
power_cycle() {
    sync
    fsfreeze -f /data
    power_pull
}
