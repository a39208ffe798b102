# What a scenario finds in a full machine, beside the functions of lab/lib.sh. The scenario starts as early as the boot
# allows, while other services still start; "booted" waits for them.
#
# The storage server is a service of the machine that stops after all others. It comes back at every boot with the targets
# and LUNs it was given, unless the scenario says target_at_boot off.

LUN_DIR=/data/luns

# fail TEXT...: ends the scenario; what the machine itself says of the failure comes along.
fail() {
    say "FAILED (phase $PHASE): $*"
    systemctl list-units --failed --no-legend --plain
    systemctl list-jobs --no-legend
    journalctl -b -n 60 --no-pager -o short-monotonic
    exit 1
}

# ---- the machine ----

# booted: every service has started; none has failed.
booted() {
    state=$(systemctl is-system-running --wait) || :
    expect_equal "the state of the machine" running "$state"
    expect_equal "services that failed" "" "$(systemctl list-units --failed --no-legend --plain)"
}

# The packages come from a folder, as an operator has them.
install_packages() {
    expect "the packages are installed" apt_quiet install /lab/packages/*.deb
}

# apt_quiet ARGUMENT...: apt-get, which asks nothing; its output is in /tmp/apt.log and shown when it fails.
apt_quiet() {
    apt-get -y -q -o Dpkg::Use-Pty=0 -o APT::Sandbox::User=root "$@" >/tmp/apt.log 2>&1 || {
        status=$?
        cat /tmp/apt.log
        return $status
    }
}

# expect_active UNIT...
expect_active() {
    for unit in "$@"; do expect_equal "$unit" active "$(systemctl is-active "$unit")"; done
}

# unharmed: what holds when a scenario has come to its end, or a stage; the runner sees to it that it is asked.
unharmed() {
    [ $? = 0 ] || return
    expect_equal "services that failed" "" "$(systemctl list-units --failed --no-legend --plain)"
    allows '\(udev-worker\).*Could not find file matches' # udev of Debian 13, of a disk that goes while it looks at it
    touch /data/provoked
    # Of all boots of this machine.
    journalctl -q -p err -o short-monotonic --no-pager >/tmp/errors
    expect_equal "errors that nothing provoked" "" "$(grep -Ev -f /data/allowed /tmp/errors)"
    expect_equal "errors that were provoked and that nobody told" "" "$(untold)"
    # shellcheck disable=SC2046 # a list
    expect_equal "what systemd-analyze verify says" "" \
        "$(systemd-analyze verify --man=no $(our_units) 2>&1 | grep -F remvol)"
}

our_units() { systemctl list-unit-files --no-legend 'remvol*' | awk '{ print $1 }'; }

# provokes PATTERN...: the scenario brings about errors of the journal that fit these (regular expressions). At its end there is
# one for each.
provokes() {
    printf '%s\n' "$@" >>/data/provoked
    sync /data/provoked
    allows "$@"
}

# allows PATTERN...: it may bring such errors about, or not.
allows() {
    printf '%s\n' "$@" >>/data/allowed
    sync /data/allowed
}

# What it says when the storage is taken from under volumes, or is not there: those who tell people, the initiator, the kernel.
provokes_loss() {
    provokes 'remvol-notify\['
    allows_loss
}

allows_loss() {
    allows 'remvol-notify\[' 'iscsid\[' \
        'kernel: .*(ping timeout|I/O error|offline (error|device)|EXT4-fs|JBD2|[Jj]ournal|Synchroniz|FAILED Result|Sense)'
}

# untold: what was provoked and is none of the errors.
untold() {
    while read -r pattern; do
        grep -Eq -e "$pattern" /tmp/errors || echo "$pattern"
    done </data/provoked
}

# messages UNIT...: what these units have said since the machine was started.
messages() { journalctl -b -o cat --no-pager $(printf -- '-u %s ' "$@"); }

# ---- promises ----

# within DESCRIPTION SECONDS PROMISE: a promise that was not kept fails the scenario at its end, and so does one that the runner has
# not heard of by then, or could not judge, since the build machine was too busy. It knows them by their descriptions, which stand
# between quotes at the beginning of a line.
within() {
    say "$1: $2 s, at most $3 s are promised"
    verdict=missed
    # What is no number keeps no promise.
    ! echo "$2" | awk -v promise="$3" '{ exit !(/^-?[0-9.]+$/ && $1 <= promise) }' || verdict=kept
    printf '\036%s %s\n' $verdict "$1" >&9
}

# ---- the end of the volumes ----

# ends_in_order COMMAND...: the command ends everything: the shares first, then the volumes, the sessions, the initiator's
# daemon, and the tree.
ends_in_order() {
    what_is_to_end
    watch_the_end "/proc/$tree" "/proc/$initiator" &
    watcher=$!
    "$@" || fail "'$*' gave status $?"
    wait $watcher || fail "the watcher of the end gave status $?"
    expect_equal "what ended before its turn" "" "$(sort -u /data/disorder)"
}

# watch_the_shutdown: the same of a machine that goes down, to be asked in its next boot by "went_down_in_order". The watcher is
# nothing that systemd stops.
watch_the_shutdown() {
    what_is_to_end
    rm -f /data/watched
    systemd-run -q -p DefaultDependencies=no sh -c '. /lab/lib.sh
        watch_the_end "$@"
        sync /data/disorder
        echo all >/data/watched' sh "/proc/$tree" "/proc/$initiator"
}

went_down_in_order() {
    expect "somebody has seen the end of everything" [ -s /data/watched ]
    expect_equal "what ended before its turn" "" "$(sort -u /data/disorder)"
}

what_is_to_end() {
    tree=$(systemctl show -P MainPID remvol-tree)
    initiator=$(initiators)
    expect "the tree and the initiator's daemon run" [ -e "/proc/$tree/exe" -a -e "/proc/$initiator/exe" ]
    expect "there is something to end" any_session
    expect "there is something to end" any_volume
    expect "there is something to end" any_share
}

# watch_the_end TREE INITIATOR: looks at all five, the last first, until the tree has ended. No program is started for it, so
# it sees all that stays wrong for some milliseconds. Processes that nobody has waited for yet have ended as well.
watch_the_end() {
    : >/data/disorder
    gone=
    while [ "$gone" != everything ]; do
        gone=
        ends "the tree" [ -e "$1/exe" ]
        all=${gone:+everything}
        ends "the initiator's daemon" [ -e "$2/exe" ]
        ends "a session" any_session
        ends "a volume" any_volume
        ends "a share" any_share
        gone=$all
    done
}

# ends NAME COMMAND...: what is there while the command succeeds, when something that ends later is gone.
ends() {
    name=$1
    shift
    if ! "$@"; then
        gone=$name
    elif [ -n "$gone" ]; then
        echo "$gone, before $name" >>/data/disorder
    fi
}

any_session() { set -- /sys/class/iscsi_session/session*; [ -e "$1" ]; }

any_volume() {
    while read -r node point rest; do
        case $point in /mnt/VV/*) return 0 ;; esac
    done </proc/mounts
    return 1
}

any_share() {
    while read -r line; do
        case $line in \[*) return 0 ;; esac
    done </run/remvol/smb-shares.conf
    return 1
} 2>/dev/null

# ---- the power ----

# reboot_machine: as an operator does it; the scenario starts again with PHASE one higher.
reboot_machine() {
    allows 'kernel: watchdog: watchdog0: watchdog did not stop!'  # systemd of Debian 13 goes down under it
    printf '\036restart\n' >&9
    systemctl reboot
    sleep 1000
}

# power_cycle: as power_pull, but what was written is kept.
power_cycle() {
    sync
    power_pull
}

# ---- the storage server ----

# remember COMMAND...: does it now, and again whenever the storage server starts.
remember() {
    "$@" || return
    [ -n "$replaying" ] || printf '%s ' "$@" | sed 's/ $/\n/' >>/data/target
}

target_start() {
    touch /data/target
    systemctl start lab-target
}

target_kill() {
    systemctl kill --signal=KILL lab-target
    wait_for 10 target_is_gone
}

# target_at_boot on|off
target_at_boot() {
    case $1 in on) systemctl --quiet enable lab-target ;; off) systemctl --quiet disable lab-target ;; esac
}

# What lab-target.service runs.
target_run_stored() {
    target_run tgtd
    wait_for 20 tgtadm --lld iscsi --mode sys --op show
    replaying=1
    . /data/target
}
