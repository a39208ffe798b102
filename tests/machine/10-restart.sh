# timeout: 400
# after: installed
# The volumes are there again after a restart of the machine, and after the power was cut.
expect_volumes() {
    booted
    expect_active remvol remvol-tree remvol-events
    for share in Photos Music; do
        expect_equal "the file of $share" "text of $share" "$(cat /mnt/VV/$share/file)"
        expect_has "what Samba is to offer" "[$share]" "$(testparm -s 2>/dev/null)"
    done
    expect_equal "what the operator sees" "Running Running" "$(vvstat -no STATUS | xargs)"
    expect "nothing that should be connected is not" vvstat
}

expect_volumes
case $PHASE in
1)
    watch_the_shutdown
    reboot_machine
    ;;
2)
    went_down_in_order
    expect_lacks "the end before" Failed "$(journalctl -b -1 -o cat --no-pager _PID=1)"
    power_pull
    ;;
esac
