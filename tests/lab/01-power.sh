# timeout: 150
# The lab itself: what outlives a pulled power cable and what does not.
case $PHASE in
1)
    echo kept >/etc/NAS_CFG/kept
    echo kept >/usr/local/config/kept
    sync
    echo lost >/tmp/lost
    echo lost >/data/never-written
    power_pull
    ;;
2)
    expect_equal "a file that was written" kept "$(cat /etc/NAS_CFG/kept)"
    expect_equal "a file that was written" kept "$(cat /usr/local/config/kept)"
    expect_not "a file of the memory" test -e /tmp/lost
    expect_not "a file that was not synced" test -s /data/never-written
    echo kept >/data/not-synced
    power_cycle
    ;;
3) expect_equal "a file from before the clean stop" kept "$(cat /data/not-synced)" ;;
esac
