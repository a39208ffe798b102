# after: installed
# The units are as systemd wants them, confined as far as mounting for everybody allows, and a start makes no noise.

# at_most UNIT LIMIT: its exposure as systemd sees it, from 0.0 (none) to 10.0.
at_most() {
    exposure=$(systemd-analyze security --no-pager "$1" 2>/dev/null | sed -n 's/.*exposure level for [^:]*: \([0-9.]*\) .*/\1/p')
    say "$1: exposure $exposure"
    expect "the exposure of $1 is at most $2" awk "BEGIN { exit !(${exposure:-99} <= $2) }"
}

at_most remvol-tree.service 1.0
at_most remvol-general-tree.service 1.0
at_most remvol-notify.service 5.0
at_most remvol-metrics.service 5.0
at_most remvol-recovery-failed@x.service 5.0
# They run the tool, which mounts for everybody: nothing of what needs a mount namespace of its own can be asked for.
at_most remvol-keeper.service 5.0
at_most remvol-events.service 5.0
at_most remvol.service 5.0

expect_equal "units" 10 "$(our_units | wc -l)"

# Of the news that remvol-notify tells, those of volumes that are being brought up are none of this.
alarms() {
    journalctl -b -p warning -o short-monotonic --no-pager -q \
        $(printf -- '-u %s ' remvol remvol-tree remvol-general-tree remvol-events remvol-keeper)
}
expect_equal "warnings and errors of ours" "" "$(alarms)"
ends_in_order systemctl restart remvol
all_there() { mounted Photos && mounted Music && vvstat; }
wait_for 60 all_there
expect_equal "warnings and errors after a restart" "" "$(alarms)"
