# timeout: 900
# after: installed
# The boot reaches its target at most 15 s later than on the same machine without the packages, also when the storage is not
# there.
PROMISE=15
MEASURED=/data/boots

reached() { systemctl is-active --quiet multi-user.target; }

# note WHAT: keeps the seconds from the start of systemd to the target of this boot.
note() {
    wait_for 120 reached
    seconds=$(awk -v from="$(systemctl show -P UserspaceTimestampMonotonic)" \
        -v to="$(systemctl show -P ActiveEnterTimestampMonotonic multi-user.target)" \
        'BEGIN { printf "%.1f", (to - from) / 1e6 }')
    say "$1: $seconds s"
    echo "$1=$seconds" >>$MEASURED
    booted
}

case $PHASE in
1) reboot_machine ;;
2)
    note with_storage
    target_at_boot off
    allows_loss # this boot may end before anybody is told
    reboot_machine
    ;;
3)
    note without_storage
    target_at_boot on
    apt_quiet purge remvol libremvol1 || fail "the package is not purged"
    reboot_machine
    ;;
esac
note without_packages
. $MEASURED
longer() { awk "BEGIN { printf \"%.1f\", $1 - $without_packages }"; }
within "a boot with storage, longer than without the packages" "$(longer "$with_storage")" $PROMISE
within "a boot without storage, longer than without the packages" "$(longer "$without_storage")" $PROMISE
